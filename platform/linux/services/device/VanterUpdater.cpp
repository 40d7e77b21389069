#include "platform/VanterUpdater.h"

#include <map>
#include <mutex>
#include <utility>

#include "platform/Crypto.h"
#include "platform/Files.h"
#include "platform/Format.h"
#include "platform/linux/services/device/DeviceDescription.h"

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
    return resolveDescribed(deviceDescription()["vanter"]);
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

// The SHA-384 of a firmware; false with an Error when it cannot be computed.
bool digestOf(const Value::Data& firmware, Value::Data& digest, std::optional<Error>* error) {
    digest.resize(crypto::sha384Size);
    return crypto::sha384(firmware.data(), firmware.size(), digest.data()) ||
           refuse(error, NoDigest, "The digest of the firmware cannot be computed");
}

// What this process has installed: by the path of the firmware, its digest.
std::mutex mutex;
std::map<std::string, Value::Data> installed;

// Makes `firmware` the contents of the file at `path`; false, with everything as it was, when it cannot be written.
bool install(const std::string& path, const Value::Data& firmware, Value::Data digest) {
    const std::lock_guard lock(mutex);
    if (!files::replace(path, firmware))
        return false;
    installed.insert_or_assign(path, std::move(digest));
    return true;
}

// What was installed at `path`, empty for nothing.
Value::Data digestAt(const std::string& path) {
    const std::lock_guard lock(mutex);
    const auto found = installed.find(path);
    return found == installed.end() ? Value::Data{} : found->second;
}

} // namespace

class VanterUpdater {
public:
    VanterUpdater(VanterUpdaterLog log, std::string_view name) : log_(log), name_(name) {}

    // A part that was put in meanwhile has another firmware, or none.
    static bool isDone(const Value& chip, std::optional<Error>* error) {
        if (chip["done"].boolean().value_or(false))
            return true;
        const Value::Data expected = digestAt(firmwarePath(chip));
        if (expected.empty())
            return false;
        Value::Data found;
        const auto firmware = files::readWhole(firmwarePath(chip));
        return firmware && digestOf(*firmware, found, error) && found == expected;
    }

    bool queryInfo(const Value& chip, Value* output, std::optional<Error>* error) const {
        Value::Dictionary information;
        if (const auto firmware = files::readWhole(firmwarePath(chip))) {
            Value::Data digest;
            if (!digestOf(*firmware, digest, error))
                return false;
            information["Digest"] = std::move(digest);
        }
        say(information.empty() ? "no firmware is installed" : "a firmware is installed");
        if (output)
            *output = std::move(information);
        return true;
    }

    bool performNextStage(const Value& chip, const Value& options, Value* output, std::optional<Error>* error) const {
        const Value::Data* firmware = options["FirmwareData"].data();
        if (!firmware)
            return refuse(error, NoFirmwareData, "There is no firmware to install");
        Value::Data digest;
        if (!digestOf(*firmware, digest, error))
            return false;
        if (!install(firmwarePath(chip), *firmware, std::move(digest)))
            return refuse(error, NotInstalled, "The firmware cannot be written to " + firmwarePath(chip));
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
};

VanterUpdater* VanterUpdaterCreate(const Value&, VanterUpdaterLog log, std::string_view name,
                                   std::optional<Error>* error) {
    return mayRun(chip(), "create", error) ? new VanterUpdater(log, name) : nullptr;
}

bool VanterUpdaterIsDone(VanterUpdater*, std::optional<Error>* error) {
    const Value described = chip();
    return mayRun(described, "isDone", error) && VanterUpdater::isDone(described, error);
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
