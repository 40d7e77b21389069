#include "tools/orloctl/CertificateText.h"

#include <algorithm>
#include <memory>

#include <openssl/ec.h>
#include <openssl/evp.h>
#include <openssl/objects.h>
#include <openssl/x509.h>

#include "der/DERDecode.h"
#include "tools/orloctl/DerText.h"
#include "tools/orloctl/Img4Findings.h"

namespace {

using nlohmann::ordered_json;

constexpr std::uint64_t mostOctets = 256;
constexpr const char* rsaKey = "rsaEncryption";
constexpr const char* ecKey = "id-ecPublicKey";

struct Key {
    std::string algorithm;
    DERItem parameters;
    DERItem bits;
    std::unique_ptr<EVP_PKEY, decltype(&EVP_PKEY_free)> parsed; // null when OpenSSL cannot read it

    bool isUncompressedPoint() const {
        return parsed && bits.length != 0 && bits.data[0] == POINT_CONVERSION_UNCOMPRESSED;
    }
};

std::optional<Key> readKey(const DERItem& subjectPublicKeyInfo) {
    DERSubjPubKeyInfo info;
    DERAlgorithmId algorithm;
    DERItem bits;
    std::uint8_t unusedBits = 0;
    if (DERParseSequenceContent(&subjectPublicKeyInfo, DERNumSubjPubKeyInfoItemSpecs, DERSubjPubKeyInfoItemSpecs, &info,
                                sizeof info) != DERSuccess ||
        DERParseSequenceContent(&info.algorithm, DERNumAlgorithmIdItemSpecs, DERAlgorithmIdItemSpecs, &algorithm,
                                sizeof algorithm) != DERSuccess ||
        DERParseBitString(&info.publicKey, &bits, &unusedBits) != DERSuccess || unusedBits != 0)
        return std::nullopt;
    const auto encoding = derEncoding(DERTagSequence, subjectPublicKeyInfo);
    const std::uint8_t* place = encoding.data();
    return Key{algorithmName(algorithm.algorithm),
               algorithm.parameters,
               bits,
               {d2i_PUBKEY(nullptr, &place, static_cast<long>(encoding.size())), EVP_PKEY_free}};
}

bool isPositive(const DERItem& number) {
    return number.length != 0 && (number.data[0] & 0x80) == 0;
}

bool isOdd(const DERItem& number) {
    return (number.data[number.length - 1] & 1) != 0;
}

// RFC 8017 3.1.
std::string rsaFault(const DERItem& bits) {
    DERRSAPubKeyPKCS1 numbers;
    if (DERParseSequence(&bits, DERNumRSAPubKeyPKCS1ItemSpecs, DERRSAPubKeyPKCS1ItemSpecs, &numbers, sizeof numbers) !=
        DERSuccess)
        return "is no RSAPublicKey";
    const DERItem &modulus = numbers.modulus, &exponent = numbers.publicExponent;
    if (!isPositive(modulus) || !isPositive(exponent))
        return "has a number that is not positive";
    if (!isOdd(modulus))
        return "has an even modulus";
    const bool isOne = exponent.length == 1 && exponent.data[0] == 1;
    return !isOdd(exponent) || isOne || exponent.length > modulus.length ? "has an unsound exponent" : "";
}

std::string rsaText(const Key& key) {
    constexpr std::uint8_t null[] = {0x05, 0x00};
    const bool isPlain =
        key.parameters.data == nullptr ||
        std::equal(std::begin(null), std::end(null), key.parameters.data, key.parameters.data + key.parameters.length);
    return "RSA " + std::to_string(EVP_PKEY_get_bits(key.parsed.get())) + " bits" + (isPlain ? "" : " with parameters");
}

std::string ecText(const Key& key) {
    char name[80] = "";
    if (EVP_PKEY_get_group_name(key.parsed.get(), name, sizeof name, nullptr) != 1)
        return "EC without a named curve";
    const char* const standard = EC_curve_nid2nist(OBJ_txt2nid(name));
    return std::string("EC ") + (standard ? standard : name) +
           (key.isUncompressedPoint() ? "" : ", with a point that is not in uncompressed form");
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
    const auto key = readKey(subjectPublicKeyInfo);
    if (!key)
        return "malformed #" + hexText(subjectPublicKeyInfo, most);
    if (!key->parsed)
        return key->algorithm + " #" + hexText(key->bits, most);
    return key->algorithm == rsaKey ? rsaText(*key) : key->algorithm == ecKey ? ecText(*key) : key->algorithm;
}

std::optional<std::size_t> rsaBits(const DERItem& subjectPublicKeyInfo) {
    const auto key = readKey(subjectPublicKeyInfo);
    return key && key->parsed && key->algorithm == rsaKey ? std::optional(EVP_PKEY_get_bits(key->parsed.get()))
                                                          : std::nullopt;
}

std::string keyFault(const DERItem& subjectPublicKeyInfo) {
    const auto key = readKey(subjectPublicKeyInfo);
    if (!key)
        return "is malformed";
    if (key->algorithm == rsaKey)
        return rsaFault(key->bits);
    return key->algorithm == ecKey && !key->isUncompressedPoint() ? "is no uncompressed point of its curve" : "";
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

ordered_json certificateJson(const DERItem& encoding) {
    const auto certificate = readCertificate(encoding);
    if (!certificate)
        return {{"fault", "is no certificate"}};
    return {{"subject", nameText(certificate->tbs.subject, SIZE_MAX)},
            {"issuer", nameText(certificate->tbs.issuer, SIZE_MAX)},
            {"key", keyText(certificate->tbs.subjectPublicKeyInfo, UINT64_MAX)},
            {"signatureAlgorithm", algorithmText(certificate->fields.signatureAlgorithm)},
            {"serialNumber", serialText(certificate->tbs.serialNumber)},
            {"sha256", img4show::sha256Text(encoding)}};
}
