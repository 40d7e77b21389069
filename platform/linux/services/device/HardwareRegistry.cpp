#include "platform/HardwareRegistry.h"

#include <map>
#include <mutex>
#include <utility>

#include "platform/linux/services/device/DeviceDescription.h"

namespace HardwareRegistry {

namespace {

constexpr char classKey[] = "class", propertiesKey[] = "properties", childrenKey[] = "children";

// The services that are held, each with all that lies below it.
class Handles {
public:
    Service add(Value service) {
        const std::lock_guard lock(mutex_);
        do
            ++last_;
        while (last_ == 0 || held_.contains(last_));
        held_.emplace(last_, std::move(service));
        return last_;
    }

    Value find(Service handle) const {
        const std::lock_guard lock(mutex_);
        const auto found = held_.find(handle);
        return found == held_.end() ? Value() : found->second;
    }

    void remove(Service handle) {
        const std::lock_guard lock(mutex_);
        held_.erase(handle);
    }

    std::size_t count() const {
        const std::lock_guard lock(mutex_);
        return held_.size();
    }

private:
    mutable std::mutex mutex_;
    std::map<Service, Value> held_;
    Service last_ = 0;
};

Handles& handles() {
    static auto* const shared = new Handles; // never destroyed: threads may ask until the process is gone
    return *shared;
}

// How deep this recurses is bounded by the nesting that the description may have.
const Value* firstOfClass(const Value& services, const Value& className) {
    if (!services.array())
        return nullptr;
    for (const Value& service : *services.array()) {
        if (resolveDescribed(service[classKey]) == className)
            return &service;
        if (const Value* found = firstOfClass(service[childrenKey], className))
            return found;
    }
    return nullptr;
}

Value search(const Value& service, std::string_view key, bool recursively) {
    Value found = resolveDescribed(service[propertiesKey][key]);
    const Value::Array* children = recursively ? service[childrenKey].array() : nullptr;
    if (!found.isNothing() || !children)
        return found;
    for (const Value& child : *children) {
        found = search(child, key, recursively);
        if (!found.isNothing())
            break;
    }
    return found;
}

} // namespace

Value serviceMatching(std::string_view className) {
    if (className.empty())
        return {};
    return Value::Dictionary{{classKey, className}};
}

Service getMatchingService(Value matching) {
    const Value consumed = std::move(matching);
    const Value& className = consumed[classKey];
    if (!className.text())
        return 0;
    const Value description = deviceDescription();
    const Value* found = firstOfClass(description["registry"], className);
    return found ? handles().add(*found) : 0;
}

Value searchProperty(Service service, std::string_view plane, std::string_view key, std::uint32_t options) {
    const bool recursively = (options & searchRecursively) != 0 && plane == servicePlane;
    return search(handles().find(service), key, recursively);
}

void releaseService(Service service) {
    handles().remove(service);
}

std::size_t heldServices() {
    return handles().count();
}

} // namespace HardwareRegistry
