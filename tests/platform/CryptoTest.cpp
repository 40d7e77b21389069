#include "platform/Crypto.h"

#include <cstdio>
#include <string>

#include <gtest/gtest.h>

namespace {

std::string hex(const std::uint8_t* bytes, std::size_t length) {
    std::string text;
    char digits[3];
    for (std::size_t i = 0; i < length; ++i) {
        std::snprintf(digits, sizeof digits, "%02x", bytes[i]);
        text += digits;
    }
    return text;
}

// The short message of the FIPS 180-4 examples.
TEST(Crypto, digestsAgreeWithThePublishedExamples) {
    std::uint8_t out[crypto::sha384Size];
    ASSERT_TRUE(crypto::sha1("abc", 3, out));
    EXPECT_EQ(hex(out, crypto::sha1Size), "a9993e364706816aba3e25717850c26c9cd0d89d");
    ASSERT_TRUE(crypto::sha256("abc", 3, out));
    EXPECT_EQ(hex(out, crypto::sha256Size), "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad");
    ASSERT_TRUE(crypto::sha384("abc", 3, out));
    EXPECT_EQ(hex(out, crypto::sha384Size), "cb00753f45a35e8bb5a03d699ac65007272c32ab0eded1631a8b605a43ff5bed"
                                            "8086072ba1e7cc2358baeca134c825a7");
}

// RFC 4231, test case 2, with the message fed in pieces and the object used twice.
TEST(Crypto, hmacAgreesWithRFC4231AndCanBeUsedAgain) {
    crypto::HMACSHA256 hmac;
    for (int round = 0; round < 2; ++round) {
        std::uint8_t out[crypto::sha256Size];
        ASSERT_TRUE(hmac.init("Jefe", 4));
        hmac.update("what do ya want ", 16);
        hmac.update(nullptr, 0);
        hmac.update("for nothing?", 12);
        ASSERT_TRUE(hmac.final(out));
        EXPECT_EQ(hex(out, sizeof out), "5bdcc146bf60754e6a042426089575c75a003f089d2739839dec58b964ec3843");
    }
}

TEST(Crypto, hmacWithoutAKeyIsRefused) {
    crypto::HMACSHA256 hmac;
    std::uint8_t out[crypto::sha256Size] = {1};
    EXPECT_FALSE(hmac.update("x", 1));
    EXPECT_FALSE(hmac.final(out));
    EXPECT_EQ(hex(out, sizeof out), std::string(64, '0'));
}

} // namespace
