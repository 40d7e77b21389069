// The blob's structures as records of DER items, shared by the decoder and the encoder. Not installed.
#ifndef VELTRA_SYSCONFIG_SYSCONFIG3WIRE_H
#define VELTRA_SYSCONFIG_SYSCONFIG3WIRE_H

#include <array>
#include <cstddef>
#include <cstdint>

#include "der/DERTypes.h"

namespace sysconfig {

// The private tag numbers are four-character codes: "SPAY", "META" and "MANI".
constexpr DERTag payloadTag = DERTagPrivateConstructed(0x53504159);
constexpr DERTag metadataTag = DERTagPrivateConstructed(0x4D455441);
constexpr DERTag manifestTag = DERTagPrivateConstructed(0x4D414E49);

struct ManifestItems {
    DERItem payloadHMAC;
    DERItem metadataHMAC;
    DERItem fullHMAC;
};

constexpr std::array<DERItemSpec, 3> manifestRows = {{{offsetof(ManifestItems, payloadHMAC), DERTagOctetString, 0},
                                                      {offsetof(ManifestItems, metadataHMAC), DERTagOctetString, 0},
                                                      {offsetof(ManifestItems, fullHMAC), DERTagOctetString, 0}}};

// A 32-bit value on the wire: an INTEGER of always four octets, the least significant first, whatever the order of the
// machine.
struct Octets4 {
    std::uint8_t octets[4];
};

constexpr Octets4 octetsOf(std::uint32_t value) {
    return {{static_cast<std::uint8_t>(value), static_cast<std::uint8_t>(value >> 8),
             static_cast<std::uint8_t>(value >> 16), static_cast<std::uint8_t>(value >> 24)}};
}

} // namespace sysconfig

#endif
