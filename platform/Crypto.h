// Cryptographic primitives, by published algorithm. Digests, signatures and arithmetic are those of a maintained
// library.
//
// Every operation may be called from any thread on objects of its own. Byte arguments are only read during the call. An
// operation that returns false has run out of memory or has met a broken library; its output is then all zero. What the
// library keeps for later calls is released when the process ends, so do not load and unload it over and over.
#ifndef VELTRA_PLATFORM_CRYPTO_H
#define VELTRA_PLATFORM_CRYPTO_H

#include <cstddef>
#include <cstdint>

namespace crypto {

// Sets the library up whole, as a process does best at its start, while memory is plentiful: where memory ends in the
// first use of OpenSSL 3.5 the library waits for itself for ever, and what could not be set up is unusable from then
// on.
bool prepare() noexcept;

constexpr std::size_t sha1Size = 20;   // FIPS 180-4
constexpr std::size_t sha256Size = 32; // FIPS 180-4
constexpr std::size_t sha384Size = 48; // FIPS 180-4
constexpr std::size_t sha512Size = 64; // FIPS 180-4

// Octets that the caller owns.
struct Bytes {
    const std::uint8_t* data;
    std::size_t length;
};

// Digests of `length` octets at `data` into `out`, which holds as many octets as the digest's size above.
bool sha1(const void* data, std::size_t length, std::uint8_t* out) noexcept;
bool sha256(const void* data, std::size_t length, std::uint8_t* out) noexcept;
bool sha384(const void* data, std::size_t length, std::uint8_t* out) noexcept;

// A digest that is chosen at run time.
enum class Digest {
    SHA1,
    SHA256,
    SHA384,
    SHA512
};
bool digest(Digest algorithm, Bytes data, std::uint8_t* out) noexcept;

// A digest of data that comes in pieces. A start that succeeds (is not null) owes one finish, which releases what the
// start has allocated, whatever its result; its output is of no use after an update that has failed.
struct RunningDigest;
RunningDigest* startDigest(Digest algorithm) noexcept;
bool updateDigest(RunningDigest* running, Bytes data) noexcept;
bool finishDigest(RunningDigest* running, std::uint8_t* out) noexcept;

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

// Whether `signature` is the RSASSA-PKCS1-v1_5 signature (RFC 8017 8.2.2) over the message with the digest `hash`,
// which `algorithm` has made, under the public key of `modulus` and `exponent`, both big-endian and without leading
// zeros. The signature must be as long as the modulus. False for a modulus of more than 8192 bits, for an exponent
// longer than it, and when memory has run out.
bool verifyRSASignature(Digest algorithm, Bytes hash, Bytes modulus, Bytes exponent, Bytes signature) noexcept;

enum class Curve {
    P256,
    P384
};

// Whether `signature`, a DER sequence of r and s, is the ECDSA signature (FIPS 186-4 6) over the message with the
// digest `hash` under the public key `point` on `curve`, in uncompressed form (ANSI X9.63 4.3.6). A point that is not
// on the curve verifies nothing, nor does one in another form. False also when memory has run out.
bool verifyECDSASignature(Curve curve, Bytes point, Bytes hash, Bytes signature) noexcept;

// Fills `out` with `length` octets of a cryptographically secure random source.
bool randomBytes(void* out, std::size_t length) noexcept;

} // namespace crypto

#endif
