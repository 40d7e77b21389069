#include <string_view>
#include <utility>

#include "Daemon/HSLog.h"
#include "device/ZPDevice.h"
#include "orlo/OrloSession.h"
#include "orlo/ZPOrloExport.h"

namespace {

constexpr LogSource zplog{"ZPOrloExport"};

// One identity of a component, and the message for a device that has none.
struct Identity {
    Value (ZPDevice::*get)() const;
    const char* missing;
};

constexpr Identity miravel{&ZPDevice::getMiravelSerialNumber, "Error Reading Miravel SN"};
constexpr Identity coverGlass{&ZPDevice::getCoverGlassSerialNumber, "Error Reading Cover Glass SN"};
constexpr Identity ambientLight{&ZPDevice::getAmbientLightSensorSerialNumber, "Error Reading Ambient Light SN"};
constexpr Identity backGlass{&ZPDevice::getBackglassCompassSerialNumber, "Error Reading Back Glass SN"};
constexpr Identity vanter{&ZPDevice::getVanterSerialNumber, "Error Reading Vanter SN"};
constexpr Identity vanterChip{&ZPDevice::getVanterChipId, "Error Reading Vanter Chip ID"};
constexpr Identity vanterUID{&ZPDevice::getVanterUID, "Error Reading Vanter UID"};
constexpr Identity loddenChip{&ZPDevice::getLoddenChipID, "Error Reading Lodden Chip ID"};
constexpr Identity loddenUID{&ZPDevice::getLoddenUID, "Error Reading Lodden UID"};
constexpr Identity proximity{&ZPDevice::getProxSerialNumber, "Error Reading Prox SN"};
constexpr Identity frontCamera{&ZPDevice::getFCAMModuleSerialNumber, "Error Reading FCAMModule SN"};
// These two are not checked: "(null)" stands in the place of a missing one.
constexpr Identity topModuleChip{&ZPDevice::getTopModuleChipID, nullptr};
constexpr Identity screen{&ZPDevice::getScreenSerialNumber, nullptr};
constexpr Identity none{nullptr, nullptr};

enum class IfMissing {
    Stops,
    GoesOn,
};

struct ClassRow {
    std::string_view name;
    Identity first;  // asked first
    Identity second; // none when one identity is the instance
    IfMissing ifMissing = IfMissing::Stops;
    bool secondLeads = false;          // in the instance, the second identity stands before the first
    const char* readingLine = nullptr; // logged with the class once the identity has been asked for
    const char* notJoined = nullptr;   // the message when memory does not suffice to join them; null: the second's
};

constexpr ClassRow classes[] = {
    {"pfcl", miravel, none},
    {"HmCl", coverGlass, ambientLight},
    {"IfCl", ambientLight, none},
    {"CtCl", coverGlass, none},
    {"GpC2", coverGlass, none},
    {"tcrt", topModuleChip, screen, IfMissing::Stops, true, nullptr, "Error Reading gpCl SN"},
    {"dCfg", coverGlass, none},
    {"bCfg", backGlass, none},
    {"ycrt", loddenChip, loddenUID, IfMissing::GoesOn},
    {"AlsH", coverGlass, ambientLight, IfMissing::GoesOn},
    {"PxTC", coverGlass, proximity},
    {"pspc", vanterChip, vanterUID},
    {"FCCl", frontCamera, none, IfMissing::Stops, false, "Reading FCAMModule SN for %@"},
};

constexpr std::string_view VanterSerialClasses[] = {
    "pcic", "pcii", "pcvc", "pcvi", "pcve", "pbas", "pmpc", "pdcl",
    "prf1", "prf2", "psd1", "psd2", "pwcl", "psnv", "psdt", "preg",
};
constexpr ClassRow vanterSerialClass{
    "", vanter, none, IfMissing::Stops, false, "Reading Vanter SN for %@",
};

const ClassRow* rowOf(const Value& dataClass) {
    const std::string* name = dataClass.text();
    if (!name)
        return nullptr;
    for (const ClassRow& row : classes)
        if (row.name == *name)
            return &row;
    for (const std::string_view vanterSerial : VanterSerialClasses)
        if (vanterSerial == *name)
            return &vanterSerialClass;
    return nullptr;
}

void report(const char* message, Value* error) {
    zplog.error(message);
    if (error)
        *error = message;
}

Value joined(const ClassRow& row, const Value& first, const Value& second) {
    const auto text = madeIfMemorySuffices(
        [&] { return row.secondLeads ? format("%@-%@", second, first) : format("%@-%@", first, second); });
    return text ? Value(*text) : Value();
}

// The instance of one class, or nothing when the gathering stops here.
Value readInstance(const ClassRow& row, const Value& dataClass, Value* error) {
    const ZPDevice& device = ZPDevice::sharedSingleton();
    const bool isComposite = row.second.get != nullptr;
    Value first = (device.*row.first.get)();
    const Value second = isComposite ? (device.*row.second.get)() : Value();
    if (row.readingLine)
        zplog.info(row.readingLine, dataClass);

    const std::pair<const Identity&, const Value&> parts[] = {{row.first, first}, {row.second, second}};
    for (const auto& [identity, value] : parts) {
        if (!identity.missing || !value.isNothing())
            continue;
        report(identity.missing, error);
        if (row.ifMissing == IfMissing::Stops)
            return {};
    }
    if (!isComposite)
        return first;
    Value instance = joined(row, first, second);
    if (instance.isNothing())
        report(row.notJoined ? row.notJoined : row.second.missing, error);
    return instance;
}

} // namespace

Value ZPOrloExport::getDataInstances(const Value::Array& exportList, Value* error) {
    Value::Dictionary instances;
    for (const Value& dataClass : exportList) {
        const ClassRow* row = rowOf(dataClass);
        if (!row) {
            zplog.error("Key %@ doesn't exist", dataClass);
            if (error)
                *error = format("Key doesn't exist - %@", dataClass);
            return {};
        }
        Value instance = readInstance(*row, dataClass, error);
        if (instance.isNothing())
            return {};
        instances.insert_or_assign(*dataClass.text(), std::move(instance));
    }
    for (const auto& [dataClass, instance] : instances)
        zplog.info("Returning data instances %@ ==> %@ ", dataClass, instance);
    return instances;
}
