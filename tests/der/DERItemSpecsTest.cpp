// The tables, on a whole certificate.
#include <gtest/gtest.h>

#include "der/DERDecode.h"
#include "der/DEREncode.h"
#include "der/DERItemSpecs.h"
#include "tests/der/Bytes.h"
#include "tools/makers/CertificateMaker.h"

namespace {

// What `specs` make of the items in `content`.
template <typename Record>
Record parsed(const DERItem& content, std::uint16_t count, const DERItemSpec* specs) {
    Record record;
    EXPECT_EQ(DERParseSequenceContent(&content, count, specs, &record, sizeof record), DERSuccess);
    return record;
}

// The content of the first item in `items`, which is removed there.
DERItem takeContent(DERItem* items) {
    DERDecodedInfo first = {};
    if (DERDecodeItem(items, &first) != DERSuccess) {
        ADD_FAILURE() << "no item";
        return {};
    }
    const std::uint8_t* const end = first.content.data + first.content.length;
    *items = {end, items->length - static_cast<std::uint64_t>(end - items->data)};
    return first.content;
}

TEST(DERItemSpecs, takeACertificateApart) {
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
