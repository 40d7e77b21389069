#include "platform/DeviceAnswers.h"

#include <string>

#include "platform/linux/services/device/DeviceDescription.h"

namespace {

// The opaque names and the readable ones under which the device description has their answers.
constexpr struct {
    std::string_view opaque;
    std::string_view readable;
} names[] = {
    {MiravelSNKey, "MiravelSerialNumber"},
    {CoverGlassSNKey, "CoverGlassSerialNumber"},
    {ALSSNKey, "AmbientLightSensorSerialNumber"},
    {FCAMModuleSNKey, "FrontCameraModuleSerialNumber"},
    {VanterChipIDKey, "VanterChipID"},
    {VanterUIDKey, "VanterUID"},
    {LoddenChipIDKey, "LoddenChipID"},
    {LoddenUIDKey, "LoddenUID"},
};

std::string_view readableName(std::string_view key) {
    for (const auto& name : names)
        if (name.opaque == key)
            return name.readable;
    return key;
}

// The value under `key` in the description's `section`. Only that value is resolved, so a query reads no other's file.
Value query(std::string_view section, std::string_view key, std::optional<Error>* error) {
    Value answer = resolveDescribed(deviceDescription()[section][key]);
    if (answer.isNothing() && error)
        *error = Error{"DeviceAnswerErrorDomain", 1, "The device has no answer for " + std::string(key)};
    return answer;
}

} // namespace

Value KACopyAnswer(std::string_view key, const Value& options) {
    return KACopyAnswerWithError(key, options, nullptr);
}

Value KACopyAnswerWithError(std::string_view key, const Value&, std::optional<Error>* error) {
    return query("answers", readableName(key), error);
}

Value TansuCopyValueWithError(std::string_view key, const Value&, std::optional<Error>* error) {
    return query("tansu", key, error);
}
