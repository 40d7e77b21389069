// What the fuzz targets share: a check that ends the run with its place when it does not hold, and views of the input.
#ifndef VELTRA_FUZZ_FUZZ_H
#define VELTRA_FUZZ_FUZZ_H

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <iostream>
#include <span>

#include "der/DERTypes.h"

#define FUZZ_REQUIRE(condition)                                                                                        \
    do {                                                                                                               \
        if (!(condition)) {                                                                                            \
            std::cerr << __FILE__ << ":" << __LINE__ << ": does not hold: " << #condition << "\n";                     \
            std::abort();                                                                                              \
        }                                                                                                              \
    } while (false)

namespace fuzz {

// For Replay.cpp, set by a target whose reader takes the input, and a digest of what it says of it, by one that has
// that: 0 for nothing.
inline bool taken = false;
inline std::uint64_t answer = 0;

// Octets that are read in order as numbers; zeros when there are no more.
struct Input {
    std::span<const std::uint8_t> left;

    std::uint8_t octet() {
        if (left.empty())
            return 0;
        const std::uint8_t first = left[0];
        left = left.subspan(1);
        return first;
    }

    std::uint64_t word() {
        std::uint64_t value = 0;
        for (int i = 0; i < 8; ++i)
            value = value << 8 | octet();
        return value;
    }
};

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

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size);

#endif
