#include <bit>

#include "platform/Crypto.h"
#include "sysconfig/EntryList.h"

namespace sysconfig {

namespace {

struct SipState {
    std::uint64_t v0, v1, v2, v3;

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
};

// Up to eight characters as a word, the first in the least significant octet.
std::uint64_t wordOf(const char* characters, std::size_t count) {
    std::uint64_t word = 0;
    for (std::size_t i = 0; i < count; ++i)
        word |= std::uint64_t{static_cast<unsigned char>(characters[i])} << (8 * i);
    return word;
}

} // namespace

bool seedHash(HashSeed* seed) {
    if (!crypto::randomBytes(seed, sizeof *seed))
        return false;
    // Multiplying by an odd number loses nothing.
    seed->mix |= 1;
    seed->multiplier |= 1;
    return true;
}

std::uint64_t sipHash(const std::uint64_t (&key)[2], std::string_view message) {
    SipState state = {key[0] ^ 0x736F6D6570736575, key[1] ^ 0x646F72616E646F6D, key[0] ^ 0x6C7967656E657261,
                      key[1] ^ 0x7465646279746573};
    const std::size_t tail = message.size() % 8;
    const char* const end = message.data() + (message.size() - tail);
    for (const char* next = message.data(); next != end; next += 8)
        state.absorb(wordOf(next, 8));
    state.absorb(wordOf(end, tail) | std::uint64_t{message.size() & 0xFF} << 56);
    state.v2 ^= 0xFF;
    for (int i = 0; i < 4; ++i)
        state.round();
    return state.v0 ^ state.v1 ^ state.v2 ^ state.v3;
}

std::uint32_t hashOf(const HashSeed& seed, std::string_view key) {
    return static_cast<std::uint32_t>(sipHash(seed.sip, key) >> 32);
}

} // namespace sysconfig
