// The reverse proxy: the way from the device through the host computer to servers on the network.
//
// On Linux the device description stands for it: "reverseProxy" has "events", which are delivered in their order, each
// "afterMs" milliseconds (at most an hour) after the registration was resumed, and the settings under "proxy". An event
// without a "status" of 32 signed bits is left out. A device whose description has no such entry refuses registration.
#ifndef VELTRA_PLATFORM_REVERSE_PROXY_H
#define VELTRA_PLATFORM_REVERSE_PROXY_H

#include <cstdint>
#include <functional>
#include <string>

#include "platform/Value.h"

// Called when the proxy's availability changes, on a thread of the service. 1 is available; 3 is that waiting any
// longer is of no use; the plug-in gives other statuses no meaning.
using RPAvailabilityCallback = std::function<void(std::int32_t status)>;

class RPRegistration;

// A registration for changes of availability, or null. The caller releases it. Nothing is delivered before it is
// resumed. The callback may be copied and called as long as the registration lives, and what it captured has to last as
// long, so it should own that.
RPRegistration* RPRegisterForAvailability(RPAvailabilityCallback callback);

// Starts the delivery of callbacks.
void RPRegistrationResume(RPRegistration* registration);

// Stops the delivery. Not to be called from the callback. A callback that was on its way may still come.
void RPRegistrationInvalidate(RPRegistration* registration);

// Releases a registration; null is allowed.
void RPRelease(RPRegistration* registration);

// The proxy settings for `url` as a dictionary of "HTTPEnable", "HTTPProxy" and "HTTPPort" and of the same with
// "HTTPS", or nothing. The option "TestReachability" = false asks for the settings alone; on Linux they are never
// tested.
Value RPCopyProxyDictionaryWithOptions(const std::string& url, const Value& options);

#endif
