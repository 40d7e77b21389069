#include "platform/ReverseProxy.h"

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <mutex>
#include <system_error>
#include <thread>
#include <utility>
#include <vector>

#include "platform/SystemLog.h"
#include "platform/linux/services/DeviceDescription.h"

namespace {

using Clock = std::chrono::steady_clock;

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
    RPRegistration(const RPRegistration&) = delete;
    RPRegistration& operator=(const RPRegistration&) = delete;
    ~RPRegistration() {
        invalidate();
        if (deliverer_.joinable())
            deliverer_.join();
    }

    void resume() try {
        if (!deliverer_.joinable())
            deliverer_ = std::thread([this, start = Clock::now()] { deliver(start); });
    } catch (const std::system_error& failure) {
        consoleLog(std::string("The reverse proxy's events cannot be delivered: ") + failure.what());
    }

    void invalidate() {
        const std::lock_guard lock(mutex_);
        invalid_ = true;
        changed_.notify_all();
    }

private:
    void deliver(Clock::time_point start) {
        for (const Event& event : events_) {
            std::unique_lock lock(mutex_);
            if (changed_.wait_until(lock, start + event.after, [this] { return invalid_; }))
                return;
            lock.unlock();
            callback_(event.status);
        }
    }

    const RPAvailabilityCallback callback_;
    const std::vector<Event> events_;
    std::mutex mutex_;
    std::condition_variable changed_;
    bool invalid_ = false;
    std::thread deliverer_;
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
