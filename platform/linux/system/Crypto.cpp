#include "platform/Crypto.h"

#include <algorithm>
#include <atomic>
#include <bit>
#include <cerrno>
#include <cstring>

#include <openssl/bn.h>
#include <openssl/core_names.h>
#include <openssl/crypto.h>
#include <openssl/evp.h>
#include <openssl/objects.h>
#include <openssl/params.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>
#include <sys/random.h>

#include "platform/linux/system/OpenSSL.h"

namespace crypto {

namespace {

// Whether the library could be set up at its first use, which its own operations take for granted.
bool libraryIsUsable() noexcept {
    return OSSL_LIB_CTX_get0_global_default() != nullptr;
}

// One digest, fetched at its first use and kept: a fetch costs as much as the digest of a kilobyte.
struct DigestAlgorithm {
    const char* name;
    std::size_t size;
    std::atomic<EVP_MD*> fetched = nullptr;
};

DigestAlgorithm digestAlgorithms[] = {
    {"SHA1", sha1Size}, {"SHA256", sha256Size}, {"SHA384", sha384Size}, {"SHA512", sha512Size}};

DigestAlgorithm& describe(Digest algorithm) {
    return digestAlgorithms[static_cast<std::size_t>(algorithm)];
}

// Null when memory has run out.
const EVP_MD* implementation(DigestAlgorithm& algorithm) noexcept {
    EVP_MD* known = algorithm.fetched.load(std::memory_order_acquire);
    if (known != nullptr || !libraryIsUsable())
        return known;
    EVP_MD* const fetched = EVP_MD_fetch(nullptr, algorithm.name, nullptr);
    if (algorithm.fetched.compare_exchange_strong(known, fetched, std::memory_order_acq_rel))
        return fetched;
    EVP_MD_free(fetched); // another thread was first
    return known;
}

EVP_MD_CTX* context(RunningDigest* running) {
    return reinterpret_cast<EVP_MD_CTX*>(running);
}

EVP_MAC_CTX* context(void* pointer) {
    return static_cast<EVP_MAC_CTX*>(pointer);
}

} // namespace

bool prepare() noexcept {
    OPENSSL_init_crypto(OPENSSL_INIT_LOAD_CONFIG | OPENSSL_INIT_LOAD_CRYPTO_STRINGS | OPENSSL_INIT_ADD_ALL_CIPHERS |
                            OPENSSL_INIT_ADD_ALL_DIGESTS,
                        nullptr);
    bool isReady = HMACSHA256().init("", 0);
    for (DigestAlgorithm& algorithm : digestAlgorithms)
        isReady = implementation(algorithm) != nullptr && isReady;
    return isReady;
}

bool digest(Digest algorithm, Bytes data, std::uint8_t* out) noexcept {
    DigestAlgorithm& description = describe(algorithm);
    const EVP_MD* const md = implementation(description);
    if (md != nullptr && EVP_Digest(data.data, data.length, out, nullptr, md, nullptr) == 1)
        return true;
    std::memset(out, 0, description.size);
    return false;
}

bool sha1(const void* data, std::size_t length, std::uint8_t* out) noexcept {
    return digest(Digest::SHA1, {static_cast<const std::uint8_t*>(data), length}, out);
}

bool sha256(const void* data, std::size_t length, std::uint8_t* out) noexcept {
    return digest(Digest::SHA256, {static_cast<const std::uint8_t*>(data), length}, out);
}

bool sha384(const void* data, std::size_t length, std::uint8_t* out) noexcept {
    return digest(Digest::SHA384, {static_cast<const std::uint8_t*>(data), length}, out);
}

RunningDigest* startDigest(Digest algorithm) noexcept {
    const EVP_MD* const md = implementation(describe(algorithm));
    EVP_MD_CTX* const started = md != nullptr ? EVP_MD_CTX_new() : nullptr;
    if (started == nullptr || EVP_DigestInit_ex(started, md, nullptr) == 1)
        return reinterpret_cast<RunningDigest*>(started);
    EVP_MD_CTX_free(started);
    return nullptr;
}

bool updateDigest(RunningDigest* running, Bytes data) noexcept {
    return EVP_DigestUpdate(context(running), data.data, data.length) == 1;
}

bool finishDigest(RunningDigest* running, std::uint8_t* out) noexcept {
    const int size = EVP_MD_CTX_get_size(context(running));
    const bool done = EVP_DigestFinal_ex(context(running), out, nullptr) == 1;
    if (!done && size > 0)
        std::memset(out, 0, static_cast<std::size_t>(size));
    EVP_MD_CTX_free(context(running));
    return done;
}

HMACSHA256::~HMACSHA256() {
    EVP_MAC_CTX_free(context(context_));
}

bool HMACSHA256::init(const void* key, std::size_t length) noexcept {
    usable_ = false;
    if (!context_) {
        if (!libraryIsUsable())
            return false;
        EVP_MAC* mac = EVP_MAC_fetch(nullptr, "HMAC", nullptr);
        context_ = mac ? EVP_MAC_CTX_new(mac) : nullptr;
        EVP_MAC_free(mac);
    }
    if (!context_)
        return false;
    char name[] = "SHA256";
    const OSSL_PARAM params[] = {OSSL_PARAM_construct_utf8_string(OSSL_MAC_PARAM_DIGEST, name, 0),
                                 OSSL_PARAM_construct_end()};
    usable_ = EVP_MAC_init(context(context_), static_cast<const unsigned char*>(key), length, params) == 1;
    return usable_;
}

bool HMACSHA256::update(const void* data, std::size_t length) noexcept {
    usable_ = usable_ && EVP_MAC_update(context(context_), static_cast<const unsigned char*>(data), length) == 1;
    return usable_;
}

bool HMACSHA256::final(std::uint8_t (&out)[sha256Size]) noexcept {
    std::size_t size = 0;
    if (usable_ && EVP_MAC_final(context(context_), out, &size, sizeof out) == 1 && size == sizeof out)
        return true;
    std::memset(out, 0, sizeof out);
    return false;
}

namespace {

using openssl::Owner;
using openssl::QuietErrors;
using Key = Owner<EVP_PKEY, EVP_PKEY_free>;
using KeyContext = Owner<EVP_PKEY_CTX, EVP_PKEY_CTX_free>;

// A context for the import of public keys of one type. Making it costs a tenth of a verification, so that one that has
// served is kept for the next key, whichever thread brings it.
class Importer {
public:
    struct Type {
        const char* name;
        std::atomic<EVP_PKEY_CTX*> spare = nullptr;
    };

