#include <cstdint>

#include "device/ZPDevice.h"
#include "plugin/Commands.h"

namespace {

constexpr char entitlement[] = "eksp";

// A four-character code as a number, with the first character in the most significant byte.
constexpr std::uint32_t fourCharacterCode(const char (&code)[5]) {
    std::uint32_t number = 0;
    for (int i = 0; i < 4; ++i)
        number = number << 8 | static_cast<unsigned char>(code[i]);
    return number;
}

} // namespace

HSMessageResponse checkCorvoPostSwapEntitlement(const HSMessageRequest& request, const Value&) {
    constexpr std::uint32_t tag = fourCharacterCode(entitlement);
    serviceLog.info("Checking entitlement for %s     , tag %u", entitlement, tag);
    const bool entitled = ZPDevice::sharedSingleton().getPostSwapEntitlement(tag);
    return HSMessageResponse::initWithName(request.messageStr, 0, Value::Dictionary{{"IsPostSwapEntitled", entitled}});
}
