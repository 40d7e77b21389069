#include "tools/orloctl/CertificateText.h"

#include <memory>

#include <openssl/ec.h>
#include <openssl/evp.h>
#include <openssl/objects.h>
#include <openssl/x509.h>

#include "der/DERDecode.h"
#include "platform/Crypto.h"
#include "tools/orloctl/DerText.h"
#include "tools/orloctl/Findings.h"

namespace {

template <auto Free>
struct Release {
    void operator()(auto* object) const { Free(object); }
};
template <class Object, auto Free>
using Owner = std::unique_ptr<Object, Release<Free>>;

// What OpenSSL's reader makes of the SEQUENCE with that content; null when it cannot read it.
template <class Object>
Object* parsed(const DERItem& content, Object* (*read)(Object**, const unsigned char**, long)) {
    const auto encoding = derEncoding(DERTagSequence, content);
    const std::uint8_t* place = encoding.data();
    return read(nullptr, &place, static_cast<long>(encoding.size()));
}

using Key = Owner<EVP_PKEY, EVP_PKEY_free>;

std::string ecText(const EVP_PKEY* key, const DERItem& point) {
    char name[80] = "";
    if (EVP_PKEY_get_group_name(key, name, sizeof name, nullptr) != 1)
        return "EC without a named curve";
    const char* const standard = EC_curve_nid2nist(OBJ_txt2nid(name));
    const bool isUncompressed = point.length > 1 && point.data[1] == POINT_CONVERSION_UNCOMPRESSED;
    return std::string("EC ") + (standard ? standard : name) +
           (isUncompressed ? "" : ", with a point that is not in uncompressed form");
}

// The fields of a SEQUENCE that has them.
template <class Fields>
bool read(const DERItem& content, std::uint16_t count, const DERItemSpec* specs, Fields* fields) {
    return DERParseSequenceContent(&content, count, specs, fields, sizeof *fields) == DERSuccess;
}

// The number's digits, without the octet that keeps it positive.
std::string serialText(const DERItem& number) {
    const std::uint64_t unneeded = number.length > 1 && number.data[0] == 0 ? 1 : 0;
    return hexText({number.data + unneeded, number.length - unneeded});
}

} // namespace

std::optional<Certificate> readCertificate(const DERItem& encoding) {
    Certificate certificate;
    if (DERParseSequence(&encoding, DERNumSignedCertCrlItemSpecs, DERSignedCertCrlItemSpecs, &certificate.fields,
                         sizeof certificate.fields) != DERSuccess ||
        DERParseSequence(&certificate.fields.tbs, DERNumTBSCertItemSpecs, DERTBSCertItemSpecs, &certificate.tbs,
                         sizeof certificate.tbs) != DERSuccess)
        return std::nullopt;
    return certificate;
}

std::string nameText(const DERItem& name) {
    const Owner<X509_NAME, X509_NAME_free> read(parsed(name, d2i_X509_NAME));
    const Owner<BIO, BIO_free> out(BIO_new(BIO_s_mem()));
    if (!read || !out || X509_NAME_print_ex(out.get(), read.get(), 0, XN_FLAG_RFC2253) < 0)
        return "#" + hexText(name);
    char* text = nullptr;
    const auto length = static_cast<std::size_t>(BIO_get_mem_data(out.get(), &text));
    return {text, length};
}

std::string keyText(const DERItem& subjectPublicKeyInfo) {
    DERSubjPubKeyInfo info;
    DERAlgorithmId algorithm;
    if (!read(subjectPublicKeyInfo, DERNumSubjPubKeyInfoItemSpecs, DERSubjPubKeyInfoItemSpecs, &info) ||
        !read(info.algorithm, DERNumAlgorithmIdItemSpecs, DERAlgorithmIdItemSpecs, &algorithm))
        return "malformed #" + hexText(subjectPublicKeyInfo);
    const std::string name = algorithmName(algorithm.algorithm);
    const Key key(parsed(subjectPublicKeyInfo, d2i_PUBKEY));
    if (!key)
        return name + " #" + hexText(info.publicKey);
    if (EVP_PKEY_is_a(key.get(), "EC"))
        return ecText(key.get(), info.publicKey);
    if (!EVP_PKEY_is_a(key.get(), "RSA"))
        return name;
    const bool isPlain = algorithm.parameters.length == 0 || hexText(algorithm.parameters) == "0500"; // NULL
    return "RSA " + std::to_string(EVP_PKEY_get_bits(key.get())) + " bits" + (isPlain ? "" : " with parameters");
}

bool isKey(const DERItem& subjectPublicKeyInfo) {
    return Key(parsed(subjectPublicKeyInfo, d2i_PUBKEY)) != nullptr;
}

std::string algorithmName(const DERItem& oid) {
    const std::string name = oidText(oid, true);
    return name.empty() ? "malformed " + hexText(oid) : name;
}

std::string algorithmText(const DERItem& identifier) {
    DERAlgorithmId algorithm;
    return read(identifier, DERNumAlgorithmIdItemSpecs, DERAlgorithmIdItemSpecs, &algorithm)
               ? algorithmName(algorithm.algorithm)
               : "malformed " + hexText(identifier);
}

nlohmann::ordered_json certificateJson(const DERItem& encoding) {
    const auto certificate = readCertificate(encoding);
    if (!certificate)
        return {{"fault", "is no certificate"}};
    return {{"subject", nameText(certificate->tbs.subject)},
            {"issuer", nameText(certificate->tbs.issuer)},
            {"key", keyText(certificate->tbs.subjectPublicKeyInfo)},
            {"signatureAlgorithm", algorithmText(certificate->fields.signatureAlgorithm)},
            {"serialNumber", serialText(certificate->tbs.serialNumber)},
            {"sha256", digestText(encoding, crypto::sha256Size)}};
}