    explicit Importer(Type& type) noexcept : type_(type), context_(type.spare.exchange(nullptr)) {
        if (context_ != nullptr)
            return;
        context_.reset(EVP_PKEY_CTX_new_from_name(nullptr, type.name, nullptr));
        if (context_ != nullptr && EVP_PKEY_fromdata_init(context_.get()) != 1)
            context_ = nullptr;
    }
    Importer(const Importer&) = delete;
    Importer& operator=(const Importer&) = delete;

    Key importKey(OSSL_PARAM* params) && noexcept {
        EVP_PKEY* key = nullptr;
        if (context_ == nullptr || EVP_PKEY_fromdata(context_.get(), &key, EVP_PKEY_PUBLIC_KEY, params) != 1)
            return nullptr;
        context_.reset(type_.spare.exchange(context_.release()));
        return Key(key);
    }

private:
    Type& type_;
    KeyContext context_;
};

Importer::Type rsaKeys = {"RSA"};
Importer::Type ecKeys = {"EC"};

bool verify(EVP_PKEY_CTX* verifier, Bytes hash, Bytes signature) noexcept {
    return EVP_PKEY_verify(verifier, signature.data, signature.length, hash.data, hash.length) == 1;
}

// A number in the order of octets that parameters of the library have.
class NativeNumber {
public:
    static constexpr std::size_t capacity = 1024;

