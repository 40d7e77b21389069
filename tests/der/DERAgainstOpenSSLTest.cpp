// What another implementation says about the same octets.
#include <climits>
#include <memory>
#include <random>

#include <gtest/gtest.h>
#include <openssl/asn1.h>
#include <openssl/evp.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include "der/DERDecode.h"
#include "der/DEREncode.h"
#include "der/DERItemSpecs.h"
#include "tests/der/Bytes.h"

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

struct Free {
    void operator()(EVP_PKEY* key) const { EVP_PKEY_free(key); }
    void operator()(X509* certificate) const { X509_free(certificate); }
};
using Key = std::unique_ptr<EVP_PKEY, Free>;
using Certificate = std::unique_ptr<X509, Free>;

template <typename Object>
Bytes encodingOf(const Object* object, int (*encode)(const Object*, unsigned char**)) {
    Bytes der(static_cast<std::size_t>(encode(object, nullptr)));
    unsigned char* next = der.data();
    encode(object, &next);
    return der;
}

void addExtension(X509* certificate, int nid, bool critical) {
    ASN1_OCTET_STRING* value = ASN1_OCTET_STRING_new();
    ASN1_OCTET_STRING_set(value, reinterpret_cast<const unsigned char*>("\x03\x02\x02\x04"), 4);
    X509_EXTENSION* extension = X509_EXTENSION_create_by_NID(nullptr, nid, critical ? 1 : 0, value);
    X509_add_ext(certificate, extension, -1);
    X509_EXTENSION_free(extension);
    ASN1_OCTET_STRING_free(value);
}

Certificate selfSigned(EVP_PKEY* key) {
    Certificate certificate(X509_new());
    X509_set_version(certificate.get(), X509_VERSION_3);
    ASN1_INTEGER_set(X509_get_serialNumber(certificate.get()), 0x123456);
    X509_gmtime_adj(X509_getm_notBefore(certificate.get()), 0);
    X509_gmtime_adj(X509_getm_notAfter(certificate.get()), 3600);
    X509_set_pubkey(certificate.get(), key);
    X509_NAME_add_entry_by_txt(X509_get_subject_name(certificate.get()), "CN", MBSTRING_ASC,
                               reinterpret_cast<const unsigned char*>("Bench"), -1, -1, 0);
    X509_set_issuer_name(certificate.get(), X509_get_subject_name(certificate.get()));
    addExtension(certificate.get(), NID_key_usage, true);
    addExtension(certificate.get(), NID_subject_key_identifier, false);
    X509_sign(certificate.get(), key, EVP_sha256());
    return certificate;
}

// The items of the first SEQUENCE inside `content`, by a table.
template <typename Record>
DERReturn parseInner(const DERItem& content, std::uint16_t count, const DERItemSpec* specs, Record* record) {
    return DERParseSequenceToObject(&content, count, specs, record, sizeof *record, sizeof *record);
}

