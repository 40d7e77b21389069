// The hardware registry: a tree of services, each of a class and with properties.
//
// On Linux it is the array "registry" of the device description. Each element is an object with "class" (a text),
// "properties" (an object of values) and "children" (an array of the services below it), each of which may be missing.
// The description is read when a service is asked for; a missing or malformed one is a registry without services.
//
// All operations may be called from any thread.
#ifndef VELTRA_PLATFORM_HARDWARE_REGISTRY_H
#define VELTRA_PLATFORM_HARDWARE_REGISTRY_H

#include <cstddef>
#include <cstdint>
#include <string_view>

#include "platform/Value.h"

namespace HardwareRegistry {

// A service that was asked for; 0 is none. A handle keeps the service as it was then, until it is released.
using Service = std::uint32_t;

// The plane in which the children of the description lie. A service has none in any other.
constexpr std::string_view servicePlane = "IOService";

// Options of searchProperty.
constexpr std::uint32_t searchRecursively = 1;

// What matches the services of exactly this class, for getMatchingService; nothing for an empty name.
Value serviceMatching(std::string_view className);

// The first service that matches: of two that lie below each other the upper one, of siblings the earlier one with all
// that lies below it. 0 when none does. Consumes `matching`; the handle is the caller's to release.
Service getMatchingService(Value matching);

// The value of the property `key` of the service, or nothing. With searchRecursively in `options`, when the service has
// no such property, the first one found on the services below it in `plane`, in the order of getMatchingService. A
// described value is made the real one here, so a file is read now; one that cannot be had does not count as a
// property.
Value searchProperty(Service service, std::string_view plane, std::string_view key, std::uint32_t options);

// Gives a handle back. Nothing happens for 0 and for a handle that is not held.
void releaseService(Service service);

// A handle that is given back at the end.
struct HeldService {
    explicit HeldService(Service held = 0) : handle(held) {}
    HeldService(const HeldService&) = delete;
    HeldService& operator=(const HeldService&) = delete;
    ~HeldService() { releaseService(handle); }

    Service handle;
};

// How many handles are held. 0 between requests; for tests and diagnosis.
std::size_t heldServices();

} // namespace HardwareRegistry

#endif
