// What the fuzz targets share: a check that ends the run with its place when it does not hold.
#ifndef VELTRA_FUZZ_FUZZ_H
#define VELTRA_FUZZ_FUZZ_H

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <iostream>

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

} // namespace fuzz

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size);

#endif
