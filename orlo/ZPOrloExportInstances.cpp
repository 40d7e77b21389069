#include <string>
#include <utility>

#include "Daemon/HSLog.h"
#include "device/ZPDevice.h"
#include "orlo/OrloSession.h"
#include "orlo/ZPOrloExport.h"
#include "platform/DataClasses.h"

namespace {

constexpr LogSource zplog{"ZPOrloExport"};

// How an identity is read.
struct IdentityRow {
    ComponentIdentity identity;
    Value (ZPDevice::*get)() const;
    const char* missing;               // the message for a device that has none; null: nobody checks
    const char* readingLine = nullptr; // logged with the class once the identity has been asked for
};

constexpr IdentityRow identities[] = {
    {ComponentIdentity::MiravelSerialNumber, &ZPDevice::getMiravelSerialNumber, "Error Reading Miravel SN"},
    {ComponentIdentity::CoverGlassSerialNumber, &ZPDevice::getCoverGlassSerialNumber, "Error Reading Cover Glass SN"},
    {ComponentIdentity::AmbientLightSensorSerialNumber, &ZPDevice::getAmbientLightSensorSerialNumber,
     "Error Reading Ambient Light SN"},
    {ComponentIdentity::BackglassCompassSerialNumber, &ZPDevice::getBackglassCompassSerialNumber,
     "Error Reading Back Glass SN"},
    {ComponentIdentity::VanterSerialNumber, &ZPDevice::getVanterSerialNumber, "Error Reading Vanter SN",
     "Reading Vanter SN for %@"},
    {ComponentIdentity::VanterChipID, &ZPDevice::getVanterChipId, "Error Reading Vanter Chip ID"},
    {ComponentIdentity::VanterUID, &ZPDevice::getVanterUID, "Error Reading Vanter UID"},
    {ComponentIdentity::LoddenChipID, &ZPDevice::getLoddenChipID, "Error Reading Lodden Chip ID"},
    {ComponentIdentity::LoddenUID, &ZPDevice::getLoddenUID, "Error Reading Lodden UID"},
    {ComponentIdentity::ProximitySensorSerialNumber, &ZPDevice::getProxSerialNumber, "Error Reading Prox SN"},
    {ComponentIdentity::FrontCameraModuleSerialNumber, &ZPDevice::getFCAMModuleSerialNumber,
     "Error Reading FCAMModule SN", "Reading FCAMModule SN for %@"},
    {ComponentIdentity::TopModuleChipID, &ZPDevice::getTopModuleChipID, nullptr},
    {ComponentIdentity::ScreenSerialNumber, &ZPDevice::getScreenSerialNumber, nullptr},
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

Value read(const IdentityRow* row) {
    return row ? (ZPDevice::sharedSingleton().*row->get)() : Value();
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
    const IdentityRow& first = *rowOf(dataClass.first);
    const IdentityRow* const second = rowOf(dataClass.second);
    Value trailing = dataClass.secondIsReadFirst ? read(second) : Value();
    Value leading = read(&first);
    if (!dataClass.secondIsReadFirst)
        trailing = read(second);
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
