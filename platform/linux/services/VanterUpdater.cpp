#include "platform/VanterUpdater.h"

#include <utility>

#include "platform/Crypto.h"
#include "platform/Files.h"
#include "platform/Format.h"
#include "platform/linux/system/DeviceDescription.h"

namespace {

enum UpdaterErrorCode {
    NoChip = 1,
    StepFails = 2, // as the device description asks
    UnknownStep = 3,
    NoFirmwareData = 4,
    NotInstalled = 5,
    NoDigest = 6,
};

// False, with the reason in *error.
bool refuse(std::optional<Error>* error, UpdaterErrorCode code, std::string text) {
    if (error)
        *error = Error{"VanterUpdaterErrorDomain", code, std::move(text)};
    return false;
}

Value chip() {
    return deviceDescription()["vanter"];
}

// Whether the chip lets `step` go on.
bool mayRun(const Value& chip, std::string_view step, std::optional<Error>* error) {
    if (!chip.dictionary())
        return refuse(error, NoChip, "The device has no Vanter chip");
    if (chip["fail"] == Value(step))
        return refuse(error, StepFails, "The Vanter chip fails at the step " + std::string(step));
    return true;
}

std::string firmwarePath(const Value& chip) {
    const std::string* path = chip["firmware"].text();
    return path ? *path : std::string();
}

} // namespace

class VanterUpdater {
public:
    VanterUpdater(VanterUpdaterLog log, std::string_view name) : log_(log), name_(name) {}

    bool isDone(const Value& chip) const { return done_ || chip["done"].boolean().value_or(false); }

    bool queryInfo(const Value& chip, Value* output, std::optional<Error>* error) const {
        Value::Dictionary information;
        if (const auto firmware = files::readWhole(firmwarePath(chip))) {
            Value::Data digest(crypto::sha384Size);
            if (!crypto::sha384(firmware->data(), firmware->size(), digest.data()))
                return refuse(error, NoDigest, "The digest of the installed firmware cannot be computed");
            information["Digest"] = std::move(digest);
        }
        say(information.empty() ? "no firmware is installed" : "a firmware is installed");
        if (output)
            *output = std::move(information);
        return true;
    }

    bool performNextStage(const Value& chip, const Value& options, Value* output, std::optional<Error>* error) {
        const Value::Data* firmware = options["FirmwareData"].data();
        if (!firmware)
            return refuse(error, NoFirmwareData, "There is no firmware to install");
        if (!files::replace(firmwarePath(chip), *firmware))
            return refuse(error, NotInstalled, "The firmware cannot be written to " + firmwarePath(chip));
        done_ = true;
        say(format("installed a firmware of %lu bytes", firmware->size()));
        if (output)
            *output = Value::Dictionary{{"InstalledSize", firmware->size()}};
        return true;
    }

private:
    void say(const std::string& message) const {
        if (log_)
            log_(name_, message);
    }

    const VanterUpdaterLog log_;
    const std::string name_;
    bool done_ = false;
};

VanterUpdater* VanterUpdaterCreate(const Value&, VanterUpdaterLog log, std::string_view name,
                                   std::optional<Error>* error) {
    return mayRun(chip(), "create", error) ? new VanterUpdater(log, name) : nullptr;
}

bool VanterUpdaterIsDone(VanterUpdater* updater, std::optional<Error>* error) {
    const Value described = chip();
    return mayRun(described, "isDone", error) && updater->isDone(described);
}

bool VanterUpdaterExecCommand(VanterUpdater* updater, std::string_view step, const Value& options, Value* output,
                              std::optional<Error>* error) {
    const Value described = chip();
    if (!mayRun(described, step, error))
        return false;
    if (step == "queryInfo")
        return updater->queryInfo(described, output, error);
    if (step == "performNextStage")
        return updater->performNextStage(described, options, output, error);
    return refuse(error, UnknownStep, "The updater knows no step " + std::string(step));
}

void VanterUpdaterRelease(VanterUpdater* updater) {
    delete updater;
}
