#include "tools/orloctl/CertificateText.h"

#include <algorithm>
#include <bit>
#include <vector>

#include "der/DERDecode.h"
#include "platform/Crypto.h"
#include "tools/orloctl/DerText.h"
#include "tools/orloctl/Img4Findings.h"

namespace {

using nlohmann::ordered_json;

constexpr std::uint64_t mostOctetsOfValue = 256;

struct Named {
    const char* oid;
    const char* name;
};

// RFC 4514 3.
constexpr Named attributeTypes[] = {
    {"2.5.4.3", "CN"},
    {"2.5.4.6", "C"},
    {"2.5.4.7", "L"},
    {"2.5.4.8", "ST"},
    {"2.5.4.9", "STREET"},
    {"2.5.4.10", "O"},
    {"2.5.4.11", "OU"},
    {"0.9.2342.19200300.100.1.1", "UID"},
    {"0.9.2342.19200300.100.1.25", "DC"},
};

// RFC 8017 A.2.4, RFC 5758 3.2.
constexpr Named signatureAlgorithms[] = {
    {"1.2.840.113549.1.1.4", "md5WithRSAEncryption"},
    {"1.2.840.113549.1.1.5", "sha1WithRSAEncryption"},
    {"1.2.840.113549.1.1.10", "rsassaPss"},
    {"1.2.840.113549.1.1.11", "sha256WithRSAEncryption"},
    {"1.2.840.113549.1.1.12", "sha384WithRSAEncryption"},
    {"1.2.840.113549.1.1.13", "sha512WithRSAEncryption"},
    {"1.2.840.10045.4.1", "ecdsa-with-SHA1"},
    {"1.2.840.10045.4.3.2", "ecdsa-with-SHA256"},
    {"1.2.840.10045.4.3.3", "ecdsa-with-SHA384"},
    {"1.2.840.10045.4.3.4", "ecdsa-with-SHA512"},
};

constexpr const char* rsaKey = "1.2.840.113549.1.1.1";
constexpr const char* ecKey = "1.2.840.10045.2.1";

struct Curve {
    const char* oid;
    const char* name;
    std::uint64_t pointLength; // octets of the uncompressed form
};

// RFC 5480 2.1.1.1.
constexpr Curve curves[] = {
    {"1.2.840.10045.3.1.7", "P-256", 65},
    {"1.3.132.0.34", "P-384", 97},
    {"1.3.132.0.35", "P-521", 133},
};

// The row for an object identifier; null when there is none.
template <typename Row, std::size_t count>
const Row* find(const Row (&table)[count], const std::string& oid) {
    const Row* row = std::find_if(std::begin(table), std::end(table), [&](const Row& each) { return oid == each.oid; });
    return row == std::end(table) ? nullptr : row;
}

std::string upperCase(std::string text) {
    for (char& character : text)
        if (character >= 'a' && character <= 'f')
            character = static_cast<char>(character - 'a' + 'A');
    return text;
}

bool isPrintable(std::uint8_t octet) {
    return octet >= 0x20 && octet <= 0x7E;
}

// RFC 4514 2.4.
std::string escapedValue(const DERItem& text, std::uint64_t most) {
    std::string escaped;
    const std::uint64_t shown = std::min(text.length, most);
    for (std::uint64_t i = 0; i < shown; ++i) {
        const std::uint8_t octet = text.data[i];
        const bool isEdge = (octet == ' ' && (i == 0 || i + 1 == text.length)) || (octet == '#' && i == 0);
        if (!isPrintable(octet))
            escaped += "\\" + upperCase(hexText({text.data + i, 1}, 1));
        else if (isEdge || std::string_view("\"+,;<>\\").find(static_cast<char>(octet)) != std::string_view::npos)
            escaped += {'\\', static_cast<char>(octet)};
        else
            escaped += static_cast<char>(octet);
    }
    return escaped + (text.length > shown ? "..." : "");
}

// Numbers with dots. An identifier that breaks a rule is no other identifier's equal.
std::string numbersOf(const DERItem& oid) {
    return derContentFault(DERTagObjectIdentifier, oid) ? "malformed " + hexText(oid, mostOctetsOfValue) : oidText(oid);
}

bool isText(DERTag tag) {
    constexpr DERTag texts[] = {12, 18, 19, 20, DERTagIA5String, 26};
    return std::find(std::begin(texts), std::end(texts), tag) != std::end(texts);
}

std::string attributeText(const DERAttributeTypeAndValue& attribute, std::uint64_t most) {
    const std::string oid = numbersOf(attribute.type);
    const Named* type = find(attributeTypes, oid);
    DERDecodedInfo value;
    if (type != nullptr && DERDecodeItem(&attribute.value, &value) == DERSuccess && isText(value.tag))
        return std::string(type->name) + "=" + escapedValue(value.content, most);
    return (type != nullptr ? type->name : oid) + "=#" + upperCase(hexText(attribute.value, most));
}

// One RelativeDistinguishedName; nothing when it is malformed. No more is read when it has become longer than
// `longest`.
std::optional<std::string> attributesText(const DERDecodedInfo& relativeName, std::size_t longest) {
    std::string text;
    DERSequence rest;
    DERDecodedInfo element;
    if (relativeName.tag != DERTagSet)
        return std::nullopt;
    DERDecodeSeqContentInit(&relativeName.content, &rest);
    while (rest.next != rest.end && text.size() <= longest) {
        DERAttributeTypeAndValue attribute;
        if (DERDecodeSeqNext(&rest, &element) != DERSuccess || element.tag != DERTagSequence ||
            DERParseSequenceContent(&element.content, DERNumAttributeTypeAndValueItemSpecs,
                                    DERAttributeTypeAndValueItemSpecs, &attribute, sizeof attribute) != DERSuccess)
            return std::nullopt;
        text += (text.empty() ? "" : "+") + attributeText(attribute, longest / 2);
    }
    return text;
}

struct Key {
    DERAlgorithmId algorithm;
    DERItem bits;
};

std::optional<Key> readKey(const DERItem& subjectPublicKeyInfo) {
    DERSubjPubKeyInfo info;
    Key key;
    std::uint8_t unusedBits = 0;
    if (DERParseSequenceContent(&subjectPublicKeyInfo, DERNumSubjPubKeyInfoItemSpecs, DERSubjPubKeyInfoItemSpecs, &info,
                                sizeof info) != DERSuccess ||
        DERParseSequenceContent(&info.algorithm, DERNumAlgorithmIdItemSpecs, DERAlgorithmIdItemSpecs, &key.algorithm,
                                sizeof key.algorithm) != DERSuccess ||
        DERParseBitString(&info.publicKey, &key.bits, &unusedBits) != DERSuccess || unusedBits != 0)
        return std::nullopt;
    return key;
}

std::optional<std::size_t> modulusBits(const Key& key) {
    DERRSAPubKeyPKCS1 numbers;
    if (DERParseSequence(&key.bits, DERNumRSAPubKeyPKCS1ItemSpecs, DERRSAPubKeyPKCS1ItemSpecs, &numbers,
                         sizeof numbers) != DERSuccess)
        return std::nullopt;
    DERItem modulus = numbers.modulus;
    while (modulus.length != 0 && modulus.data[0] == 0)
        modulus = {modulus.data + 1, modulus.length - 1};
    if (modulus.length == 0)
        return 0;
    return static_cast<std::size_t>(modulus.length - 1) * 8 + static_cast<std::size_t>(std::bit_width(modulus.data[0]));
}

bool isPositive(const DERItem& number) {
    return number.length != 0 && (number.data[0] & 0x80) == 0;
}

bool isOdd(const DERItem& number) {
    return (number.data[number.length - 1] & 1) != 0;
}

// RFC 8017 3.1.
std::string rsaFault(const Key& key) {
    DERRSAPubKeyPKCS1 numbers;
    if (DERParseSequence(&key.bits, DERNumRSAPubKeyPKCS1ItemSpecs, DERRSAPubKeyPKCS1ItemSpecs, &numbers,
                         sizeof numbers) != DERSuccess)
        return "is no RSAPublicKey";
    const DERItem &modulus = numbers.modulus, &exponent = numbers.publicExponent;
    if (!isPositive(modulus) || !isPositive(exponent))
        return "has a number that is not positive";
    if (!isOdd(modulus))
        return "has an even modulus";
    const bool isOne = exponent.length == 1 && exponent.data[0] == 1;
    return !isOdd(exponent) || isOne || exponent.length > modulus.length ? "has an unsound exponent" : "";
}

// Whether the key is a point of the curve that its length stands for.
bool isPoint(const Key& key) {
    const crypto::Bytes point = {key.bits.data, static_cast<std::size_t>(key.bits.length)};
    return crypto::isPublicKey(crypto::Curve::P256, point) || crypto::isPublicKey(crypto::Curve::P384, point);
}

std::string rsaText(const Key& key) {
    constexpr std::uint8_t null[] = {0x05, 0x00};
    const DERItem& parameters = key.algorithm.parameters;
    const auto bits = modulusBits(key);
    const bool isPlain = parameters.data == nullptr || std::equal(std::begin(null), std::end(null), parameters.data,
                                                                  parameters.data + parameters.length);
    return "RSA" + (bits ? " " + std::to_string(*bits) + " bits" : ", malformed") + (isPlain ? "" : " with parameters");
}

std::string ecText(const Key& key) {
    constexpr std::uint8_t uncompressed = 0x04;
    DERDecodedInfo parameters;
    if (DERDecodeItem(&key.algorithm.parameters, &parameters) != DERSuccess || parameters.tag != DERTagObjectIdentifier)
        return "EC without a named curve";
    const std::string oid = numbersOf(parameters.content);
    const Curve* curve = find(curves, oid);
    if (curve == nullptr)
        return "EC on curve " + oid;
    const bool isPoint = key.bits.length == curve->pointLength && key.bits.data[0] == uncompressed;
    return std::string("EC ") + curve->name +
           (isPoint ? "" : ", with " + std::to_string(key.bits.length) + " octets that are no uncompressed point");
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
    std::vector<std::string> parts;
    std::size_t size = 0;
    DERSequence rest;
    DERDecodedInfo relativeName;
    DERDecodeSeqContentInit(&name, &rest);
    while (rest.next != rest.end && size <= longest) {
        auto attributes =
            DERDecodeSeqNext(&rest, &relativeName) == DERSuccess ? attributesText(relativeName, longest) : std::nullopt;
        if (!attributes)
            return "#" + upperCase(hexText(name, longest / 2));
        size += attributes->size() + 1;
        parts.push_back(std::move(*attributes));
    }
    // RFC 4514 2.1: the last one comes first.
    std::string text;
    for (auto part = parts.rbegin(); part != parts.rend(); ++part)
        text += (text.empty() ? "" : ",") + *part;
    return shortened(text, longest);
}

std::string keyText(const DERItem& subjectPublicKeyInfo) {
    const auto key = readKey(subjectPublicKeyInfo);
    if (!key)
        return "malformed";
    const std::string oid = numbersOf(key->algorithm.algorithm);
    if (oid == rsaKey)
        return rsaText(*key);
    return oid == ecKey ? ecText(*key) : oid;
}

std::optional<std::size_t> rsaBits(const DERItem& subjectPublicKeyInfo) {
    const auto key = readKey(subjectPublicKeyInfo);
    return key && numbersOf(key->algorithm.algorithm) == rsaKey ? modulusBits(*key) : std::nullopt;
}

std::string keyFault(const DERItem& subjectPublicKeyInfo) {
    const auto key = readKey(subjectPublicKeyInfo);
    if (!key)
        return "is malformed";
    const std::string kind = numbersOf(key->algorithm.algorithm);
    if (kind == rsaKey)
        return rsaFault(*key);
    return kind == ecKey && !isPoint(*key) ? "is no uncompressed point of its curve" : "";
}

std::string algorithmName(const DERItem& oid) {
    const std::string numbers = numbersOf(oid);
    const Named* algorithm = find(signatureAlgorithms, numbers);
    return algorithm != nullptr ? algorithm->name : numbers;
}

std::string algorithmText(const DERItem& identifier) {
    DERAlgorithmId algorithm;
    return DERParseSequenceContent(&identifier, DERNumAlgorithmIdItemSpecs, DERAlgorithmIdItemSpecs, &algorithm,
                                   sizeof algorithm) == DERSuccess
               ? algorithmName(algorithm.algorithm)
               : "malformed";
}

ordered_json certificateJson(const DERItem& encoding) {
    const auto certificate = readCertificate(encoding);
    if (!certificate)
        return {{"fault", "is no certificate"}};
    return {{"subject", nameText(certificate->tbs.subject, SIZE_MAX)},
            {"issuer", nameText(certificate->tbs.issuer, SIZE_MAX)},
            {"key", keyText(certificate->tbs.subjectPublicKeyInfo)},
            {"signatureAlgorithm", algorithmText(certificate->fields.signatureAlgorithm)},
            {"serialNumber", serialText(certificate->tbs.serialNumber)},
            {"sha256", img4show::sha256Text(encoding)}};
}
