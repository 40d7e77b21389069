#include "platform/DeviceAnswers.h"

#include <string>

#include "platform/linux/system/DeviceDescription.h"

Value KACopyAnswer(std::string_view key, const Value& options) { return KACopyAnswerWithError(key, options, nullptr); }

Value KACopyAnswerWithError(std::string_view key, const Value&, Error* error) {
    Value answer = resolveDescribed(deviceDescription()["answers"][key]);
    if (answer.isNothing() && error)
        *error = {"DeviceAnswerErrorDomain", 1, "The device has no answer for " + std::string(key)};
    return answer;
}
