// What the certificate service's opaque certificates are on Linux, for the services that need their keys.
#ifndef VELTRA_PLATFORM_LINUX_X509_CERTIFICATE_H
#define VELTRA_PLATFORM_LINUX_X509_CERTIFICATE_H

#include <memory>

#include <openssl/err.h>
#include <openssl/x509.h>

#include "platform/CertificateService.h"

namespace openssl {

// Owns an object of the library, which is released with `Free`.
template <class Object, void (*Free)(Object*)>
struct Release {
    void operator()(Object* object) const { Free(object); }
};
template <class Object, void (*Free)(Object*)>
using Owner = std::unique_ptr<Object, Release<Object, Free>>;

// Whatever the library notes about failures while this lives is forgotten at the end, so that notes about hostile bytes
// do not pile up or get mistaken for those of a later operation.
class QuietErrors {
public:
    QuietErrors() = default;
    ~QuietErrors() { ERR_clear_error(); }
    QuietErrors(const QuietErrors&) = delete;
    QuietErrors& operator=(const QuietErrors&) = delete;
};

} // namespace openssl

struct CertificateService::Certificate {
    openssl::Owner<X509, X509_free> x509;
};

#endif
