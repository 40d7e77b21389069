#include "tests/img4/TrustDomain.h"
#include "tests/support/MissingArguments.h"

#include <memory>

#include <gtest/gtest.h>
#include <openssl/bn.h>
#include <openssl/core_names.h>
#include <openssl/rsa.h>

namespace {

using namespace img4maker;
using namespace signedmanifest;

// Numbers without sign, as big-endian octets.

Bytes parameter(const Key& key, const char* name) {
    BIGNUM* value = nullptr;
    EXPECT_EQ(EVP_PKEY_get_bn_param(key.get(), name, &value), 1) << name;
    Bytes octets(static_cast<std::size_t>(BN_num_bytes(value)));
    BN_bn2bin(value, octets.data());
    BN_free(value);
    return octets;
}

// Of two numbers of the same length.
Bytes sum(Bytes one, const Bytes& other) {
    unsigned carry = 0;
    for (std::size_t i = one.size(); i-- > 0; carry >>= 8)
        one[i] = static_cast<std::uint8_t>(carry += one[i] + other.at(i));
    return join({Bytes(carry, 1), one});
}

// The INTEGER with these content octets, made non-negative or not.
Bytes rawInteger(const Bytes& content) {
    return item(DERTagInteger, content);
}

Bytes positiveInteger(Bytes magnitude) {
    if (magnitude.empty() || (magnitude.front() & 0x80) != 0)
        magnitude.insert(magnitude.begin(), 0);
    return rawInteger(magnitude);
}

const Bytes null = {0x05, 0x00};
const Bytes message = filler(100);

Bytes digestOfMessage(const Img4TrustProfile& profile) {
    Bytes digest(profile.digestInfo->length);
    const DERItem view = itemOf(message);
    EXPECT_EQ(Img4DecodeComputeDigest(&view, digest.data(), digest.size(), &profile), DERSuccess);
    return digest;
}

using Verifier = decltype(verify_signature_rsa)*;

bool accepts(Verifier verify, const Img4TrustProfile& profile, const Bytes& key, const Bytes& signature) {
    const Bytes digest = digestOfMessage(profile);
    const DERItem keyView = itemOf(key), signatureView = itemOf(signature);
    const DERReturn result = verify(&keyView, &signatureView, digest.data(), digest.size(), &profile);
    EXPECT_TRUE(result == DERSuccess || result == Img4Failure) << result;
    return result == DERSuccess;
}

// RSA

// Signs a block that is padded already.
Bytes signRaw(const Key& key, const Bytes& block) {
    const std::unique_ptr<EVP_PKEY_CTX, decltype(&EVP_PKEY_CTX_free)> signer(
        EVP_PKEY_CTX_new_from_pkey(nullptr, key.get(), nullptr), EVP_PKEY_CTX_free);
    std::size_t length = block.size();
    Bytes signature(length);
    EXPECT_EQ(EVP_PKEY_sign_init(signer.get()), 1);
    EXPECT_EQ(EVP_PKEY_CTX_set_rsa_padding(signer.get(), RSA_NO_PADDING), 1);
    EXPECT_EQ(EVP_PKEY_sign(signer.get(), signature.data(), &length, block.data(), block.size()), 1);
    return signature;
}

// The padded block (RFC 8017 9.2) of that length.
Bytes padded(const Bytes& digestInfo, std::size_t length) {
    return join({{0x00, 0x01}, Bytes(length - 3 - digestInfo.size(), 0xFF), {0x00}, digestInfo});
}

Bytes changedAt(Bytes bytes, std::size_t place, std::uint8_t octet) {
    bytes.at(place) = octet;
    return bytes;
}

struct Case {
    const char* name;
    Bytes octets;
    bool accepted = false;
};

const Key& rsaKey() {
    static const Key key = readKey(TEST_TRUST_DOMAIN "/keys/ROOT_CA_CERTIFICATE.pem");
    return key;
}

Img4TrustProfile profileWith(const Img4TrustProfile& like, const Img4DigestInfo& digestInfo) {
    Img4TrustProfile profile = like;
    profile.digestInfo = &digestInfo;
    return profile;
}

const Img4DigestInfo* const digestInfos[] = {&kQDSupportDigestInfoSha1, &kQDSupportDigestInfoSha256,
                                             &kQDSupportDigestInfoSha384, &kQDSupportDigestInfoSha512};

const Bytes longExponent = {0x01, 0, 0, 0, 0, 0, 0, 0, 0x0D};

// `size` is that of the modulus.
void checkBlocks(const Key& key, const Img4DigestInfo& info, std::size_t size) {
    const Img4TrustProfile profile = profileWith(kImg4DecodeSecureBootRsa4kSha384, info);
    const Bytes digest = digestOfMessage(profile), algorithm = sequence({oid(*info.oid), null});
    const Bytes digestInfo = sequence({algorithm, octets(digest)}), sound = padded(digestInfo, size);
    const auto with = [size](const List& elements) { return padded(sequence(elements), size); };
    const auto shortened = [&](std::size_t padding) {
        const Bytes block = padded(digestInfo, padding + 3 + digestInfo.size());
        return join({block, Bytes(size - block.size(), 0xAA)});
    };
    const Case rows[] = {
        {"sound", sound, true},
        {"no NULL", with({sequence({oid(*info.oid)}), octets(digest)})},
        {"octets behind the digest", with({algorithm, octets(digest), null})},
        {"digest alone", padded(digest, size)},
        {"other digest", lastChanged(sound)},
        {"short padding and octets behind", shortened(8)},
        {"padding of seven octets", shortened(7)},
        {"other octet in the padding", changedAt(sound, 2, 0xFE)},
        {"padding of encryption", changedAt(sound, 1, 0x02)},
    };
    const Bytes bits = publicKeyBits(key);
    EXPECT_TRUE(accepts(verify_signature_rsa, profile, bits, sign(key, info.length, message)));
    for (const Case& row : rows)
        EXPECT_EQ(accepts(verify_signature_rsa, profile, bits, signRaw(key, row.octets)), row.accepted)
            << info.length << " at " << size << ", " << row.name;
}

TEST(Img4RSASignature, isOverTheExactBlock) {
    // OpenSSL itself does not verify with exponents of more than 64 bits under moduli of more than 3072.
    const Key longKey = makeRSAKey(3080, longExponent);
    for (const Img4DigestInfo* info : digestInfos) {
        checkBlocks(rsaKey(), *info, 256);
        checkBlocks(longKey, *info, 385);
    }
}

TEST(Img4RSASignature, needsASoundKeyAndIsANumberBelowTheModulusOfItsLength) {
    const Img4TrustProfile& profile = kImg4DecodeSecureBootRsa4kSha384;
    const Bytes digest = digestOfMessage(profile);
    const Bytes n = parameter(rsaKey(), OSSL_PKEY_PARAM_RSA_N);
    const Bytes e = parameter(rsaKey(), OSSL_PKEY_PARAM_RSA_E);
    const Bytes sound = sign(rsaKey(), digest.size(), message);
    const Bytes forged = padded(sequence({sequence({oid(*profile.digestInfo->oid), null}), octets(digest)}), n.size());
    const Bytes whole = sequence({positiveInteger(n), positiveInteger(e)});
    struct Row {
        const char* name;
        Bytes key;
        Bytes signature;
        bool accepted = false;
    };
    const Row rows[] = {
        {"sound", whole, sound, true},
        {"zeros before the modulus", sequence({rawInteger(join({Bytes{0, 0}, n})), positiveInteger(e)}), sound, true},
        {"negative modulus", sequence({rawInteger(n), positiveInteger(e)}), sound},
        {"even modulus", sequence({positiveInteger(lastChanged(n)), positiveInteger(e)}), sound},
        {"exponent 1", sequence({positiveInteger(n), positiveInteger({1})}), forged},
        {"exponent 0", sequence({positiveInteger(n), rawInteger({0})}), sound},
        {"even exponent", sequence({positiveInteger(n), positiveInteger({2})}), sound},
        {"negative exponent", sequence({positiveInteger(n), rawInteger({0x81})}), sound},
        {"exponent as large as the modulus", sequence({positiveInteger(n), positiveInteger(n)}), sound},
        {"octet behind", join({whole, Bytes{0}}), sound},
        {"signature with a zero in front", whole, join({Bytes{0}, sound})},
        {"signature that lacks an octet", whole, Bytes(sound.begin(), sound.end() - 1)},
        {"signature plus modulus", whole, sum(sound, n)},
    };
    for (const Row& row : rows)
        EXPECT_EQ(accepts(verify_signature_rsa, profile, row.key, row.signature), row.accepted) << row.name;
}

TEST(Img4RSASignature, needsAModulusWithinTheVerifiersLimits) {
    const Img4TrustProfile& profile = kImg4DecodeSecureBootRsa4kSha384;
    struct Row {
        unsigned bits;
        bool accepted;
        bool acceptedBy3k;
        Bytes exponent = {0x01, 0x00, 0x01};
    };
    // The upper limits are tried with more than two primes, which are found sooner; to a verifier they look alike.
    for (const Row& row :
         {Row{1016, false, false}, Row{1024, true, true, {0xFF, 0xF1}}, Row{3072, true, true, longExponent},
          Row{3073, true, false}, Row{4096, true, false, {0x03}}, Row{4097, false, false}}) {
        const Key key = makeRSAKey(row.bits, row.exponent);
        const Bytes bits = publicKeyBits(key);
        const Bytes signature = sign(key, profile.digestInfo->length, message);
        EXPECT_EQ(accepts(verify_signature_rsa, profile, bits, signature), row.accepted) << row.bits;
        EXPECT_EQ(accepts(verify_signature_rsa3k, profile, bits, signature), row.acceptedBy3k) << row.bits;
    }
}

// ECDSA

void checkCurve(const char* curve, const char* otherCurve, const Img4TrustProfile& usual) {
    SCOPED_TRACE(curve);
    const Key key = makeECKey(curve);
    const Bytes point = publicKeyBits(key), order = parameter(key, OSSL_PKEY_PARAM_EC_ORDER);
    const Bytes field = parameter(key, OSSL_PKEY_PARAM_EC_P);
    const std::size_t size = usual.digestInfo->length;
    Bytes whole;
    do
        whole = sign(key, size, message);
    while (whole.size() != 8 + 2 * size); // until both numbers need a zero in front
    const Bytes r(whole.end() - static_cast<long>(2 * size + 3), whole.end() - static_cast<long>(size + 3));
    const Bytes s(whole.end() - static_cast<long>(size), whole.end());
    const Bytes R = positiveInteger(r), S = positiveInteger(s);
    const Case signatures[] = {
        {"sound", sequence({R, S}), true},
        {"r = 0", sequence({positiveInteger({}), S})},
        {"r plus order", sequence({positiveInteger(sum(r, order)), S})},
        {"r negative", sequence({rawInteger(r), S})},
        {"s negative", sequence({R, rawInteger(s)})},
        {"zeros before r", sequence({rawInteger(join({Bytes{0, 0}, r})), S})},
        {"r empty", sequence({rawInteger({}), S})},
        {"octets behind", join({whole, null})},
    };
    const Case points[] = {
        {"sound", point, true},
        {"not on the curve", lastChanged(point)},
        {"hybrid", changedAt(point, 0, 0x06 | (point.back() & 1))},
        {"coordinates of the field's size", join({Bytes{0x04}, field, field})},
        {"octet behind", join({point, Bytes{0}})},
        {"of the other curve", publicKeyBits(makeECKey(otherCurve))},
        {"of another key", publicKeyBits(makeECKey(curve))},
    };
    for (const Case& row : signatures)
        EXPECT_EQ(accepts(verify_signature_ecdsa, usual, point, row.octets), row.accepted) << row.name;
    for (const Case& row : points)
        EXPECT_EQ(accepts(verify_signature_ecdsa, usual, row.octets, whole), row.accepted) << row.name;
    for (const Img4DigestInfo* info : digestInfos)
        EXPECT_TRUE(accepts(verify_signature_ecdsa, profileWith(kImg4DecodeSecureBootEc384Sha384, *info), point,
                            sign(key, info->length, message)))
            << info->length;
}

TEST(Img4ECDSASignature, isAPairOfNumbersInStrictDERUnderAnUncompressedPointWhichTellsTheCurve) {
    checkCurve("P-256", "P-384", kImg4DecodeSecureBootEc256Sha256);
    checkCurve("P-384", "P-256", kImg4DecodeSecureBootEc384Sha384);
}

TEST(Img4Signatures, needTheirArgumentsAndADigestOfTheProfilesLength) {
    const Key ecKey = makeECKey("P-384");
    const std::tuple<Verifier, const Img4TrustProfile&, const Key&> rows[] = {
        {verify_signature_rsa, kImg4DecodeSecureBootRsa4kSha384, rsaKey()},
        {verify_signature_ecdsa, kImg4DecodeSecureBootEc384Sha384, ecKey}};
    const Img4DigestInfo bare = {48, nullptr, nullptr};
    for (const auto& [verify, profile, signer] : rows) {
        const Bytes digest = digestOfMessage(profile), bits = publicKeyBits(signer), octets = sign(signer, 48, message);
        const DERItem key = itemOf(bits), signature = itemOf(octets), none = {};
        Img4TrustProfile withoutKeyAlgorithm = profile;
        withoutKeyAlgorithm.keyAlgorithmOid = nullptr;
        const Img4TrustProfile withoutImplementation = profileWith(profile, bare);
        ASSERT_EQ(verify(&key, &signature, digest.data(), 48, &profile), DERSuccess);
        expectNeedsAll(Img4Failure, verify, &key, &signature, digest.data(), 48, &profile);
        EXPECT_EQ(verify(&none, &signature, digest.data(), 48, &profile), Img4Failure);
        EXPECT_EQ(verify(&key, &none, digest.data(), 48, &profile), Img4Failure);
        EXPECT_EQ(verify(&key, &signature, digest.data(), 32, &profile), Img4Failure);
        EXPECT_EQ(verify(&key, &signature, digest.data(), 48, &withoutImplementation), Img4Failure);
        EXPECT_EQ(verify(&key, &signature, digest.data(), 48, &withoutKeyAlgorithm),
                  verify == verify_signature_ecdsa ? Img4Failure : DERSuccess);
    }
}

} // namespace
