// Runs out of memory inside the cryptographic library, at each of its allocations in turn.
#include <cstdlib>
#include <cstring>

#include <gtest/gtest.h>
#include <openssl/crypto.h>
#include <sys/wait.h>
#include <unistd.h>

#include "platform/Crypto.h"

namespace {

int allocationsLeft = -1; // those that still succeed; negative for all

bool mayAllocate() {
    return allocationsLeft < 0 || allocationsLeft-- > 0;
}

void* allocate(std::size_t size, const char*, int) {
    return mayAllocate() ? std::malloc(size) : nullptr;
}

void* reallocate(void* old, std::size_t size, const char*, int) {
    return mayAllocate() ? std::realloc(old, size) : nullptr;
}

void release(void* old, const char*, int) {
    std::free(old);
}

enum Outcome {
    Computed = 0,
    Refused = 1,
    Wrong = 2
};

// The HMAC of RFC 4231, test case 2.
Outcome computeWith(int allocations) {
    constexpr std::uint8_t expected[] = {0x5b, 0xdc, 0xc1, 0x46, 0xbf, 0x60, 0x75, 0x4e};
    allocationsLeft = allocations;
    std::uint8_t out[crypto::sha256Size] = {1};
    crypto::HMACSHA256 hmac;
    hmac.init("Jefe", 4);
    hmac.update("what do ya want for nothing?", 28);
    if (hmac.final(out))
        return std::memcmp(out, expected, sizeof expected) == 0 ? Computed : Wrong;
    for (const std::uint8_t octet : out)
        if (octet != 0)
            return Wrong;
    return Refused;
}

void expectRightOrRefusedWhereverMemoryEnds() {
    int refused = 0;
    Outcome outcome = Refused;
    for (int allocations = 0; outcome != Computed || refused == 0; ++allocations) {
        const pid_t child = fork();
        if (child == 0)
            _exit(computeWith(allocations));
        int status = 0;
        ASSERT_EQ(waitpid(child, &status, 0), child);
        ASSERT_TRUE(WIFEXITED(status)) << "ended by signal " << WTERMSIG(status) << " after " << allocations;
        outcome = static_cast<Outcome>(WEXITSTATUS(status));
        ASSERT_NE(outcome, Wrong) << "after " << allocations;
        refused += outcome == Refused;
    }
    EXPECT_GT(refused, 5);
}

TEST(CryptoAllocation, anHmacIsRightOrRefusedWhereverMemoryEnds) {
    CRYPTO_set_mem_functions(allocate, reallocate, release);
    if (OpenSSL_version_num() < 0x30500000) // a newer one does not end when memory does in its first use
        expectRightOrRefusedWhereverMemoryEnds();
    ASSERT_TRUE(crypto::prepare());
    expectRightOrRefusedWhereverMemoryEnds();
}

} // namespace
