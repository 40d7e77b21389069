#include "tests/support/FailingAllocation.h"

#include <cstdlib>
#include <new>

namespace {

int remaining = 0;
bool failed = false;

} // namespace

void failAllocation(int count) {
    remaining = count;
    failed = false;
}

bool allocationHasFailed() {
    return failed;
}

void* operator new(std::size_t size) {
    if (remaining > 0 && --remaining == 0) {
        failed = true;
        throw std::bad_alloc();
    }
    if (void* memory = std::malloc(size == 0 ? 1 : size))
        return memory;
    throw std::bad_alloc();
}

void operator delete(void* memory) noexcept {
    std::free(memory);
}

void operator delete(void* memory, std::size_t) noexcept {
    std::free(memory);
}
