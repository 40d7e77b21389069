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

// Set by a target whose reader takes the input, for Replay.cpp.
inline bool taken = false;

} // namespace fuzz

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size);

#endif
