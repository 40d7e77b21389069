#ifndef VELTRA_TESTS_ORLOCTL_BLOB_H
#define VELTRA_TESTS_ORLOCTL_BLOB_H

#include "tools/makers/Img4Maker.h"

// Numbers and whole configuration blobs, with the least octet first and without HMACs.
inline img4maker::Bytes number(std::uint32_t value) {
    return img4maker::item(DERTagInteger,
                           {static_cast<std::uint8_t>(value), static_cast<std::uint8_t>(value >> 8),
                            static_cast<std::uint8_t>(value >> 16), static_cast<std::uint8_t>(value >> 24)});
}

inline img4maker::Bytes blob(const img4maker::List& payload, const img4maker::List& metadata = {},
                             std::uint32_t magic = 0x62436667, std::uint32_t version = 0x30003) {
    using namespace img4maker;
    return sequence({number(magic), number(version), item(DERTagPrivateConstructed(0x53504159), set(payload)),
                     item(DERTagPrivateConstructed(0x4D455441), set(metadata)),
                     item(DERTagPrivateConstructed(0x4D414E49), sequence({octets({}), octets({}), octets({})}))});
}

#endif
