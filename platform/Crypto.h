// Cryptographic primitives, by published algorithm. Backed by a maintained library; nothing here is home-made.
//
// Every operation may be called from any thread on objects of its own. Byte arguments are only read during the call. An
// operation that returns false has run out of memory or has met a broken library; its output is then all zero.
#ifndef VELTRA_PLATFORM_CRYPTO_H
#define VELTRA_PLATFORM_CRYPTO_H

#include <cstddef>
#include <cstdint>

namespace crypto {

constexpr std::size_t sha1Size = 20;   // FIPS 180-4
constexpr std::size_t sha256Size = 32; // FIPS 180-4
constexpr std::size_t sha384Size = 48; // FIPS 180-4

// Digests of `length` octets at `data` into `out`, which holds as many octets as the digest's size above.
bool sha1(const void* data, std::size_t length, std::uint8_t* out) noexcept;
bool sha256(const void* data, std::size_t length, std::uint8_t* out) noexcept;
bool sha384(const void* data, std::size_t length, std::uint8_t* out) noexcept;

// HMAC-SHA-256 (RFC 2104): construct, init with a key, update with the message in pieces, final. After a failed step
// the following ones fail too, so that only the result of final needs to be looked at.
class HMACSHA256 {
public:
    HMACSHA256() noexcept = default;
    ~HMACSHA256();
    HMACSHA256(const HMACSHA256&) = delete;
    HMACSHA256& operator=(const HMACSHA256&) = delete;

    bool init(const void* key, std::size_t length) noexcept;
    bool update(const void* data, std::size_t length) noexcept;
    bool final(std::uint8_t (&out)[sha256Size]) noexcept;

private:
    void* context_ = nullptr;
    bool usable_ = false;
};

// Fills `out` with `length` octets of a cryptographically secure random source.
bool randomBytes(void* out, std::size_t length) noexcept;

} // namespace crypto

#endif
