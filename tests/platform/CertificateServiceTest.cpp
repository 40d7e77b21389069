#include "platform/CertificateService.h"

#include <algorithm>
#include <string>

#include <gtest/gtest.h>

#include "tools/makers/CertificateMaker.h"

namespace {

using namespace CertificateService;
using certificatemaker::Bytes;

CertificateRef parse(const Bytes& bytes) {
    return createCertificateWithBytes(bytes.data(), bytes.size());
}

Bytes operator+(Bytes left, const Bytes& right) {
    left.insert(left.end(), right.begin(), right.end());
    return left;
}

TEST(CertificateService, theSerialNumberIsTheContentOctetsAsEncoded) {
    const Bytes numbers[] = {
        {0x00},
        {0x01, 0x0A},
        {0x00, 0x80},
        Bytes(20, 0x5A),
        {0xFF},                   // -1
        {0xFF, 0x7F},             // -129
        {0xFF, 0x00},             // -256
        {0x80, 0x00, 0x00, 0x01}, // with a borrow that does not reach the first octet
    };
    for (const Bytes& number : numbers)
        EXPECT_EQ(copySerialNumberData(parse(certificatemaker::module(number).certificate), nullptr), number);
}

TEST(CertificateService, onlyAWholeCertificateIsOne) {
    const Bytes good = certificatemaker::module({0x01, 0x80}).certificate;
    ASSERT_TRUE(parse(good));
    for (std::size_t length = 0; length < good.size(); ++length)
        EXPECT_FALSE(createCertificateWithBytes(good.data(), length)) << length;
    EXPECT_FALSE(parse(good + Bytes{0x00}));
    EXPECT_FALSE(parse(good + good));
    EXPECT_FALSE(parse(certificatemaker::certsOnlyMessage({good})));
    EXPECT_FALSE(createCertificateWithBytes(nullptr, 0));

    // Lengths as BER has them: of indefinite form, and in what is signed with an octet more than is needed.
    ASSERT_EQ(good[1], 0x82);
    const Bytes content(good.begin() + 4, good.end());
    EXPECT_FALSE(parse(Bytes{0x30, 0x80} + content + Bytes{0x00, 0x00}));
    ASSERT_EQ(content[1], 0x81);
    ASSERT_LT(good[3], 0xFF);
    const Bytes signedContent(content.begin() + 2, content.end());
    EXPECT_FALSE(parse(Bytes{0x30, 0x82, good[2], std::uint8_t(good[3] + 1), 0x30, 0x82, 0x00} + signedContent));

    Bytes padded = good;
    const Bytes number = {0x02, 0x02, 0x01, 0x80};
    const auto serialNumber = std::search(padded.begin(), padded.end(), number.begin(), number.end());
    serialNumber[2] = 0x00; // a zero that the number 1 does not need
    serialNumber[3] = 0x01;
    EXPECT_FALSE(parse(padded));

    std::optional<Error> error;
    EXPECT_FALSE(copySerialNumberData(nullptr, &error));
    EXPECT_TRUE(error && !error->text.empty());
}

TEST(CertificateService, onlyASignedDataWithoutSignersIsACertificatesOnlyMessage) {
    const auto made = certificatemaker::module({0x05});
    const Bytes good = certificatemaker::certsOnlyMessage({made.certificate});
    const auto one = copyCertificatesFromCertsOnlyMessage(good);
    ASSERT_TRUE(one && one->size() == 1);
    EXPECT_EQ(copySerialNumberData(one->front(), nullptr), Bytes{0x05});
    const auto none = copyCertificatesFromCertsOnlyMessage(certificatemaker::certsOnlyMessage({}));
    EXPECT_TRUE(none && none->empty());

    const struct {
        const char* what;
        Bytes message;
    } rows[] = {
        {"empty", {}},
        {"a certificate", made.certificate},
        {"with a signer", certificatemaker::signedMessage(made)},
        {"of another type", certificatemaker::dataMessage()},
        {"with a byte after it", good + Bytes{0x00}},
        {"cut short", Bytes(good.begin(), good.end() - 1)},
        {"an OBJECT IDENTIFIER alone", {0x30, 0x0B, 0x06, 0x09, 0x2A, 0x86, 0x48, 0x86, 0xF7, 0x0D, 0x01, 0x07, 0x02}},
        {"a length without octets", {0x30, 0x84, 0x7F, 0xFF, 0xFF, 0xFF}},
    };
    for (const auto& row : rows)
        EXPECT_FALSE(copyCertificatesFromCertsOnlyMessage(row.message)) << row.what;
}

} // namespace
