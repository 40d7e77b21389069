#include "platform/Crypto.h"

#include <cerrno>
#include <cstring>

#include <openssl/core_names.h>
#include <openssl/crypto.h>
#include <openssl/evp.h>
#include <openssl/params.h>
#include <sys/random.h>

namespace crypto {

namespace {

// Whether the library could be set up at its first use, which its own operations take for granted.
bool libraryIsUsable() noexcept {
    return OSSL_LIB_CTX_get0_global_default() != nullptr;
}

bool digest(const EVP_MD* algorithm, const void* data, std::size_t length, std::uint8_t* out,
            std::size_t size) noexcept {
    if (libraryIsUsable() && EVP_Digest(data, length, out, nullptr, algorithm, nullptr) == 1)
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
