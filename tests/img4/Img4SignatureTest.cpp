#include "tests/img4/TrustDomain.h"
#include "tests/support/MissingArguments.h"

#include <utility>
#include <vector>

#include <gtest/gtest.h>
#include <openssl/bn.h>
#include <openssl/core_names.h>
#include <openssl/rsa.h>

namespace {

using namespace img4maker;
using namespace signedmanifest;

// Numbers without sign or size, as big-endian octets.
using Number = std::unique_ptr<BIGNUM, decltype(&BN_free)>;

Number number(const Bytes& octets) {
    return {BN_bin2bn(octets.data(), static_cast<int>(octets.size()), nullptr), BN_free};
}

Number parameter(const Key& key, const char* name) {
    BIGNUM* value = nullptr;
    EXPECT_EQ(EVP_PKEY_get_bn_param(key.get(), name, &value), 1) << name;
    return {value, BN_free};
}

Bytes octetsOf(const BIGNUM* value, std::size_t length) {
    Bytes octets(length);
    EXPECT_EQ(BN_bn2binpad(value, octets.data(), static_cast<int>(length)), static_cast<int>(length));
    return octets;
}

Bytes octetsOf(const BIGNUM* value) {
    return octetsOf(value, static_cast<std::size_t>(BN_num_bytes(value)));
}

Bytes sum(const Bytes& one, const BIGNUM* other) {
    const Number total = number(one);
    EXPECT_EQ(BN_add(total.get(), total.get(), other), 1);
    return octetsOf(total.get());
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
    const DERItem view = viewOf(message);
    EXPECT_EQ(Img4DecodeComputeDigest(&view, digest.data(), digest.size(), &profile), DERSuccess);
    return digest;
}

using Verifier = decltype(verify_signature_rsa)*;

bool accepts(Verifier verify, const Img4TrustProfile& profile, const Bytes& key, const Bytes& signature,
             const Bytes& digest) {
    const DERItem keyView = viewOf(key);
    const DERItem signatureView = viewOf(signature);
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

// What a padded block consists of (RFC 8017 9.2).
struct Block {
    Bytes start = {0x00, 0x01};
    std::size_t paddingLength = 0; // 0: as much as fills the block
    Bytes separator = {0x00};
    Bytes digestInfo = {};
    Bytes rest = {};
    std::uint8_t padding = 0xFF;
};

Bytes encode(const Block& block, std::size_t length) {
    const std::size_t others =
        block.start.size() + block.separator.size() + block.digestInfo.size() + block.rest.size();
    Bytes encoded =
        join({block.start, Bytes(block.paddingLength != 0 ? block.paddingLength : length - others, block.padding),
              block.separator, block.digestInfo, block.rest});
    encoded.resize(length, 0xAA);
    return encoded;
}

// A SEQUENCE with its length in the long form, which is no DER as long as the content is short.
Bytes longSequence(const Bytes& content) {
    return join({Bytes{0x30, 0x81, static_cast<std::uint8_t>(content.size())}, content});
}

struct BlockCase {
    const char* name;
    Block block;
    bool accepted = false;
};

// The blocks of this digest under the algorithm with this encoded OBJECT IDENTIFIER.
std::vector<BlockCase> blockCases(const Bytes& digest, const Bytes& oid) {
    const Bytes algorithm = sequence({oid, null});
    const Bytes sound = sequence({algorithm, octets(digest)});
    const auto with = [](const Bytes& digestInfo) { return Block{.digestInfo = digestInfo}; };
    const Bytes longDigest = join({Bytes{0x04, 0x81, static_cast<std::uint8_t>(digest.size())}, digest});
    return {
        {"sound", with(sound), true},
        {"no NULL", with(sequence({sequence({oid}), octets(digest)}))},
        {"other parameters", with(sequence({sequence({oid, octets({})}), octets(digest)}))},
        {"long length of the digest", with(sequence({algorithm, longDigest}))},
        {"octets behind the digest", with(sequence({algorithm, octets(digest), null}))},
        {"other digest algorithm", with(sequence({sequence({lastChanged(oid, 0x03), null}), octets(digest)}))},
        {"digest that lacks an octet", with(sequence({algorithm, octets(Bytes(digest.begin(), digest.end() - 1))}))},
        {"digest alone", with(digest)},
        {"other digest", with(sequence({algorithm, octets(lastChanged(digest))}))},
        {"octets behind the DigestInfo", {.digestInfo = sound, .rest = {0x00}}},
        {"short padding and octets behind", {.paddingLength = 8, .digestInfo = sound}},
        {"padding of seven octets", {.paddingLength = 7, .digestInfo = sound}},
        {"other octets in the padding", {.digestInfo = sound, .padding = 0xFE}},
        {"zeros as padding", {.digestInfo = sound, .padding = 0x00}},
        {"no end of the padding", {.separator = {}, .digestInfo = sound}},
        {"padding of encryption", {.start = {0x00, 0x02}, .digestInfo = sound}},
        {"first octet left out", {.start = {0x01}, .digestInfo = sound}},
    };
}

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

void checkBlocks(const Key& key, const Img4DigestInfo& info) {
    const Img4TrustProfile profile = profileWith(kImg4DecodeSecureBootRsa4kSha384, info);
    const Bytes digest = digestOfMessage(profile);
    const Bytes bits = publicKeyBits(key);
    const std::size_t size = static_cast<std::size_t>(EVP_PKEY_get_size(key.get()));
    EXPECT_TRUE(accepts(verify_signature_rsa, profile, bits, sign(key, info.length, message), digest));
    for (const BlockCase& row : blockCases(digest, oid(*info.oid)))
        EXPECT_EQ(accepts(verify_signature_rsa, profile, bits, signRaw(key, encode(row.block, size)), digest),
                  row.accepted)
            << info.length << " at " << size << ", " << row.name;
}

const Bytes longExponent = {0x01, 0, 0, 0, 0, 0, 0, 0, 0x0D};

TEST(Img4RSASignature, isOverTheExactBlock) {
    // OpenSSL itself does not verify with exponents of more than 64 bits under moduli of more than 3072.
    for (const Key& key : {rsaKey(), makeMultiPrimeRSAKey(3080, longExponent)})
        for (const Img4DigestInfo* info : digestInfos)
            checkBlocks(key, *info);
}

TEST(Img4RSASignature, needsASoundKeyAndIsANumberBelowTheModulusOfItsLength) {
    const Img4TrustProfile& profile = kImg4DecodeSecureBootRsa4kSha384;
    const Bytes digest = digestOfMessage(profile);
    const Number modulus = parameter(rsaKey(), OSSL_PKEY_PARAM_RSA_N);
    const Bytes n = octetsOf(modulus.get());
    const Bytes e = octetsOf(parameter(rsaKey(), OSSL_PKEY_PARAM_RSA_E).get());
    const Bytes sound = sign(rsaKey(), digest.size(), message);
    Block block;
    block.digestInfo = sequence({sequence({oid(*profile.digestInfo->oid), null}), octets(digest)});
    const Bytes forged = encode(block, n.size());
    Bytes even = n;
    even.at(n.size() - 1) ^= 1;
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
        {"even modulus", sequence({positiveInteger(even), positiveInteger(e)}), sound},
        {"modulus of zero", sequence({positiveInteger({}), positiveInteger(e)}), {0x00}},
        {"no modulus", sequence({rawInteger({}), positiveInteger(e)}), sound},
        {"exponent 1", sequence({positiveInteger(n), positiveInteger({1})}), forged},
        {"exponent 0", sequence({positiveInteger(n), rawInteger({0})}), sound},
        {"even exponent", sequence({positiveInteger(n), positiveInteger({2})}), sound},
        {"negative exponent", sequence({positiveInteger(n), rawInteger({0x81})}), sound},
        {"exponent as large as the modulus", sequence({positiveInteger(n), positiveInteger(n)}), sound},
        {"exponent larger than the modulus", sequence({positiveInteger(n), positiveInteger(join({Bytes{1}, n}))}),
         sound},
        {"no exponent", sequence({positiveInteger(n)}), sound},
        {"third number", sequence({positiveInteger(n), positiveInteger(e), integer(1)}), sound},
        {"octet behind", join({whole, Bytes{0}}), sound},
        {"SET", set({positiveInteger(n), positiveInteger(e)}), sound},
        {"none", {}, sound},
        {"signature with a zero in front", whole, join({Bytes{0}, sound})},
        {"signature that lacks an octet", whole, Bytes(sound.begin(), sound.end() - 1)},
        {"signature plus modulus", whole, sum(sound, modulus.get())},
        {"signature of zero", whole, Bytes(n.size())},
        {"modulus as signature", whole, n},
        {"no signature", whole, {}},
    };
    for (const Row& row : rows)
        EXPECT_EQ(accepts(verify_signature_rsa, profile, row.key, row.signature, digest), row.accepted) << row.name;
}

TEST(Img4RSASignature, needsAModulusWithinTheVerifiersLimits) {
    const Img4TrustProfile& profile = kImg4DecodeSecureBootRsa4kSha384;
    const Bytes digest = digestOfMessage(profile);
    struct Row {
        unsigned bits;
        bool accepted;
        bool acceptedBy3k;
        Bytes exponent = {0x01, 0x00, 0x01};
    };
    // The upper limits are tried with more than two primes, which are found sooner; to a verifier they look alike.
    for (const Row& row :
         {Row{1016, false, false}, Row{1024, true, true}, Row{3072, true, true}, Row{3073, true, false},
          Row{4096, true, false}, Row{4097, false, false}, Row{2048, true, true, {0x03}},
          Row{3072, true, true, longExponent}, Row{4096, true, false, {0x03}}, Row{4096, true, false, longExponent}}) {
        const Key key = row.bits > 1024 ? makeMultiPrimeRSAKey(row.bits, row.exponent) : makeRSAKey(row.bits);
        const Bytes bits = publicKeyBits(key);
        const Bytes signature = sign(key, digest.size(), message);
        EXPECT_EQ(accepts(verify_signature_rsa, profile, bits, signature, digest), row.accepted) << row.bits;
        EXPECT_EQ(accepts(verify_signature_rsa3k, profile, bits, signature, digest), row.acceptedBy3k) << row.bits;
    }
}

// ECDSA

struct CurveUnderTest {
    const char* name;
    const Img4TrustProfile* profile;
};

const CurveUnderTest curves[] = {{"P-256", &kImg4DecodeSecureBootEc256Sha256},
                                 {"P-384", &kImg4DecodeSecureBootEc384Sha384}};

// The magnitudes of the numbers of a sound signature, and the order of its curve.
struct Sound {
    Bytes r;
    Bytes s;
    Number order;
};

Sound soundSignature(const Key& key, const Img4TrustProfile& profile) {
    const Bytes signature = sign(key, profile.digestInfo->length, message);
    const std::size_t lengthOfR = signature[3];
    Sound sound = {Bytes(signature.begin() + 4, signature.begin() + 4 + static_cast<long>(lengthOfR)),
                   Bytes(signature.begin() + 6 + static_cast<long>(lengthOfR), signature.end()),
                   parameter(key, OSSL_PKEY_PARAM_EC_ORDER)};
    sound.r = octetsOf(number(sound.r).get());
    sound.s = octetsOf(number(sound.s).get());
    return sound;
}

Bytes difference(const BIGNUM* one, const Bytes& other) {
    const Number result = number(other);
    EXPECT_EQ(BN_sub(result.get(), one, result.get()), 1);
    return octetsOf(result.get());
}

// The content octets of a negative INTEGER.
Bytes negative(const Bytes& magnitude) {
    Bytes octets = join({Bytes{0x00}, magnitude});
    for (std::uint8_t& octet : octets)
        octet = static_cast<std::uint8_t>(~octet);
    for (std::size_t i = octets.size(); i-- > 0 && ++octets[i] == 0;) {
    }
    return octets;
}

Bytes pair(const Bytes& r, const Bytes& s) {
    return sequence({positiveInteger(r), positiveInteger(s)});
}

struct PairCase {
    const char* name;
    Bytes encoding;
    bool accepted = false;
};

std::vector<PairCase> pairCases(const Sound& sound) {
    const Bytes &r = sound.r, &s = sound.s;
    const Bytes R = positiveInteger(r), S = positiveInteger(s);
    const BIGNUM* const n = sound.order.get();
    const Bytes order = octetsOf(n);
    const Bytes whole = pair(r, s);
    const Bytes longR = join({Bytes{0x02, 0x81}, Bytes(R.begin() + 1, R.end())});
    return {
        {"sound", whole, true},
        {"s on the other side of the order", pair(r, difference(n, s)), true},
        {"r and s swapped", pair(s, r)},
        {"r = 0", pair({}, s)},
        {"s = 0", pair(r, {})},
        {"r = 0, s = 1", pair({}, {1})},
        {"r = order", pair(order, s)},
        {"s = order", pair(r, order)},
        {"r plus order", pair(sum(r, n), s)},
        {"s plus order", pair(r, sum(s, n))},
        {"r negative", sequence({rawInteger(negative(r)), S})},
        {"s negative", sequence({R, rawInteger(negative(s))})},
        {"zeros before r", sequence({rawInteger(join({Bytes{0, 0}, r})), S})},
        {"zeros before s", sequence({R, rawInteger(join({Bytes{0, 0}, s}))})},
        {"r empty", sequence({rawInteger({}), S})},
        {"s empty", sequence({R, rawInteger({})})},
        {"r of two octets for zero", sequence({rawInteger({0, 0}), S})},
        {"s missing", sequence({R})},
        {"both missing", sequence({})},
        {"third number", sequence({R, S, positiveInteger({1})})},
        {"octets behind", join({whole, null})},
        {"cut short", Bytes(whole.begin(), whole.end() - 1)},
        {"r an OCTET STRING", sequence({octets(r), S})},
        {"SET", set({R, S})},
        {"long length", longSequence(join({R, S}))},
        {"long length of r", sequence({longR, S})},
        {"indefinite length", join({Bytes{0x30, 0x80}, R, S, Bytes{0x00, 0x00}})},
        {"none", {}},
    };
}

TEST(Img4ECDSASignature, isAPairOfNumbersInStrictDER) {
    for (const CurveUnderTest& curve : curves) {
        const Key key = makeECKey(curve.name);
        const Bytes digest = digestOfMessage(*curve.profile);
        for (const PairCase& row : pairCases(soundSignature(key, *curve.profile)))
            EXPECT_EQ(accepts(verify_signature_ecdsa, *curve.profile, publicKeyBits(key), row.encoding, digest),
                      row.accepted)
                << curve.name << ", " << row.name;
    }
}

Bytes withForm(Bytes point, std::uint8_t form) {
    point.front() = form;
    return point;
}

std::vector<std::pair<const char*, Bytes>> refusedPoints(const Key& key) {
    const Bytes point = publicKeyBits(key);
    const std::size_t half = point.size() / 2;
    const Bytes x(point.begin() + 1, point.end() - static_cast<long>(half));
    const Bytes y(point.end() - static_cast<long>(half), point.end());
    const Number p = parameter(key, OSSL_PKEY_PARAM_EC_P);
    const Bytes field = octetsOf(p.get(), half);
    const std::uint8_t parity = y.back() & 1;
    const bool isP256 = half == 32;
    return {
        {"not on the curve", lastChanged(point)},
        {"hybrid", withForm(point, 0x06 | parity)},
        {"compressed", join({Bytes{static_cast<std::uint8_t>(0x02 | parity)}, x})},
        {"form of a compressed point", withForm(point, 0x02)},
        {"infinity", {0x00}},
        {"coordinates of the field's size", join({Bytes{0x04}, field, field})},
        {"octet behind", join({point, Bytes{0}})},
        {"octet missing", Bytes(point.begin(), point.end() - 1)},
        {"whole SubjectPublicKeyInfo", publicKeyInfo(key)},
        {"of the other curve", publicKeyBits(makeECKey(isP256 ? "P-384" : "P-256"))},
        {"of another key", publicKeyBits(makeECKey(isP256 ? "P-256" : "P-384"))},
        {"none", {}},
    };
}

TEST(Img4ECDSASignature, needsAnUncompressedPointOnItsCurve) {
    for (const CurveUnderTest& curve : curves) {
        const Key key = makeECKey(curve.name);
        const Bytes digest = digestOfMessage(*curve.profile);
        const Bytes signature = sign(key, digest.size(), message);
        ASSERT_TRUE(accepts(verify_signature_ecdsa, *curve.profile, publicKeyBits(key), signature, digest));
        for (const auto& [name, point] : refusedPoints(key))
            EXPECT_FALSE(accepts(verify_signature_ecdsa, *curve.profile, point, signature, digest))
                << curve.name << ", " << name;
    }
}

TEST(Img4ECDSASignature, takesTheCurveFromThePointAndTheDigestFromTheProfile) {
    for (const char* curve : {"P-256", "P-384"}) {
        const Key key = makeECKey(curve);
        for (const Img4DigestInfo* info : digestInfos) {
            const Img4TrustProfile profile = profileWith(kImg4DecodeSecureBootEc384Sha384, *info);
            EXPECT_TRUE(accepts(verify_signature_ecdsa, profile, publicKeyBits(key), sign(key, info->length, message),
                                digestOfMessage(profile)))
                << curve << ", " << info->length;
        }
    }
}

TEST(Img4Signatures, needTheirArgumentsAndADigestOfTheProfilesLength) {
    const Key ecKey = makeECKey("P-384");
    const struct {
        Verifier verify;
        const Img4TrustProfile& profile;
        const Key& key;
    } rows[] = {{verify_signature_rsa, kImg4DecodeSecureBootRsa4kSha384, rsaKey()},
                {verify_signature_rsa3k, kImg4DecodeSecureBootRsa3kSha384, rsaKey()},
                {verify_signature_ecdsa, kImg4DecodeSecureBootEc384Sha384, ecKey}};
    const Img4DigestInfo bare = {48, nullptr, nullptr};
    for (const auto& [verify, profile, signer] : rows) {
        const Bytes digest = digestOfMessage(profile);
        const Bytes keyBits = publicKeyBits(signer);
        const Bytes signatureOctets = sign(signer, 48, message);
        const DERItem key = viewOf(keyBits), signature = viewOf(signatureOctets), none = {};
        Img4TrustProfile withoutDigest = profile;
        withoutDigest.digestInfo = nullptr;
        const Img4TrustProfile withoutImplementation = profileWith(profile, bare);
        ASSERT_EQ(verify(&key, &signature, digest.data(), 48, &profile), DERSuccess);
        expectNeedsAll(Img4Failure, verify, &key, &signature, digest.data(), 48, &profile);
        EXPECT_EQ(verify(&none, &signature, digest.data(), 48, &profile), Img4Failure);
        EXPECT_EQ(verify(&key, &none, digest.data(), 48, &profile), Img4Failure);
        EXPECT_EQ(verify(&key, &signature, digest.data(), 32, &profile), Img4Failure);
        EXPECT_EQ(verify(&key, &signature, digest.data(), 48, &withoutDigest), Img4Failure);
        EXPECT_EQ(verify(&key, &signature, digest.data(), 48, &withoutImplementation), Img4Failure);
    }
    Img4TrustProfile withoutKeyAlgorithm = kImg4DecodeSecureBootEc384Sha384;
    withoutKeyAlgorithm.keyAlgorithmOid = nullptr;
    EXPECT_FALSE(accepts(verify_signature_ecdsa, withoutKeyAlgorithm, publicKeyBits(ecKey), sign(ecKey, 48, message),
                         digestOfMessage(withoutKeyAlgorithm)));
}

} // namespace