    // Of at most `capacity` octets, big-endian.
    explicit NativeNumber(Bytes number) noexcept : length_(number.length) {
        std::copy_n(number.data, number.length, octets_);
        if constexpr (std::endian::native == std::endian::little)
            std::reverse(octets_, octets_ + length_);
    }
    OSSL_PARAM parameter(const char* name) noexcept { return OSSL_PARAM_construct_BN(name, octets_, length_); }

private:
    unsigned char octets_[capacity];
    std::size_t length_;
};

Key importRSAKey(Bytes modulus, Bytes exponent) noexcept {
    NativeNumber n(modulus);
    NativeNumber e(exponent);
    OSSL_PARAM params[] = {n.parameter(OSSL_PKEY_PARAM_RSA_N), e.parameter(OSSL_PKEY_PARAM_RSA_E),
                           OSSL_PARAM_construct_end()};
    return Importer(rsaKeys).importKey(params);
}

struct CurveDescription {
    const char* name;
    std::size_t pointLength;
};

constexpr CurveDescription curves[] = {{"P-256", 65}, {"P-384", 97}};

Key importPoint(Curve curve, Bytes point) noexcept {
    constexpr std::uint8_t uncompressed = 0x04;
    const CurveDescription& description = curves[static_cast<std::size_t>(curve)];
    if (point.length != description.pointLength || point.data[0] != uncompressed)
        return nullptr;
    // Parameters are read only here, whatever their type says.
    OSSL_PARAM params[] = {
        OSSL_PARAM_construct_utf8_string(OSSL_PKEY_PARAM_GROUP_NAME, const_cast<char*>(description.name), 0),
        OSSL_PARAM_construct_octet_string(OSSL_PKEY_PARAM_PUB_KEY, const_cast<std::uint8_t*>(point.data), point.length),
        OSSL_PARAM_construct_end()};
    return Importer(ecKeys).importKey(params);
}

// The library takes exponents of more than 64 bits only with moduli of at most 3072.
bool isBeyondLibrary(Bytes modulus, Bytes exponent) noexcept {
    return exponent.length > OPENSSL_RSA_MAX_PUBEXP_BITS / 8 && modulus.length > OPENSSL_RSA_SMALL_MODULUS_BITS / 8;
}

using Number = Owner<BIGNUM, BN_free>;
using NumberContext = Owner<BN_CTX, BN_CTX_free>;

Number number(Bytes octets) noexcept {
    return Number(BN_bin2bn(octets.data, static_cast<int>(octets.length), nullptr));
}

// Writes the encoded message of RFC 8017 9.2 for a digest into the `size` octets at `out`.
bool encodeMessage(const EVP_MD* md, Bytes hash, unsigned char* out, std::size_t size) noexcept {
    const Owner<X509_SIG, X509_SIG_free> info(X509_SIG_new());
    X509_ALGOR* algorithm = nullptr;
    ASN1_OCTET_STRING* octets = nullptr;
    if (info)
        X509_SIG_getm(info.get(), &algorithm, &octets);
    if (!info || X509_ALGOR_set0(algorithm, OBJ_nid2obj(EVP_MD_get_type(md)), V_ASN1_NULL, nullptr) != 1 ||
        ASN1_OCTET_STRING_set(octets, hash.data, static_cast<int>(hash.length)) != 1)
        return false;
    const int length = i2d_X509_SIG(info.get(), nullptr);
    constexpr std::size_t leastPadding = 8 + 3;
    if (length < 0 || size < static_cast<std::size_t>(length) + leastPadding)
        return false;
    unsigned char* next = out + size - length;
    std::fill(out, next, std::uint8_t{0xFF});
    out[0] = 0x00;
    out[1] = 0x01;
    next[-1] = 0x00;
    return i2d_X509_SIG(info.get(), &next) == length;
}

// RFC 8017 5.2.2 and 8.2.2 by the library's arithmetic, for keys of at most NativeNumber::capacity octets.
bool verifyByArithmetic(const EVP_MD* md, Bytes hash, Bytes modulus, Bytes exponent, Bytes signature) noexcept {
    const Number n = number(modulus);
    const Number e = number(exponent);
    const Number s = number(signature);
    const Number message(BN_new());
    const NumberContext context(BN_CTX_new());
    unsigned char found[NativeNumber::capacity];
    unsigned char expected[NativeNumber::capacity];
    return n && e && s && message && context && BN_cmp(s.get(), n.get()) < 0 &&
           BN_mod_exp(message.get(), s.get(), e.get(), n.get(), context.get()) == 1 &&
           BN_bn2binpad(message.get(), found, static_cast<int>(modulus.length)) >= 0 &&
           encodeMessage(md, hash, expected, modulus.length) && std::memcmp(found, expected, modulus.length) == 0;
}

} // namespace

bool verifyRSASignature(Digest algorithm, Bytes hash, Bytes modulus, Bytes exponent, Bytes signature) noexcept {
    DigestAlgorithm& description = describe(algorithm);
    const EVP_MD* const md = implementation(description);
    if (md == nullptr || hash.length != description.size || signature.length != modulus.length)
        return false;
    const QuietErrors quiet;
    if (modulus.length > NativeNumber::capacity || exponent.length > modulus.length)
        return false;
    if (isBeyondLibrary(modulus, exponent))
        return verifyByArithmetic(md, hash, modulus, exponent, signature);
    const Key key = importRSAKey(modulus, exponent);
    const KeyContext verifier(key != nullptr ? EVP_PKEY_CTX_new_from_pkey(nullptr, key.get(), nullptr) : nullptr);
    return verifier != nullptr && EVP_PKEY_verify_init(verifier.get()) == 1 &&
           EVP_PKEY_CTX_set_rsa_padding(verifier.get(), RSA_PKCS1_PADDING) == 1 &&
           EVP_PKEY_CTX_set_signature_md(verifier.get(), md) == 1 && verify(verifier.get(), hash, signature);
}

bool verifyECDSASignature(Curve curve, Bytes point, Bytes hash, Bytes signature) noexcept {
    if (!libraryIsUsable())
        return false;
    const QuietErrors quiet;
    const Key key = importPoint(curve, point);
    const KeyContext verifier(key != nullptr ? EVP_PKEY_CTX_new_from_pkey(nullptr, key.get(), nullptr) : nullptr);
    return verifier != nullptr && EVP_PKEY_verify_init(verifier.get()) == 1 && verify(verifier.get(), hash, signature);
}

bool randomBytes(void* out, std::size_t length) noexcept {
    auto* next = static_cast<std::uint8_t*>(out);
    std::size_t left = length;
    while (left > 0) {
        const ssize_t count = ::getrandom(next, left, 0);
        if (count < 0 && errno == EINTR)
            continue;
        if (count <= 0) {
            std::memset(out, 0, length);
            return false;
        }
        next += count;
        left -= static_cast<std::size_t>(count);
    }
    return true;
}

} // namespace crypto
