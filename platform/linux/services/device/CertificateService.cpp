#include "platform/CertificateService.h"

#include <algorithm>
#include <limits>
#include <utility>

#include <openssl/asn1.h>
#include <openssl/cms.h>
#include <openssl/objects.h>

#include "platform/linux/services/device/X509Certificate.h"

namespace CertificateService {

namespace {

using openssl::Owner;

// Reads one object with the library's `decode`; null unless it takes all octets.
template <class Object>
Object* decodeWhole(Object* (*decode)(Object**, const unsigned char**, long), void (*release)(Object*),
                    const std::uint8_t* bytes, std::size_t length) {
    if (length > static_cast<std::size_t>(std::numeric_limits<long>::max()))
        return nullptr;
    const unsigned char* end = bytes;
    Object* object = decode(nullptr, &end, static_cast<long>(length));
    if (object && end == bytes + length)
        return object;
    release(object);
    return nullptr;
}

CertificateRef wrap(Owner<X509, X509_free> x509) {
    const auto made = std::make_shared<Certificate>();
    made->x509 = std::move(x509);
    return made;
}

struct FreeCertificates {
    void operator()(STACK_OF(X509) * certificates) const { sk_X509_pop_free(certificates, X509_free); }
};

bool isCertsOnly(CMS_ContentInfo* message) {
    if (OBJ_obj2nid(CMS_get0_type(message)) != NID_pkcs7_signed)
        return false;
    const STACK_OF(CMS_SignerInfo)* signers = CMS_get0_SignerInfos(message);
    return !signers || sk_CMS_SignerInfo_num(signers) == 0;
}

// Whether these octets are the certificate's DER encoding. The library reads lengths of BER too (X.690 8.1.3), which
// DER does not have, and keeps the octets of what is signed, which are therefore encoded afresh.
bool isEncodedAs(X509* x509, const std::uint8_t* bytes, std::size_t length) {
    unsigned char* encoding = nullptr;
    const int encodedLength = i2d_re_X509_tbs(x509, nullptr) < 0 ? -1 : i2d_X509(x509, &encoding);
    const bool isSame = encodedLength >= 0 && static_cast<std::size_t>(encodedLength) == length &&
                        std::equal(bytes, bytes + length, encoding);
    OPENSSL_free(encoding);
    return isSame;
}

} // namespace

std::optional<std::vector<CertificateRef>> copyCertificatesFromCertsOnlyMessage(const Value::Data& message) {
    const openssl::QuietErrors quiet;
    const Owner<CMS_ContentInfo, CMS_ContentInfo_free> content(
        decodeWhole(d2i_CMS_ContentInfo, CMS_ContentInfo_free, message.data(), message.size()));
    if (!content || !isCertsOnly(content.get()))
        return std::nullopt;
    const std::unique_ptr<STACK_OF(X509), FreeCertificates> found(CMS_get1_certs(content.get()));
    std::vector<CertificateRef> certificates;
    while (found && sk_X509_num(found.get()) > 0)
        certificates.push_back(wrap(Owner<X509, X509_free>(sk_X509_shift(found.get()))));
    return certificates;
}

CertificateRef createCertificateWithBytes(const std::uint8_t* bytes, std::size_t length) {
    const openssl::QuietErrors quiet;
    Owner<X509, X509_free> x509(decodeWhole(d2i_X509, X509_free, bytes, length));
    return x509 && isEncodedAs(x509.get(), bytes, length) ? wrap(std::move(x509)) : nullptr;
}

std::optional<Value::Data> copySerialNumberData(const CertificateRef& certificate, std::optional<Error>* error) {
    const openssl::QuietErrors quiet;
    unsigned char* encoding = nullptr;
    // The library reads only minimal INTEGERs (X.690 8.3.2), so that writing one gives the octets that were read.
    const int length = certificate ? i2d_ASN1_INTEGER(X509_get0_serialNumber(certificate->x509.get()), &encoding) : -1;
    if (length < 0) {
        if (error)
            *error = Error{"CertificateServiceErrorDomain", 1, "There is no serial number to read"};
        return std::nullopt;
    }
    const unsigned char* content = encoding;
    long contentLength = 0;
    int tag = 0;
    int tagClass = 0;
    ASN1_get_object(&content, &contentLength, &tag, &tagClass, length);
    Value::Data octets(content, content + contentLength);
    OPENSSL_free(encoding);
    return octets;
}

} // namespace CertificateService
