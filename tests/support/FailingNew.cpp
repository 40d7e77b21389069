#include <cstdlib>
#include <new>

#include "tests/support/FailingAllocation.h"

void* operator new(std::size_t size) {
    void* const memory = mayAllocate() ? std::malloc(size == 0 ? 1 : size) : nullptr;
    return memory ? memory : throw std::bad_alloc();
}

void operator delete(void* memory) noexcept {
    std::free(memory);
}

void operator delete(void* memory, std::size_t) noexcept {
    std::free(memory);
}
