#include <string>
#include <utility>

#include "Daemon/HSLog.h"
#include "device/ZPDevice.h"
#include "orlo/OrloSession.h"
#include "orlo/ZPOrloExport.h"
#include "platform/DataClasses.h"

namespace {

constexpr LogSource zplog{"ZPOrloExport"};

// What the log says about an identity.
struct IdentityRow {
    ComponentIdentity identity;
    const char* missing;               // the message for a device that has none; null: nobody checks
    const char* readingLine = nullptr; // logged with the class once the identity has been asked for
};

using enum ComponentIdentity;
constexpr IdentityRow identities[] = {
    {MiravelSerialNumber, "Error Reading Miravel SN"},
    {CoverGlassSerialNumber, "Error Reading Cover Glass SN"},
    {AmbientLightSensorSerialNumber, "Error Reading Ambient Light SN"},
    {BackglassCompassSerialNumber, "Error Reading Back Glass SN"},
    {VanterSerialNumber, "Error Reading Vanter SN", "Reading Vanter SN for %@"},
    {VanterChipID, "Error Reading Vanter Chip ID"},
    {VanterUID, "Error Reading Vanter UID"},
    {LoddenChipID, "Error Reading Lodden Chip ID"},
    {LoddenUID, "Error Reading Lodden UID"},
    {ProximitySensorSerialNumber, "Error Reading Prox SN"},
    {FrontCameraModuleSerialNumber, "Error Reading FCAMModule SN", "Reading FCAMModule SN for %@"},
    {TopModuleChipID, nullptr},
    {ScreenSerialNumber, nullptr},
};

// The message when memory does not suffice to join two identities of which the second is not checked.
constexpr const char* notJoined = "Error Reading gpCl SN";

// Null for none.
const IdentityRow* rowOf(ComponentIdentity identity) {
    for (const IdentityRow& row : identities)
        if (row.identity == identity)
            return &row;
    return nullptr;
}

const DataClass* classNamed(const Value& name) {
    const std::string* text = name.text();
    for (const DataClass& dataClass : dataClasses)
        if (text && *text == dataClass.name)
            return &dataClass;
    return nullptr;
}

void report(const char* message, Value* error) {
    zplog.error(message);
    if (error)
        *error = message;
}

// Whether the gathering ends here because the identity is missing, which is reported also when it goes on.
bool stops(const DataClass& dataClass, const IdentityRow& row, const Value& identity, Value* error) {
    if (!row.missing || !identity.isNothing())
        return false;
    report(row.missing, error);
    return !dataClass.mayMissOne;
}

// The instance of one class, or nothing when the gathering stops here.
Value readInstance(const DataClass& dataClass, Value* error) {
    const ZPDevice& device = ZPDevice::sharedSingleton();
    const IdentityRow& first = *rowOf(dataClass.first);
    const IdentityRow* const second = rowOf(dataClass.second);
    Value trailing = dataClass.secondIsReadFirst ? device.get(dataClass.second) : Value();
    Value leading = device.get(dataClass.first);
    if (!dataClass.secondIsReadFirst)
        trailing = device.get(dataClass.second);
    if (first.readingLine)
        zplog.info(first.readingLine, dataClass.name);

    if (stops(dataClass, first, leading, error) || (second && stops(dataClass, *second, trailing, error)))
        return {};
    if (!second)
        return leading;
    Value joined = madeIfMemorySuffices([&] { return joinedInstance(leading, trailing); }).value_or(Value());
    if (joined.isNothing())
        report(second->missing ? second->missing : notJoined, error);
    return joined;
}

} // namespace

Value ZPOrloExport::getDataInstances(const Value::Array& exportList, Value* error) {
    Value::Dictionary instances;
    for (const Value& dataClass : exportList) {
        const DataClass* known = classNamed(dataClass);
        if (!known) {
            zplog.error("Key %@ doesn't exist", dataClass);
            if (error)
                *error = format("Key doesn't exist - %@", dataClass);
            return {};
        }
        Value instance = readInstance(*known, error);
        if (instance.isNothing())
            return {};
        instances.insert_or_assign(*dataClass.text(), std::move(instance));
    }
    for (const auto& [dataClass, instance] : instances)
        zplog.info("Returning data instances %@ ==> %@ ", dataClass, instance);
    return instances;
}
