#include <utility>

#include "Daemon/HSLog.h"
#include "device/ZPDevice.h"
#include "platform/DeviceAnswers.h"
#include "platform/Format.h"
#include "platform/OrloDataStore.h"

namespace {

constexpr LogSource zplog{"ZPDevice"};

Value answer(std::string_view key) {
    return KACopyAnswer(key, {});
}
Value answerWithError(std::string_view key) {
    return KACopyAnswerWithError(key, {}, nullptr);
}
Value tansuValue(std::string_view key) {
    return TansuCopyValueWithError(key, {}, nullptr);
}

// What a getter makes of the service's answer.
enum class Result {
    Answer,                   // the answer as it is
    InstanceString,           // its text form; a failed conversion is reported
    InstanceStringIfAnswered, // its text form; only a missing answer is reported
};

struct Identity {
    ComponentIdentity identity;
    Value (*service)(std::string_view key);
    std::string_view key;
    Result result;
    const char* identifier; // as the line about a missing identity names it
};

using enum ComponentIdentity;
constexpr Identity identities[] = {
    {MiravelSerialNumber, answer, MiravelSNKey, Result::Answer, "Miravel SN"},
    {CoverGlassSerialNumber, answer, CoverGlassSNKey, Result::Answer, "CoverGlass SN"},
    {AmbientLightSensorSerialNumber, answer, ALSSNKey, Result::Answer, "ALS SN"},
    {FrontCameraModuleSerialNumber, answer, FCAMModuleSNKey, Result::Answer, "FCAMModule SN"},
    {ProximitySensorSerialNumber, tansuValue, "ProxSerialNumber", Result::Answer, "Prox Serial Number"},
    {BackglassCompassSerialNumber, tansuValue, "BackglassCompassSerialNumber", Result::Answer, "BG Serial Number"},
    {ScreenSerialNumber, answer, "ScreenSerialNumber", Result::Answer, "Screen Serial Number"},
    {VanterSerialNumber, answer, "VanterSerialNumber", Result::InstanceString, "Vanter Serial Number"},
    {VanterChipID, answer, VanterChipIDKey, Result::InstanceString, "Vanter Chip id"},
    {VanterUID, answer, VanterUIDKey, Result::InstanceString, "Vanter UID"},
    {LoddenChipID, answer, LoddenChipIDKey, Result::InstanceString, "Lodden Chip id"},
    {LoddenUID, answer, LoddenUIDKey, Result::InstanceString, "Lodden UID"},
    {TopModuleChipID, answer, "TopModuleAuthChipID", Result::InstanceStringIfAnswered, "topModuleChipID"},
};
constexpr Identity hardwareModel{None, answerWithError, "HWModelStr", Result::Answer, "HWModelStr"};

Value read(const Identity& identity) {
    Value value = identity.service(identity.key);
    const bool answered = !value.isNothing();
    if (identity.result != Result::Answer)
        value = QDOrloCreateInstanceString(value);
    if (value.isNothing() && !(answered && identity.result == Result::InstanceStringIfAnswered))
        zplog.error("Could not get data instance string for identifier %s", identity.identifier);
    return value;
}

// One half of the device's own identity; `missing` is logged when the device does not answer.
Value chipInstanceString(std::string_view key, const char* missing) {
    const Value chip = answer(key);
    if (chip.isNothing()) {
        zplog.error(missing);
        return {};
    }
    Value text = QDOrloCreateInstanceString(chip);
    if (text.isNothing())
        zplog.error("Could not get data instance string for identifier '%@'", chip);
    return text;
}

} // namespace

ZPDevice& ZPDevice::sharedSingleton() {
    static ZPDevice shared;
    return shared;
}

Value ZPDevice::get(ComponentIdentity identity) const {
    for (const Identity& row : identities)
        if (row.identity == identity)
            return read(row);
    return {};
}

Value ZPDevice::getHardwareModel() const {
    return read(hardwareModel);
}

Value ZPDevice::getUniqueChipId() {
    const Value uniqueChip = chipInstanceString("UniqueChipID", "Failed to get the unique chip id");
    if (uniqueChip.isNothing())
        return {};
    const Value chip = chipInstanceString("ChipID", "Failed to get the chip id");
    if (chip.isNothing())
        return {};
    return format("%@:%@", chip, uniqueChip);
}

Value ZPDevice::kaGetAnswerString(std::string_view key) {
    Value found = answer(key);
    return found.text() ? found : Value();
}

Value ZPDevice::syscfgDict() const {
    const std::lock_guard lock(syscfgMutex_);
    return syscfgDict_;
}

void ZPDevice::setSyscfgDict(Value dictionary) {
    const std::lock_guard lock(syscfgMutex_);
    syscfgDict_ = std::move(dictionary);
}
