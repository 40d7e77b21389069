#include <atomic>
#include <chrono>
#include <memory>

#include "Daemon/HSLog.h"
#include "device/ZPDevice.h"
#include "platform/ReverseProxy.h"
#include "platform/Semaphore.h"

namespace {

constexpr LogSource zplog{"ZPDevice"};

constexpr std::chrono::seconds waitLimit{5};

constexpr std::int32_t available = 1;
constexpr std::int32_t endOfWaiting = 3;

// What the callback and the call that waits for it share. Each owns a part of it, so that a callback that comes after
// the call has returned finds it still there.
struct Availability {
    void report(std::int32_t status) {
        if (status == available)
            isAvailable = true;
        if (status == available || status == endOfWaiting)
            reported.signal();
    }

    std::atomic<bool> isAvailable = false;
    CountingSemaphore reported;
};

using RegistrationPtr = std::unique_ptr<RPRegistration, decltype(&RPRelease)>;

} // namespace

Value ZPDevice::setupReverseProxy(const std::string& url) const {
    zplog.info("%s:%d", "-[ZPDevice setupReverseProxy:]", __LINE__);
    const auto availability = std::make_shared<Availability>();
    const Value options = Value::Dictionary{{"TestReachability", false}};
    const RegistrationPtr registration(
        RPRegisterForAvailability([availability](std::int32_t status) { availability->report(status); }), RPRelease);
    if (!registration) {
        zplog.info("failed to register for reverse proxy availability");
        return {};
    }
    RPRegistrationResume(registration.get());
    availability->reported.waitFor(waitLimit);
    RPRegistrationInvalidate(registration.get());
    if (!availability->isAvailable) {
        zplog.info("Failed to get proxy info");
        return {};
    }
    zplog.info("Getting proxy info");
    return RPCopyProxyDictionaryWithOptions(url, options);
}