TEST(DERAgainstOpenSSL, certificateIsTakenApartByTheTables) {
    const Key key(EVP_RSA_gen(1024));
    const Certificate certificate = selfSigned(key.get());
    const Bytes der = encodingOf<X509>(certificate.get(), i2d_X509);

    DERSignedCertCrl signedPart;
    ASSERT_EQ(parseInner(itemOf(der), DERNumSignedCertCrlItemSpecs, DERSignedCertCrlItemSpecs, &signedPart),
              DERSuccess);
    DERTBSCert tbs;
    ASSERT_EQ(parseInner(signedPart.tbs, DERNumTBSCertItemSpecs, DERTBSCertItemSpecs, &tbs), DERSuccess);
    EXPECT_EQ(hexOf(tbs.version), "02 01 02");
    EXPECT_EQ(hexOf(tbs.serialNumber), "12 34 56");
    EXPECT_EQ(hexOf(tbs.issuer), hexOf(tbs.subject));
    EXPECT_EQ(tbs.issuerUniqueID.data, nullptr);
    EXPECT_EQ(tbs.subjectUniqueID.data, nullptr);

    DERSequence names;
    DERDecodedInfo name;
    DERDecodeSeqContentInit(&tbs.subject, &names);
    ASSERT_EQ(DERDecodeSeqNext(&names, &name), DERSuccess);
    DERAttributeTypeAndValue attribute;
    ASSERT_EQ(
        parseInner(name.content, DERNumAttributeTypeAndValueItemSpecs, DERAttributeTypeAndValueItemSpecs, &attribute),
        DERSuccess);
    EXPECT_EQ(hexOf(attribute.type), "55 04 03");
    EXPECT_EQ(hexOf(attribute.value), "0C 05 42 65 6E 63 68");

    DERAlgorithmId algorithm;
    ASSERT_EQ(DERParseSequenceContent(&signedPart.signatureAlgorithm, DERNumAlgorithmIdItemSpecs,
                                      DERAlgorithmIdItemSpecs, &algorithm, sizeof algorithm),
              DERSuccess);
    EXPECT_EQ(hexOf(algorithm.algorithm), "2A 86 48 86 F7 0D 01 01 0B");
    EXPECT_EQ(hexOf(algorithm.parameters), "05 00");

    DERTag tag = 0;
    DERSequence extensions;
    ASSERT_EQ(DERDecodeSeqInit(&tbs.extensions, &tag, &extensions), DERSuccess);
    const struct {
        const char* id;
        const char* critical;
    } expected[] = {{"55 1D 0F", "FF"}, {"55 1D 0E", "absent"}};
    for (const auto& row : expected) {
        DERDecodedInfo item;
        ASSERT_EQ(DERDecodeSeqNext(&extensions, &item), DERSuccess);
        DERExtension extension;
        ASSERT_EQ(DERParseSequenceContent(&item.content, DERNumExtensionItemSpecs, DERExtensionItemSpecs, &extension,
                                          sizeof extension),
                  DERSuccess);
        EXPECT_EQ(hexOf(extension.extensionID), row.id);
        EXPECT_EQ(hexOf(extension.critical), row.critical);
        EXPECT_EQ(hexOf(extension.value), "03 02 02 04");
    }
}

TEST(DERAgainstOpenSSL, publicKeyIsReadAndWrittenAlike) {
    const Key key(EVP_RSA_gen(1024));
    const Bytes spki = encodingOf<EVP_PKEY>(key.get(), i2d_PUBKEY);
    DERSubjPubKeyInfo info;
    ASSERT_EQ(parseInner(itemOf(spki), DERNumSubjPubKeyInfoItemSpecs, DERSubjPubKeyInfoItemSpecs, &info), DERSuccess);
    DERItem bits;
    std::uint8_t unused = 0;
    ASSERT_EQ(DERParseBitString(&info.publicKey, &bits, &unused), DERSuccess);
    EXPECT_EQ(unused, 0);
    EXPECT_EQ(hexOf(bits), hexOf(encodingOf<EVP_PKEY>(key.get(), i2d_PublicKey)));

    DERRSAPubKeyPKCS1 numbers;
    ASSERT_EQ(parseInner(bits, DERNumRSAPubKeyPKCS1ItemSpecs, DERRSAPubKeyPKCS1ItemSpecs, &numbers), DERSuccess);
    EXPECT_EQ(hexOf(numbers.publicExponent), "01 00 01");
    ASSERT_EQ(numbers.modulus.length, 129U);
    EXPECT_EQ(numbers.modulus.data[0], 0x00);

    // The bare number, whose highest bit is set, is written with the zero octet again.
    numbers.modulus = {numbers.modulus.data + 1, 128};
    Bytes written(bits.length);
    std::uint64_t length = written.size();
    ASSERT_EQ(DEREncodeSequence(DERTagSequence, &numbers, DERNumRSAPubKeyPKCS1ItemSpecs, DERRSAPubKeyPKCS1ItemSpecs,
                                written.data(), &length),
              DERSuccess);
    EXPECT_EQ(hexOf(written), hexOf(bits));
}

} // namespace
