// Certificates (X.509, RFC 5280): reading them from bytes, and their serial numbers. Nothing is verified, neither a
// signature nor a validity period. The bytes may be hostile.
//
// All operations may be called from any thread.
#ifndef VELTRA_PLATFORM_CERTIFICATE_SERVICE_H
#define VELTRA_PLATFORM_CERTIFICATE_SERVICE_H

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <vector>

#include "platform/Error.h"
#include "platform/Value.h"

namespace CertificateService {

struct Certificate;
using CertificateRef = std::shared_ptr<const Certificate>; // null is none

// The certificates of a CMS certificates-only message (RFC 5652: a SignedData without signers), in the order in which
// they stand there; empty for a message that carries none. Nothing when `message` as a whole is not such a message: any
// other kind of CMS, one with a signer, one with bytes after its end, or no CMS at all.
std::optional<std::vector<CertificateRef>> copyCertificatesFromCertsOnlyMessage(const Value::Data& message);

// The certificate whose DER encoding `bytes` is, from the first of the `length` octets to the last; null when it is
// none.
CertificateRef createCertificateWithBytes(const std::uint8_t* bytes, std::size_t length);

// The first certificate of such a message, or the one certificate that `bytes` are; null for neither.
inline CertificateRef copyFirstCertificate(const Value::Data& bytes) {
    const auto list = copyCertificatesFromCertsOnlyMessage(bytes);
    return list && !list->empty() ? list->front() : createCertificateWithBytes(bytes.data(), bytes.size());
}

// The content octets of the certificate's serialNumber INTEGER exactly as encoded: big-endian two's complement, with
// the leading zero of a number whose first bit is set. Nothing, and *error filled when `error` is given, for no
// certificate.
std::optional<Value::Data> copySerialNumberData(const CertificateRef& certificate, std::optional<Error>* error);

} // namespace CertificateService

#endif
