// Large pieces of memory.
#ifndef VELTRA_PLATFORM_MEMORY_H
#define VELTRA_PLATFORM_MEMORY_H

#include <cstddef>

namespace memory {

// Says that the `size` octets at `block`, which come from malloc or calloc and have not been written yet, are soon all
// written. Of a large block the system then makes fewer and larger pages, whose making can cost more than what is done
// with them.
void willBeFilled(void* block, std::size_t size) noexcept;

} // namespace memory

#endif
