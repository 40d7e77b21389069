// What the certificate service's opaque certificates are on Linux, for the services that need their keys.
#ifndef VELTRA_PLATFORM_LINUX_X509_CERTIFICATE_H
#define VELTRA_PLATFORM_LINUX_X509_CERTIFICATE_H

#include <openssl/x509.h>

#include "platform/CertificateService.h"
#include "platform/linux/system/OpenSSL.h"

struct CertificateService::Certificate {
    openssl::Owner<X509, X509_free> x509;
};

#endif
