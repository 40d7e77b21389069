#include "der/DERItemSpecs.h"
#include "img4/Img4TrustInternal.h"

#include <bit>
#include <cstddef>
#include <cstring>

using namespace img4;

namespace {

constexpr std::size_t leastModulusBits = 1024;
constexpr std::size_t mostModulusBits = 4096;
constexpr std::size_t mostModulusBits3k = 3072;

struct RSAKey {
    crypto::Bytes modulus;
    crypto::Bytes exponent;
};

// The octets of a number that is not negative, without leading zeros; none for zero.
bool parseNumber(DERItem integer, crypto::Bytes* number) {
    if (!hasContent(integer) || (integer.data[0] & 0x80) != 0)
        return false;
    while (integer.length != 0 && integer.data[0] == 0)
        integer = {integer.data + 1, integer.length - 1};
    *number = bytesOf(integer);
    return true;
}

bool parseRSAKey(const DERItem& encoding, RSAKey* key) {
    DERItem content;
    DERRSAPubKeyPKCS1 fields;
    return isWholeItem(encoding, DERTagSequence, &content) &&
           parseContent(content, {DERRSAPubKeyPKCS1ItemSpecs, DERNumRSAPubKeyPKCS1ItemSpecs}, &fields) == DERSuccess &&
           parseNumber(fields.modulus, &key->modulus) && parseNumber(fields.publicExponent, &key->exponent);
}

std::size_t bitsOf(const crypto::Bytes& number) {
    if (number.length == 0)
        return 0;
    return (number.length - 1) * 8 + static_cast<std::size_t>(std::bit_width(number.data[0]));
}

bool isOdd(const crypto::Bytes& number) {
    return number.length != 0 && (number.data[number.length - 1] & 1) != 0;
}

bool isLess(const crypto::Bytes& one, const crypto::Bytes& other) {
    if (one.length != other.length)
        return one.length < other.length;
    return std::memcmp(one.data, other.data, one.length) < 0;
}

// RFC 8017 3.1: the modulus is a product of odd primes, and the exponent lies between 3 and the modulus and is odd.
// With the exponent 1 anyone could sign.
bool hasSoundNumbers(const RSAKey& key) {
    return isOdd(key.modulus) && isOdd(key.exponent) && bitsOf(key.exponent) > 1 && isLess(key.exponent, key.modulus);
}

DERReturn refuseSignature(Img4SignatureRefusal* refusal, Img4SignatureFault fault, uint64_t found = 0,
                          uint64_t least = 0, uint64_t most = 0) {
    if (refusal != nullptr)
        *refusal = {fault, found, least, most};
    return Img4Failure;
}

bool arePresent(const DERItem* key, const DERItem* signature, const uint8_t* digest) {
    return key != nullptr && hasContent(*key) && signature != nullptr && hasContent(*signature) && digest != nullptr;
}

DERReturn verifyRSA(std::size_t mostBits, const DERItem* keyItem, const DERItem* signature, const uint8_t* digest,
                    uint64_t length, const Img4TrustProfile* profile, Img4SignatureRefusal* refusal) {
    const Img4DigestImplementation* implementation = digestOf(profile, length);
    RSAKey key;
    if (implementation == nullptr || !arePresent(keyItem, signature, digest))
        return refuseSignature(refusal, Img4SignatureArguments);
    if (!parseRSAKey(*keyItem, &key))
        return refuseSignature(refusal, Img4SignatureKey);
    if (const std::size_t bits = bitsOf(key.modulus); bits < leastModulusBits || bits > mostBits)
        return refuseSignature(refusal, Img4SignatureKeySize, bits, leastModulusBits, mostBits);
    if (!hasSoundNumbers(key))
        return refuseSignature(refusal, Img4SignatureKeyNumbers);
    if (signature->length != key.modulus.length)
        return refuseSignature(refusal, Img4SignatureLength, signature->length, key.modulus.length, key.modulus.length);
    const crypto::Bytes hash = {digest, static_cast<std::size_t>(length)};
    return crypto::verifyRSASignature(implementation->algorithm, hash, key.modulus, key.exponent, bytesOf(*signature))
               ? DERSuccess
               : refuseSignature(refusal, Img4SignatureMismatch);
}

// A positive INTEGER in its shortest form (X.690 8.3.2) of at most `mostOctets` octets.
bool isPositive(const DERItem& integer, uint64_t mostOctets) {
    if (!hasContent(integer) || (integer.data[0] & 0x80) != 0)
        return false;
    if (integer.data[0] != 0)
        return integer.length <= mostOctets;
    return integer.length > 1 && (integer.data[1] & 0x80) != 0 && integer.length <= mostOctets + 1;
}

bool isECDSASignature(const DERItem& encoding, const NamedCurve& curve) {
    struct Numbers {
        DERItem r;
        DERItem s;
    };
    const DERItemSpec specs[] = {{offsetof(Numbers, r), DERTagInteger, 0}, {offsetof(Numbers, s), DERTagInteger, 0}};
    DERItem content;
    Numbers numbers;
    return isWholeItem(encoding, DERTagSequence, &content) && parseContent(content, specs, &numbers) == DERSuccess &&
           isPositive(numbers.r, curve.coordinateLength) && isPositive(numbers.s, curve.coordinateLength);
}

constexpr NamedCurve curves[] = {
    {&oidEcPrime256v1, crypto::Curve::P256, 32, 65},
    {&oidAnsip384r1, crypto::Curve::P384, 48, 97},
};

DERReturn verifyECDSA(const DERItem* key, const DERItem* signature, const uint8_t* digest, uint64_t length,
                      const Img4TrustProfile* profile, Img4SignatureRefusal* refusal) {
    if (digestOf(profile, length) == nullptr || profile->keyAlgorithmOid == nullptr ||
        !arePresent(key, signature, digest))
        return refuseSignature(refusal, Img4SignatureArguments);
    const NamedCurve* curve = curveOfPoint(key->length);
    if (curve == nullptr)
        return refuseSignature(refusal, Img4SignatureKey);
    if (!isECDSASignature(*signature, *curve))
        return refuseSignature(refusal, Img4SignatureForm);
    const crypto::Bytes hash = {digest, static_cast<std::size_t>(length)};
    return crypto::verifyECDSASignature(curve->curve, bytesOf(*key), hash, bytesOf(*signature))
               ? DERSuccess
               : refuseSignature(refusal, Img4SignatureMismatch);
}

} // namespace

