#include "tools/orloctl/DeviceCheck.h"

#include <chrono>
#include <memory>
#include <optional>
#include <string_view>
#include <utility>

#include "platform/ComponentAuth.h"
#include "platform/Files.h"
#include "platform/Json.h"
#include "platform/Semaphore.h"
#include "platform/linux/services/device/DeviceDescription.h"
#include "platform/linux/system/DescriptionCheck.h"
#include "tools/orloctl/LocalFiles.h"

namespace {

using Status = ComponentAuthService::Status;

Value description; // the one that is checked

// Why the chip would not pass with its key; empty when it does, or has none.
std::string misfit() {
    if (description["componentAuth"]["mode"] != Value("key"))
        return {};
    struct Outcome {
        bool passed = false;
        std::int32_t status = Status::NoSignature;
        CountingSemaphore done;
    };
    const auto outcome = std::make_shared<Outcome>();
    (*(*description.dictionary())["componentAuth"].dictionary())["delayMs"] = 0;
    ComponentAuthService::sharedManager().authenticateTouchControllerWithChallenge(
        Value::Data(32), [outcome](bool passed, const Value&, const Value&, bool, std::int32_t status) {
            outcome->passed = passed;
            outcome->status = status;
            outcome->done.signal();
        });
    outcome->done.waitFor(std::chrono::minutes(1));
    if (outcome->status == Status::NoSignature)
        return "componentAuth.key names no file with an unencrypted private key in PEM that signs";
    if (outcome->status == Status::NoCertificate)
        return "registry has no AccessoryCertificate that is a certificate, which componentAuth.key needs";
    return outcome->passed ? "" : "componentAuth.key is not the key of the certificate in registry";
}

} // namespace

// For the services of the device, which are asked about this description.
Value deviceDescription() {
    return description;
}

Report checkDevice(const std::string& path) {
    const std::optional<Value::Data> contents =
        path.empty() ? files::readWhole(descriptionPath) : std::optional(readLocalFile(path));
    if (!contents)
        throw UsageError(std::string("Cannot read ") + descriptionPath + " on the device");
    std::vector<std::string> faults;
    std::string refusal = "it is no object";
    std::optional<Value> read =
        jsonToValue({reinterpret_cast<const char*>(contents->data()), contents->size()}, &refusal);
    if (read && read->dictionary()) {
        description = std::move(*read);
        faults = descriptionFaults(description);
        if (std::string why = misfit(); !why.empty())
            faults.push_back(std::move(why));
    } else {
        faults.push_back("It is malformed: " + refusal);
    }
    Report report;
    report.json = {{"description", path.empty() ? descriptionPath : path}, {"sound", faults.empty()}};
    if (!faults.empty()) {
        report.fail("The description of the device is not sound.");
        report.json["faults"] = std::move(faults);
    }
    return report;
}
