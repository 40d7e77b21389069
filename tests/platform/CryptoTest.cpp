#include "platform/Crypto.h"

#include <string>

#include <gtest/gtest.h>
#include <openssl/crypto.h>
#include <sys/wait.h>
#include <unistd.h>

#include "platform/Hexadecimal.h"
#include "tests/support/FailingAllocation.h"

namespace {

enum Outcome {
    Computed = 0,
    Refused = 1,
    Wrong = 2
};

// RFC 4231, test case 2, with the message fed in pieces.
Outcome compute(crypto::HMACSHA256& hmac, bool withKey) {
    std::uint8_t out[crypto::sha256Size] = {1};
    if (withKey)
        hmac.init("Jefe", 4);
    hmac.update("what do ya want ", 16);
    hmac.update(nullptr, 0);
    hmac.update("for nothing?", 12);
    const bool isComputed = hmac.final(out);
    const std::string expected =
        isComputed ? "5bdcc146bf60754e6a042426089575c75a003f089d2739839dec58b964ec3843" : std::string(64, '0');
    return hexadecimal(out) != expected ? Wrong : isComputed ? Computed : Refused;
}

void expectRightOrRefusedWhereverMemoryEnds() {
    int refused = 0;
    Outcome outcome = Refused;
    for (int allocations = 1; outcome != Computed || refused == 0; ++allocations) {
        const pid_t child = fork();
        if (child == 0) {
            failAllocation(allocations);
            crypto::HMACSHA256 hmac;
            _exit(compute(hmac, true));
        }
        int status = 0;
        ASSERT_EQ(waitpid(child, &status, 0), child);
        ASSERT_TRUE(WIFEXITED(status)) << "ended by signal " << WTERMSIG(status) << " at " << allocations;
        outcome = static_cast<Outcome>(WEXITSTATUS(status));
        ASSERT_NE(outcome, Wrong) << "at " << allocations;
        refused += outcome == Refused;
    }
    EXPECT_GT(refused, 5);
}

// Before any other test has OpenSSL allocate something.
TEST(Crypto, anHmacIsRightOrRefusedWhereverMemoryEnds) {
    failAllocationsOfOpenSSL();
    if (OpenSSL_version_num() < 0x30500000) // a newer one does not end when memory does in its first use
        expectRightOrRefusedWhereverMemoryEnds();
    ASSERT_TRUE(crypto::prepare());
    expectRightOrRefusedWhereverMemoryEnds();
}

// The short message of the FIPS 180-4 examples.
TEST(Crypto, digestsAgreeWithThePublishedExamples) {
    std::uint8_t one[crypto::sha1Size], other[crypto::sha384Size];
    EXPECT_TRUE(crypto::sha1("abc", 3, one) && crypto::sha384("abc", 3, other));
    EXPECT_EQ(hexadecimal(one), "a9993e364706816aba3e25717850c26c9cd0d89d");
    EXPECT_EQ(hexadecimal(other),
              "cb00753f45a35e8bb5a03d699ac65007272c32ab0eded1631a8b605a43ff5bed8086072ba1e7cc2358baeca134c825a7");
}

TEST(Crypto, anHmacNeedsAKeyAndCanBeUsedAgain) {
    crypto::HMACSHA256 hmac;
    EXPECT_EQ(compute(hmac, false), Refused);
    EXPECT_EQ(compute(hmac, true), Computed);
    EXPECT_EQ(compute(hmac, true), Computed);
}

} // namespace
