#include "tests/support/FailingAllocation.h"

#include <cstdlib>

#include <openssl/crypto.h>

namespace {

int remaining = 0;
bool failed = false;

} // namespace

void failAllocation(int count) {
    remaining = count;
    failed = failed && count == 0;
}

bool allocationHasFailed() {
    return failed;
}

bool mayAllocate() {
    if (remaining == 0 || --remaining > 0)
        return true;
    failed = true;
    return false;
}

void failAllocationsOfOpenSSL() {
    CRYPTO_set_mem_functions(
        [](std::size_t size, const char*, int) { return mayAllocate() ? std::realloc(nullptr, size) : nullptr; },
        [](void* old, std::size_t size, const char*, int) { return mayAllocate() ? std::realloc(old, size) : nullptr; },
        [](void* old, const char*, int) { std::free(old); });
}
