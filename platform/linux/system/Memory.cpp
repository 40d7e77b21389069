#include "platform/Memory.h"

#include <cstdint>

#include <sys/mman.h>
#include <unistd.h>

void memory::willBeFilled(void* block, std::size_t size) noexcept {
    constexpr std::size_t smallest = std::size_t{2} << 20; // a large page of most machines
    if (size < smallest)
        return;
    const auto intoPage =
        reinterpret_cast<std::uintptr_t>(block) % static_cast<std::uintptr_t>(::sysconf(_SC_PAGESIZE));
    // A system without large pages refuses; the block is as good then as any.
    (void)::madvise(static_cast<char*>(block) - intoPage, size + intoPage, MADV_HUGEPAGE);
}
