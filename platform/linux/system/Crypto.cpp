#include "platform/Crypto.h"

#include <cstring>

#include <openssl/core_names.h>
#include <openssl/evp.h>
#include <openssl/params.h>
#include <openssl/rand.h>

namespace crypto {

namespace {

bool digest(const EVP_MD* algorithm, const void* data, std::size_t length, std::uint8_t* out,
            std::size_t size) noexcept {
    if (EVP_Digest(data, length, out, nullptr, algorithm, nullptr) == 1)
        return true;
    std::memset(out, 0, size);
    return false;
}

EVP_MAC_CTX* context(void* pointer) {
    return static_cast<EVP_MAC_CTX*>(pointer);
}

} // namespace

bool sha1(const void* data, std::size_t length, std::uint8_t* out) noexcept {
    return digest(EVP_sha1(), data, length, out, sha1Size);
}

bool sha256(const void* data, std::size_t length, std::uint8_t* out) noexcept {
    return digest(EVP_sha256(), data, length, out, sha256Size);
}

bool sha384(const void* data, std::size_t length, std::uint8_t* out) noexcept {
    return digest(EVP_sha384(), data, length, out, sha384Size);
}

HMACSHA256::~HMACSHA256() {
    EVP_MAC_CTX_free(context(context_));
}

bool HMACSHA256::init(const void* key, std::size_t length) noexcept {
    usable_ = false;
    if (!context_) {
        EVP_MAC* mac = EVP_MAC_fetch(nullptr, "HMAC", nullptr);
        context_ = EVP_MAC_CTX_new(mac);
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

bool randomBytes(void* out, std::size_t length) noexcept {
    auto* bytes = static_cast<unsigned char*>(out);
    while (length > 0) {
        const int piece = length > 1 << 20 ? 1 << 20 : static_cast<int>(length);
        if (RAND_bytes(bytes, piece) != 1) {
            std::memset(out, 0, static_cast<std::size_t>(bytes - static_cast<unsigned char*>(out)));
            return false;
        }
        bytes += piece;
        length -= static_cast<std::size_t>(piece);
    }
    return true;
}

} // namespace crypto
