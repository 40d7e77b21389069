// The request and response objects of the host framework: plain values, the same whatever carries them.
#include "platform/HostFramework.h"

#include <utility>

std::string HSMessageRequest::description() const {
    return Value::descriptionOf({{"messageDict", &messageDict}, {"messageStr", &messageStr}});
}

HSMessageResponse HSMessageResponse::initWithName(Value name, std::int64_t statusCode, Value response,
                                                  std::optional<Error> error) {
    HSMessageResponse result;
    result.name_ = std::move(name);
    result.statusCode_ = statusCode;
    result.response_ = std::move(response);
    result.error_ = std::move(error);
    return result;
}
