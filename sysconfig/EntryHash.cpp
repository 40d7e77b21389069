#include <bit>

#include "sysconfig/EntryList.h"

namespace sysconfig {

namespace {

// SipHash-2-4 over a message that comes as words.
struct SipHash {
    std::uint64_t v0, v1, v2, v3;

    explicit SipHash(const HashSecret& secret)
        : v0(secret.words[0] ^ 0x736F6D6570736575),
          v1(secret.words[1] ^ 0x646F72616E646F6D),
          v2(secret.words[0] ^ 0x6C7967656E657261),
          v3(secret.words[1] ^ 0x7465646279746573) {}

    void round() {
        v0 += v1;
        v2 += v3;
        v1 = std::rotl(v1, 13) ^ v0;
        v3 = std::rotl(v3, 16) ^ v2;
        v0 = std::rotl(v0, 32);
        v2 += v1;
        v0 += v3;
        v1 = std::rotl(v1, 17) ^ v2;
        v3 = std::rotl(v3, 21) ^ v0;
        v2 = std::rotl(v2, 32);
    }

    void absorb(std::uint64_t word) {
        v3 ^= word;
        round();
        round();
        v0 ^= word;
    }

    // The hash, with the octets of the message that fill no word, and the message's size.
    std::uint64_t finish(std::uint64_t tail, std::size_t size) {
        absorb(tail | std::uint64_t{size & 0xFF} << 56);
        v2 ^= 0xFF;
        for (int i = 0; i < 4; ++i)
            round();
        return v0 ^ v1 ^ v2 ^ v3;
    }
};

// Up to eight characters as a word, the first in the least significant octet.
std::uint64_t wordOf(const char* characters, std::size_t count) {
    std::uint64_t word = 0;
    for (std::size_t i = 0; i < count; ++i)
        word |= std::uint64_t{static_cast<unsigned char>(characters[i])} << (8 * i);
    return word;
}

} // namespace

std::uint64_t hashOf(const HashSecret& secret, std::uint32_t key) {
    return SipHash(secret).finish(key, sizeof key);
}

std::uint64_t hashOf(const HashSecret& secret, std::string_view key) {
    SipHash hash(secret);
    const std::size_t tail = key.size() % 8;
    const char* const end = key.data() + (key.size() - tail);
    for (const char* next = key.data(); next != end; next += 8)
        hash.absorb(wordOf(next, 8));
    return hash.finish(wordOf(end, tail), key.size());
}

} // namespace sysconfig
