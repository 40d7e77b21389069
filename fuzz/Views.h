// Views of octets, for the targets of the codecs.
#ifndef VELTRA_FUZZ_VIEWS_H
#define VELTRA_FUZZ_VIEWS_H

#include <cstddef>
#include <cstdint>

#include "der/DERTypes.h"

namespace fuzz {

inline bool isInside(const DERItem& item, const DERItem& outer) {
    return item.data >= outer.data && item.data <= outer.data + outer.length &&
           item.length <= static_cast<std::uint64_t>(outer.data + outer.length - item.data);
}

// The input as an item that is there, though a fuzzer may hand out none at all when it is empty.
inline DERItem viewOf(const std::uint8_t* data, std::size_t size) {
    static const std::uint8_t none = 0;
    return {data != nullptr ? data : &none, size};
}

} // namespace fuzz

#endif
