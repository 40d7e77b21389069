// What the uses of OpenSSL have in common.
#ifndef VELTRA_PLATFORM_LINUX_OPENSSL_H
#define VELTRA_PLATFORM_LINUX_OPENSSL_H

#include <memory>

#include <openssl/err.h>

namespace openssl {

// Owns an object of the library, which is released with `Free`.
template <class Object, void (*Free)(Object*)>
struct Release {
    void operator()(Object* object) const { Free(object); }
};
template <class Object, void (*Free)(Object*)>
using Owner = std::unique_ptr<Object, Release<Object, Free>>;

// Whatever the library notes about failures while this lives is forgotten at the end, so that notes about hostile bytes
// do not pile up or get mistaken for those of a later operation. What it noted before stays.
class QuietErrors {
public:
    QuietErrors() noexcept { ERR_set_mark(); }
    ~QuietErrors() { ERR_pop_to_mark(); }
    QuietErrors(const QuietErrors&) = delete;
    QuietErrors& operator=(const QuietErrors&) = delete;
};

} // namespace openssl

#endif
