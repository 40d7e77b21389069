// Runs out of memory inside the cryptographic library, at each of its allocations in turn.
#include <cstring>

#include <gtest/gtest.h>
#include <openssl/crypto.h>
#include <sys/wait.h>
#include <unistd.h>

#include "platform/Crypto.h"
#include "tests/support/FailingAllocation.h"

namespace {

enum Outcome {
    Computed = 0,
    Refused = 1,
    Wrong = 2
};

// The HMAC of RFC 4231, test case 2, with so many allocations that still succeed.
Outcome computeWith(int allocations) {
    constexpr std::uint8_t expected[] = {0x5b, 0xdc, 0xc1, 0x46, 0xbf, 0x60, 0x75, 0x4e};
    failAllocation(allocations + 1);
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
    failAllocationsOfOpenSSL();
    if (OpenSSL_version_num() < 0x30500000) // a newer one does not end when memory does in its first use
        expectRightOrRefusedWhereverMemoryEnds();
    ASSERT_TRUE(crypto::prepare());
    expectRightOrRefusedWhereverMemoryEnds();
}

} // namespace
