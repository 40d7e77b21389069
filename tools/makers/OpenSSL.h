// Owners of OpenSSL's objects, for the makers. What the library does not make is an exception.
#ifndef VELTRA_TOOLS_MAKERS_OPENSSL_H
#define VELTRA_TOOLS_MAKERS_OPENSSL_H

#include <cstdint>
#include <memory>
#include <stdexcept>
#include <vector>

#include <openssl/crypto.h>

namespace makers {

template <auto Free>
struct Release {
    void operator()(auto* object) const { Free(object); }
};
template <class Object, auto Free>
using Owner = std::unique_ptr<Object, Release<Free>>;

// Passes on what the library made, or how often it succeeded.
template <class Result>
Result require(Result result) {
    if (!(result > Result{}))
        throw std::runtime_error("OpenSSL has failed");
    return result;
}

// The octets of an object, from the library's writer for its kind.
template <class Object>
std::vector<std::uint8_t> encode(const Object* object, int (*write)(const Object*, unsigned char**)) {
    unsigned char* octets = nullptr;
    const int length = require(write(object, &octets));
    const std::vector<std::uint8_t> bytes(octets, octets + length);
    OPENSSL_free(octets);
    return bytes;
}

} // namespace makers

#endif
