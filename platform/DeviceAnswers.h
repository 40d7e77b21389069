// Properties of the device by key: the device-answer service and the Tansu value service.
//
// On Linux the answers stand in the device description, /etc/veltra/device.json below the device root, which is read at
// every query, so that a part swapped between two queries is seen by the second. A missing or malformed description is
// a device without answers, and one line on the console says so. All operations may be called from any thread.
#ifndef VELTRA_PLATFORM_DEVICE_ANSWERS_H
#define VELTRA_PLATFORM_DEVICE_ANSWERS_H

#include <optional>
#include <string_view>

#include "platform/Error.h"
#include "platform/Value.h"

// Opaque names of properties, as the device-answer service knows them: 22 characters of the base64 alphabet each. The
// plug-in passes them on without reading them.
inline constexpr std::string_view MiravelSNKey = "JlvBpIcyjzTcAplFQmGACg";
inline constexpr std::string_view CoverGlassSNKey = "OhrmT+BS3mZKIKMk7BiWGg";
inline constexpr std::string_view ALSSNKey = "xoNDTxUzjD2nhkaZSU365A";
inline constexpr std::string_view FCAMModuleSNKey = "DWg23KH4RuU3qPfUd3q3qQ";
inline constexpr std::string_view VanterChipIDKey = "4IRKeFl4kQazKfrPLqk3lw";
inline constexpr std::string_view VanterUIDKey = "6sG7woifsZ4/lwoin2RMOQ";
inline constexpr std::string_view LoddenChipIDKey = "/UmQZN9m7xv9ltmu0KoELA";
inline constexpr std::string_view LoddenUIDKey = "wIE+IdqFckii+RoMBTR2Hw";

// The device-answer service's answer for `key`: text, number or data, depending on the key, or nothing when the device
// has no such property. `options` is always nothing.
Value KACopyAnswer(std::string_view key, const Value& options);

// The same; *error, when `error` is given, says why there is no answer.
Value KACopyAnswerWithError(std::string_view key, const Value& options, std::optional<Error>* error);

// The Tansu service's value for `key`, in the same way.
Value TansuCopyValueWithError(std::string_view key, const Value& options, std::optional<Error>* error);

#endif
