// Growth out of proportion to the input as a failure.
#ifndef VELTRA_FUZZ_GROWTH_H
#define VELTRA_FUZZ_GROWTH_H

#include <atomic>
#include <cstddef>
#include <functional>

#ifdef VELTRA_FUZZ
#include <sanitizer/allocator_interface.h>
#endif

#include "fuzz/Fuzz.h"

// Runs `read` and requires that the heap never held more than `base` + `perOctet` * `size` bytes on top of what it held
// before.
inline void requireProportion(std::size_t size, std::size_t base, std::size_t perOctet,
                              const std::function<void()>& read) {
#ifdef VELTRA_FUZZ
    static std::atomic<std::size_t> held = 0, most = 0;
    static const int installed = __sanitizer_install_malloc_and_free_hooks(
        [](const volatile void*, std::size_t octets) {
            const std::size_t now = held += octets;
            for (std::size_t before = most; before < now && !most.compare_exchange_weak(before, now);) {
            }
        },
        [](const volatile void* memory) {
            held -= memory ? __sanitizer_get_allocated_size(const_cast<const void*>(memory)) : 0;
        });
    FUZZ_REQUIRE(installed != 0);
    const std::size_t before = held;
    most = before;
    read();
    FUZZ_REQUIRE(most - before <= base + perOctet * size);
#else
    static_cast<void>(size + base + perOctet); // only Clang's sanitizer tells what is held
    read();
#endif
}

#endif
