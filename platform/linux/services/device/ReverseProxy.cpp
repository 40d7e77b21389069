#include "platform/ReverseProxy.h"

#include <algorithm>
#include <chrono>
#include <system_error>
#include <utility>

#include "platform/SystemLog.h"
#include "platform/linux/services/device/DeviceDescription.h"
#include "platform/linux/system/DelayedCalls.h"

class RPRegistration {
public:
    RPRegistration(RPAvailabilityCallback callback, Value events)
        : callback_(std::move(callback)), events_(std::move(events)) {}

    // An event whose status is missing or fits no 32 bits is left out.
    void resume() try {
        constexpr std::int64_t longest = 3'600'000;
        const Value events = std::move(events_);
        events_ = Value();
        const auto start = DelayedCalls::Clock::now();
        auto due = start;
        for (const Value& event : events.array() ? *events.array() : Value::Array()) {
            const auto status = event["status"].integer();
            if (!status || !std::in_range<std::int32_t>(*status))
                continue;
            const std::int64_t after = std::clamp<std::int64_t>(event["afterMs"].integer().value_or(0), 0, longest);
            due = std::max(due, start + std::chrono::milliseconds(after)); // none overtakes the one before it
            calls_.add(due, [this, status = static_cast<std::int32_t>(*status)] { callback_(status); });
        }
    } catch (const std::system_error& failure) {
        consoleLog(std::string("The reverse proxy's events cannot be delivered: ") + failure.what());
    }

    void invalidate() { calls_.stop(); }

private:
    const RPAvailabilityCallback callback_;
    Value events_;       // until the registration is resumed
    DelayedCalls calls_; // last, so that it ends before what it uses
};

RPRegistration* RPRegisterForAvailability(RPAvailabilityCallback callback) {
    const Value description = deviceDescription();
    const Value& reverseProxy = description["reverseProxy"];
    if (!reverseProxy.dictionary())
        return nullptr;
    return new RPRegistration(std::move(callback), resolveDescribed(reverseProxy["events"]));
}

void RPRegistrationResume(RPRegistration* registration) {
    registration->resume();
}

void RPRegistrationInvalidate(RPRegistration* registration) {
    registration->invalidate();
}

void RPRelease(RPRegistration* registration) {
    delete registration;
}

Value RPCopyProxyDictionaryWithOptions(const std::string&, const Value&) {
    Value proxy = resolveDescribed(deviceDescription()["reverseProxy"]["proxy"]);
    return proxy.dictionary() ? proxy : Value();
}
