#include "platform/ReverseProxy.h"

#include <algorithm>
#include <chrono>
#include <system_error>
#include <utility>
#include <vector>

#include "platform/SystemLog.h"
#include "platform/linux/services/device/DeviceDescription.h"
#include "platform/linux/system/DelayedCalls.h"

namespace {

struct Event {
    std::int32_t status;
    std::chrono::milliseconds after;
};

// The described events; one whose status is missing or fits no 32 bits is left out.
std::vector<Event> eventsOf(const Value& described) {
    constexpr std::int64_t longest = 3'600'000;
    std::vector<Event> events;
    if (!described.array())
        return events;
    for (const Value& event : *described.array()) {
        const auto status = event["status"].integer();
        if (!status || !std::in_range<std::int32_t>(*status))
            continue;
        const std::int64_t after = std::clamp<std::int64_t>(event["afterMs"].integer().value_or(0), 0, longest);
        events.push_back({static_cast<std::int32_t>(*status), std::chrono::milliseconds(after)});
    }
    return events;
}

} // namespace

class RPRegistration {
public:
    RPRegistration(RPAvailabilityCallback callback, std::vector<Event> events)
        : callback_(std::move(callback)), events_(std::move(events)) {}

    void resume() try {
        const auto start = DelayedCalls::Clock::now();
        auto due = start;
        for (const Event& event : std::exchange(events_, {})) {
            due = std::max(due, start + event.after); // none overtakes the one before it
            calls_.add(due, [this, status = event.status] { callback_(status); });
        }
    } catch (const std::system_error& failure) {
        consoleLog(std::string("The reverse proxy's events cannot be delivered: ") + failure.what());
    }

    void invalidate() { calls_.stop(); }

private:
    const RPAvailabilityCallback callback_;
    std::vector<Event> events_; // until the registration is resumed
    DelayedCalls calls_;        // last, so that it ends before what it uses
};

RPRegistration* RPRegisterForAvailability(RPAvailabilityCallback callback) {
    const Value description = deviceDescription();
    const Value& reverseProxy = description["reverseProxy"];
    if (!reverseProxy.dictionary())
        return nullptr;
    return new RPRegistration(std::move(callback), eventsOf(resolveDescribed(reverseProxy["events"])));
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
