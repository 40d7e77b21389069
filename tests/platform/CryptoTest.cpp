#include "platform/Crypto.h"

#include <span>
#include <string>

#include <gtest/gtest.h>

#include "platform/Hexadecimal.h"

namespace {

// The short message of the FIPS 180-4 examples.
TEST(Crypto, digestsAgreeWithThePublishedExamples) {
    const struct {
        bool (*compute)(const void* data, std::size_t length, std::uint8_t* out) noexcept;
        std::size_t size;
        const char* digest;
    } rows[] = {
        {crypto::sha1, crypto::sha1Size, "a9993e364706816aba3e25717850c26c9cd0d89d"},
        {crypto::sha256, crypto::sha256Size, "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad"},
        {crypto::sha384, crypto::sha384Size,
         "cb00753f45a35e8bb5a03d699ac65007272c32ab0eded1631a8b605a43ff5bed8086072ba1e7cc2358baeca134c825a7"},
    };
    for (const auto& row : rows) {
        std::uint8_t out[crypto::sha384Size];
        ASSERT_TRUE(row.compute("abc", 3, out));
        EXPECT_EQ(hexadecimal(std::span(out, row.size)), row.digest);
    }
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
        EXPECT_EQ(hexadecimal(out), "5bdcc146bf60754e6a042426089575c75a003f089d2739839dec58b964ec3843");
    }
}

TEST(Crypto, hmacWithoutAKeyIsRefused) {
    crypto::HMACSHA256 hmac;
    std::uint8_t out[crypto::sha256Size] = {1};
    EXPECT_FALSE(hmac.update("x", 1));
    EXPECT_FALSE(hmac.final(out));
    EXPECT_EQ(hexadecimal(out), std::string(64, '0'));
}

} // namespace
