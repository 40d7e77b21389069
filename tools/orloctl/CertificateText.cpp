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

constexpr std::uint64_t mostOctets = 256;

using KeyPtr = std::unique_ptr<EVP_PKEY, decltype(&EVP_PKEY_free)>;

// Null when OpenSSL cannot read it.
KeyPtr parsedKey(const DERItem& subjectPublicKeyInfo) {
    const auto encoding = derEncoding(DERTagSequence, subjectPublicKeyInfo);
    const std::uint8_t* place = encoding.data();
    return {d2i_PUBKEY(nullptr, &place, static_cast<long>(encoding.size())), EVP_PKEY_free};
}

std::string ecText(const EVP_PKEY* key, const DERItem& point) {
    char name[80] = "";
    if (EVP_PKEY_get_group_name(key, name, sizeof name, nullptr) != 1)
        return "EC without a named curve";
    const char* const standard = EC_curve_nid2nist(OBJ_txt2nid(name));
    const bool isUncompressed = point.length > 1 && point.data[1] == POINT_CONVERSION_UNCOMPRESSED;
    return std::string("EC ") + (standard ? standard : name) +
           (isUncompressed ? "" : ", with a point that is not in uncompressed form");
}

// The number's digits, without the octet that keeps it positive.
std::string serialText(DERItem serialNumber) {
    if (serialNumber.length > 1 && serialNumber.data[0] == 0)
        serialNumber = {serialNumber.data + 1, serialNumber.length - 1};
    return hexText(serialNumber);
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

std::string nameText(const DERItem& name, std::size_t longest) {
    const auto encoding = derEncoding(DERTagSequence, name);
    const std::uint8_t* place = encoding.data();
    const std::unique_ptr<X509_NAME, decltype(&X509_NAME_free)> parsed(
        d2i_X509_NAME(nullptr, &place, static_cast<long>(encoding.size())), X509_NAME_free);
    const std::unique_ptr<BIO, decltype(&BIO_free)> out(BIO_new(BIO_s_mem()), BIO_free);
    if (!parsed || !out || X509_NAME_print_ex(out.get(), parsed.get(), 0, XN_FLAG_RFC2253) < 0)
        return shortened("#" + hexText(name), longest);
    char* text = nullptr;
    const auto length = static_cast<std::size_t>(BIO_get_mem_data(out.get(), &text));
    return shortened(std::string(text, length), longest);
}

std::string keyText(const DERItem& subjectPublicKeyInfo, std::uint64_t most) {
    DERSubjPubKeyInfo info;
    DERAlgorithmId algorithm;
    if (DERParseSequenceContent(&subjectPublicKeyInfo, DERNumSubjPubKeyInfoItemSpecs, DERSubjPubKeyInfoItemSpecs, &info,
                                sizeof info) != DERSuccess ||
        DERParseSequenceContent(&info.algorithm, DERNumAlgorithmIdItemSpecs, DERAlgorithmIdItemSpecs, &algorithm,
                                sizeof algorithm) != DERSuccess)
        return "malformed #" + hexText(subjectPublicKeyInfo, most);
    const std::string name = algorithmName(algorithm.algorithm);
    const KeyPtr key = parsedKey(subjectPublicKeyInfo);
    if (!key)
        return name + " #" + hexText(info.publicKey, most);
    if (EVP_PKEY_is_a(key.get(), "EC"))
        return ecText(key.get(), info.publicKey);
    if (!EVP_PKEY_is_a(key.get(), "RSA"))
        return name;
    const bool isPlain = algorithm.parameters.length == 0 || hexText(algorithm.parameters) == "0500"; // NULL
    return "RSA " + std::to_string(EVP_PKEY_get_bits(key.get())) + " bits" + (isPlain ? "" : " with parameters");
}

bool isKey(const DERItem& subjectPublicKeyInfo) {
    return parsedKey(subjectPublicKeyInfo) != nullptr;
}

std::string algorithmName(const DERItem& oid) {
    const std::string name = oidText(oid, true);
    return name.empty() ? "malformed " + hexText(oid, mostOctets) : name;
}

std::string algorithmText(const DERItem& identifier) {
    DERAlgorithmId algorithm;
    return DERParseSequenceContent(&identifier, DERNumAlgorithmIdItemSpecs, DERAlgorithmIdItemSpecs, &algorithm,
                                   sizeof algorithm) == DERSuccess
               ? algorithmName(algorithm.algorithm)
               : "malformed " + hexText(identifier, mostOctets);
}

nlohmann::ordered_json certificateJson(const DERItem& encoding) {
    const auto certificate = readCertificate(encoding);
    if (!certificate)
        return {{"fault", "is no certificate"}};
    return {{"subject", nameText(certificate->tbs.subject, SIZE_MAX)},
            {"issuer", nameText(certificate->tbs.issuer, SIZE_MAX)},
            {"key", keyText(certificate->tbs.subjectPublicKeyInfo, UINT64_MAX)},
            {"signatureAlgorithm", algorithmText(certificate->fields.signatureAlgorithm)},
            {"serialNumber", serialText(certificate->tbs.serialNumber)},
            {"sha256", digestText(encoding, crypto::sha256Size)}};
}
