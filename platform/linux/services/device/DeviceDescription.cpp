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

// Whether the description was another when this was last asked. One that is missing is empty.
bool hasChanged(const Value::Data& contents) {
    static std::mutex mutex;
    static auto* const last = new Value::Data; // never destroyed: threads may ask until the process is gone
    const std::lock_guard lock(mutex);
    if (*last == contents)
        return false;
    *last = contents;
    return true;
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

} // namespace

Value deviceDescription() {
    const std::optional<Value::Data> contents = files::readWhole(descriptionPath);
    const bool isNew = hasChanged(contents.value_or(Value::Data()));
    std::string problem;
    Value description = described(contents, problem);
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
