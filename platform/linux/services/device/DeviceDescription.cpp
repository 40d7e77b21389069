#include "platform/linux/services/device/DeviceDescription.h"

#include <mutex>
#include <string>
#include <utility>

#include "platform/Files.h"
#include "platform/HostFramework.h"
#include "platform/Json.h"
#include "platform/SystemLog.h"
#include "platform/linux/system/DescriptionCheck.h"

namespace {

constexpr char descriptionPath[] = "/etc/veltra/device.json";

void report(const std::string& what) {
    const std::string line = std::string("Device description ") + descriptionPath + what;
    consoleLog(line);
    systemLogWrite(getLogHandle(1), SystemLogType::Error, line);
}

// The description that the file holds. Nothing, and `problem`, when it is missing or malformed.
Value described(const std::optional<Value::Data>& contents, std::string& problem) {
    if (!contents) {
        problem = " is missing or cannot be read";
        return {};
    }
    std::string refusal = "it is no object";
    std::optional<Value> description =
        jsonToValue({reinterpret_cast<const char*>(contents->data()), contents->size()}, &refusal);
    if (description && description->dictionary())
        return std::move(*description);
    problem = " is malformed: " + refusal;
    return {};
}

// The description as it was last read, which is parsed anew only when the file has changed.
struct LastDescription {
    std::mutex mutex; // guards what follows
    std::optional<Value::Data> contents;
    Value description;
    std::string problem;
};

// What is wrong with it, and a description that is new.
struct Reading {
    Value description;
    std::string problem;
    bool isNew;
};

Reading readDescription() {
    static auto* const last = new LastDescription; // never destroyed: threads may ask until the process is gone
    std::optional<Value::Data> contents = files::readWhole(descriptionPath);
    const std::lock_guard lock(last->mutex);
    const bool isNew = !contents || contents != last->contents;
    if (isNew) {
        std::string problem;
        last->description = described(contents, problem);
        last->problem = std::move(problem);
        last->contents = std::move(contents);
    }
    return {last->description, last->problem, isNew};
}

} // namespace

Value deviceDescription() {
    auto [description, problem, isNew] = readDescription();
    if (!problem.empty())
        report(problem);
    else if (isNew)
        for (const std::string& fault : descriptionFaults(description))
            report(": " + fault);
    return description;
}

Value deviceDescriptionUnreported() {
    std::string problem;
    return described(files::readWhole(descriptionPath), problem);
}
