#include "tools/makers/CertificateMaker.h"

#include "tools/makers/OpenSSL.h"

#include <openssl/bio.h>
#include <openssl/cms.h>
#include <openssl/evp.h>
#include <openssl/pem.h>
#include <openssl/x509.h>
#include <openssl/x509v3.h>

namespace certificatemaker {

using namespace makers;

namespace {

using X509Owner = Owner<X509, X509_free>;
using Message = Owner<CMS_ContentInfo, CMS_ContentInfo_free>;
using Stream = Owner<BIO, BIO_free_all>;

EVP_PKEY* makeKey(KeyKind kind) {
    if (kind == KeyKind::RSA2048)
        return EVP_RSA_gen(2048);
    return kind == KeyKind::Ed25519 ? EVP_PKEY_Q_keygen(nullptr, nullptr, "ED25519") : EVP_EC_gen("P-256");
}

std::string pem(EVP_PKEY* key) {
    const Stream stream(require(BIO_new(BIO_s_mem())));
    require(PEM_write_bio_PrivateKey(stream.get(), key, nullptr, nullptr, 0, nullptr, nullptr));
    char* text = nullptr;
    const long length = BIO_get_mem_data(stream.get(), &text);
    return {text, static_cast<std::size_t>(length)};
}

X509Owner readCertificate(const Bytes& certificate) {
    const unsigned char* next = certificate.data();
    return X509Owner(require(d2i_X509(nullptr, &next, static_cast<long>(certificate.size()))));
}

void setSerialNumber(X509* certificate, const Bytes& content) {
    Bytes encoding = {0x02, static_cast<std::uint8_t>(content.size())};
    encoding.insert(encoding.end(), content.begin(), content.end());
    const unsigned char* next = encoding.data();
    const Owner<ASN1_INTEGER, ASN1_INTEGER_free> number(
        require(d2i_ASN1_INTEGER(nullptr, &next, static_cast<long>(encoding.size()))));
    require(X509_set_serialNumber(certificate, number.get()));
}

void addExtension(X509* certificate, int kind, const char* value) {
    const Owner<X509_EXTENSION, X509_EXTENSION_free> extension(
        require(X509V3_EXT_conf_nid(nullptr, nullptr, kind, value)));
    require(X509_add_ext(certificate, extension.get(), -1));
}

Bytes encode(const Message& message) {
    return makers::encode<CMS_ContentInfo>(message.get(), i2d_CMS_ContentInfo);
}

} // namespace

Module module(const Bytes& serialNumber, KeyKind kind) {
    const std::shared_ptr<EVP_PKEY> key(require(makeKey(kind)), EVP_PKEY_free);
    const X509Owner certificate(require(X509_new()));
    setSerialNumber(certificate.get(), serialNumber);
    X509_NAME* name = X509_get_subject_name(certificate.get());
    require(X509_NAME_add_entry_by_txt(name, "CN", MBSTRING_ASC, reinterpret_cast<const unsigned char*>("Module"), -1,
                                       -1, 0));
    require(X509_set_issuer_name(certificate.get(), name));
    X509_gmtime_adj(X509_getm_notBefore(certificate.get()), 0);
    X509_gmtime_adj(X509_getm_notAfter(certificate.get()), 3600);
    require(X509_set_version(certificate.get(), X509_VERSION_3));
    require(X509_set_pubkey(certificate.get(), key.get()));
    addExtension(certificate.get(), NID_key_usage, "critical,digitalSignature");
    addExtension(certificate.get(), NID_basic_constraints, "CA:FALSE");
    require(X509_sign(certificate.get(), key.get(), kind == KeyKind::Ed25519 ? nullptr : EVP_sha256()));
    return {pem(key.get()), makers::encode<X509>(certificate.get(), i2d_X509), key};
}

Bytes certsOnlyMessage(const std::vector<Bytes>& certificates) {
    STACK_OF(X509)* const list = require(sk_X509_new_null());
    for (const Bytes& certificate : certificates)
        sk_X509_push(list, readCertificate(certificate).release());
    const Message message(require(CMS_sign(nullptr, nullptr, list, nullptr, CMS_DETACHED | CMS_PARTIAL)));
    sk_X509_pop_free(list, X509_free);
    return encode(message);
}

Bytes signedMessage(const Module& signer) {
    const Stream content(require(BIO_new_mem_buf("content", 7)));
    const Message message(require(
        CMS_sign(readCertificate(signer.certificate).get(), signer.signer.get(), nullptr, content.get(), CMS_BINARY)));
    return encode(message);
}

Bytes dataMessage() {
    const Stream content(require(BIO_new_mem_buf("content", 7)));
    const Message message(require(CMS_data_create(content.get(), CMS_BINARY)));
    return encode(message);
}

} // namespace certificatemaker