const NamedCurve* img4::curveOfPoint(uint64_t length) {
    for (const NamedCurve& curve : curves)
        if (curve.pointLength == length)
            return &curve;
    return nullptr;
}

bool img4::isWholeItem(const DERItem& encoding, DERTag tag, DERItem* content) {
    DERDecodedInfo decoded;
    if (DERDecodeItem(&encoding, &decoded) != DERSuccess || decoded.tag != tag ||
        decoded.content.data + decoded.content.length != encoding.data + encoding.length)
        return false;
    *content = decoded.content;
    return true;
}

DERReturn verify_signature_rsa(const DERItem* key, const DERItem* signature, const uint8_t* digest, uint64_t length,
                               const Img4TrustProfile* profile) {
    return verifyRSA(mostModulusBits, key, signature, digest, length, profile, nullptr);
}

DERReturn verify_signature_rsa3k(const DERItem* key, const DERItem* signature, const uint8_t* digest, uint64_t length,
                                 const Img4TrustProfile* profile) {
    return verifyRSA(mostModulusBits3k, key, signature, digest, length, profile, nullptr);
}

DERReturn verify_signature_ecdsa(const DERItem* key, const DERItem* signature, const uint8_t* digest, uint64_t length,
                                 const Img4TrustProfile* profile) {
    return verifyECDSA(key, signature, digest, length, profile, nullptr);
}

DERReturn img4::verifySignatureOf(const Img4TrustProfile& profile, const DERItem& key, const DERItem& signature,
                                  const uint8_t* digest, Img4TrustRefusal* why) {
    const uint64_t length = profile.digestInfo->length;
    const auto verify = profile.verifySignature;
    Img4SignatureRefusal* const refusal = why != nullptr ? &why->signature : nullptr;
    if (verify == verify_signature_rsa || verify == verify_signature_rsa3k)
        return verifyRSA(verify == verify_signature_rsa ? mostModulusBits : mostModulusBits3k, &key, &signature, digest,
                         length, &profile, refusal);
    if (verify == verify_signature_ecdsa)
        return verifyECDSA(&key, &signature, digest, length, &profile, refusal);
    const DERReturn result = verify(&key, &signature, digest, length, &profile);
    if (result != DERSuccess)
        refuseSignature(refusal, Img4SignatureOther);
    return result;
}
