// What another implementation says about the same octets.
#include <climits>
#include <random>

#include <gtest/gtest.h>
#include <openssl/asn1.h>

#include "der/DERDecode.h"
#include "der/DEREncode.h"
#include "der/DERItemSpecs.h"
#include "tests/der/Bytes.h"
#include "tests/support/CertificateMaker.h"

namespace {

constexpr int classOf(DERTag tag) {
    return static_cast<int>(tag >> 62 << 6);
}
constexpr int formOf(DERTag tag) {
    return static_cast<int>(tag >> 61 & 1) * V_ASN1_CONSTRUCTED;
}

// OpenSSL reads the wider BER, so it need not refuse what we refuse; but what we accept it must read alike.
void expectReadAlike(const Bytes& input, const DERDecodedInfo& decoded) {
    const DERTag number = decoded.tag & DERTagNumberMask;
    if (number > INT_MAX)
        return;
    const unsigned char* next = input.data();
    long length = 0;
    int tag = 0;
    int tagClass = 0;
    const int form = ASN1_get_object(&next, &length, &tag, &tagClass, static_cast<long>(input.size()));
    ASSERT_EQ(form & 0x80, 0) << hexOf(input);
    EXPECT_EQ(form, formOf(decoded.tag)) << hexOf(input);
    EXPECT_EQ(static_cast<DERTag>(tag), number) << hexOf(input);
    EXPECT_EQ(tagClass, classOf(decoded.tag)) << hexOf(input);
    EXPECT_EQ(static_cast<std::uint64_t>(length), decoded.content.length) << hexOf(input);
    EXPECT_EQ(next, decoded.content.data) << hexOf(input);
}

// A header is octets that matter to the decoder more often than chance would have it.
TEST(DERAgainstOpenSSL, randomHeadersAreReadAlike) {
    constexpr std::uint8_t telling[] = {0x00, 0x01, 0x1E, 0x1F, 0x7F, 0x80, 0x81, 0x82, 0x83, 0x84, 0x88, 0xFF};
    std::mt19937_64 random(20240607);
    int accepted = 0;
    for (int round = 0; round < 100'000; ++round) {
        Bytes input(1 + random() % 12 + (random() % 8 == 0 ? 300 : 0));
        for (std::uint8_t& octet : input)
            octet = random() % 3 == 0 ? static_cast<std::uint8_t>(random()) : telling[random() % sizeof telling];
        const DERItem der = itemOf(input);
        DERDecodedInfo decoded;
        if (DERDecodeItem(&der, &decoded) != DERSuccess)
            continue;
        ++accepted;
        expectReadAlike(input, decoded);
    }
    EXPECT_GT(accepted, 10'000);
}

TEST(DERAgainstOpenSSL, randomItemsAreWrittenAlikeAndReadBack) {
    std::mt19937_64 random(20240608);
    for (int round = 0; round < 5'000; ++round) {
        const DERTag tag = (random() & ~DERTagNumberMask) | (random() >> (33 + random() % 31));
        Bytes content((random() & 0xFFFF) >> (random() % 17));
        for (std::uint8_t& octet : content)
            octet = static_cast<std::uint8_t>(random());

        const auto number = static_cast<int>(tag & DERTagNumberMask);
        const auto length = static_cast<int>(content.size());
        Bytes expected(static_cast<std::size_t>(ASN1_object_size(0, length, number)));
        unsigned char* next = expected.data();
        ASN1_put_object(&next, formOf(tag) != 0 ? 1 : 0, length, number, classOf(tag));
        std::copy(content.begin(), content.end(), next);

        Bytes encoded(DERLengthOfItem(tag, content.size()));
        std::uint64_t written = encoded.size();
        ASSERT_EQ(DEREncodeItem(tag, content.size(), content.data(), encoded.data(), &written), DERSuccess);
        ASSERT_EQ(encoded, expected);

        const DERItem der = itemOf(encoded);
        DERDecodedInfo decoded;
        ASSERT_EQ(DERDecodeItem(&der, &decoded), DERSuccess);
        EXPECT_EQ(decoded.tag, tag);
        EXPECT_EQ(Bytes(decoded.content.data, decoded.content.data + decoded.content.length), content);
    }
}

// What `specs` make of the items in `content`.
template <typename Record>
Record parsed(const DERItem& content, std::uint16_t count, const DERItemSpec* specs) {
    Record record;
    EXPECT_EQ(DERParseSequenceContent(&content, count, specs, &record, sizeof record), DERSuccess);
    return record;
}

// The content of the first item in `items`, all of which is consumed.
DERItem takeContent(DERItem* items) {
    DERDecodedInfo first;
    EXPECT_EQ(DERDecodeItem(items, &first), DERSuccess);
    const std::uint8_t* const end = first.content.data + first.content.length;
    *items = {end, items->length - static_cast<std::uint64_t>(end - items->data)};
    return first.content;
}

TEST(DERAgainstOpenSSL, certificateIsTakenApartByTheTables) {
    const Bytes der = certificatemaker::module({0x12, 0x34, 0x56}, certificatemaker::KeyKind::RSA2048).certificate;
    DERItem rest = itemOf(der);
    auto signedPart =
        parsed<DERSignedCertCrl>(takeContent(&rest), DERNumSignedCertCrlItemSpecs, DERSignedCertCrlItemSpecs);
    auto tbs = parsed<DERTBSCert>(takeContent(&signedPart.tbs), DERNumTBSCertItemSpecs, DERTBSCertItemSpecs);
    EXPECT_EQ(hexOf(tbs.version), "02 01 02");
    EXPECT_EQ(hexOf(tbs.serialNumber), "12 34 56");
    EXPECT_EQ(hexOf(tbs.issuer), hexOf(tbs.subject));
    EXPECT_EQ(hexOf(tbs.issuerUniqueID), "absent");
    EXPECT_EQ(hexOf(tbs.subjectUniqueID), "absent");

    DERItem names = takeContent(&tbs.subject);
    const auto attribute = parsed<DERAttributeTypeAndValue>(takeContent(&names), DERNumAttributeTypeAndValueItemSpecs,
                                                            DERAttributeTypeAndValueItemSpecs);
    EXPECT_EQ(hexOf(attribute.type), "55 04 03");
    EXPECT_EQ(hexOf(attribute.value), "0C 06 4D 6F 64 75 6C 65");

    const auto algorithm =
        parsed<DERAlgorithmId>(signedPart.signatureAlgorithm, DERNumAlgorithmIdItemSpecs, DERAlgorithmIdItemSpecs);
    EXPECT_EQ(hexOf(algorithm.algorithm), "2A 86 48 86 F7 0D 01 01 0B");
    EXPECT_EQ(hexOf(algorithm.parameters), "05 00");

    DERItem extensions = takeContent(&tbs.extensions);
    for (const char* expected : {"55 1D 0F | FF | 03 02 07 80", "55 1D 13 | absent | 30 00"}) {
        const auto extension =
            parsed<DERExtension>(takeContent(&extensions), DERNumExtensionItemSpecs, DERExtensionItemSpecs);
        EXPECT_EQ(hexOf(extension.extensionID) + " | " + hexOf(extension.critical) + " | " + hexOf(extension.value),
                  expected);
    }

    const auto info =
        parsed<DERSubjPubKeyInfo>(tbs.subjectPublicKeyInfo, DERNumSubjPubKeyInfoItemSpecs, DERSubjPubKeyInfoItemSpecs);
    DERItem bits;
    std::uint8_t unused = 0;
    ASSERT_EQ(DERParseBitString(&info.publicKey, &bits, &unused), DERSuccess);
    EXPECT_EQ(unused, 0);
    const std::string encodedKey = hexOf(bits);
    auto key = parsed<DERRSAPubKeyPKCS1>(takeContent(&bits), DERNumRSAPubKeyPKCS1ItemSpecs, DERRSAPubKeyPKCS1ItemSpecs);
    EXPECT_EQ(hexOf(key.publicExponent), "01 00 01");
    ASSERT_EQ(key.modulus.length, 257U);
    EXPECT_EQ(key.modulus.data[0], 0x00);

    // The bare number, whose highest bit is set, is written with the zero octet again.
    key.modulus = {key.modulus.data + 1, 256};
    Bytes written(512);
    std::uint64_t length = written.size();
    ASSERT_EQ(DEREncodeSequence(DERTagSequence, &key, DERNumRSAPubKeyPKCS1ItemSpecs, DERRSAPubKeyPKCS1ItemSpecs,
                                written.data(), &length),
              DERSuccess);
    EXPECT_EQ(hexOf(written.data(), length), encodedKey);
}

} // namespace
