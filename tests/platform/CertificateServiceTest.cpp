#include "platform/CertificateService.h"

#include <algorithm>
#include <cstddef>
#include <string>

#include <gtest/gtest.h>

#include "tools/makers/CertificateMaker.h"

namespace {

using namespace CertificateService;
using certificatemaker::Bytes;

// The serial numbers of the certificates, in order; nothing in place of one that is none.
std::vector<std::optional<Bytes>> serialNumbers(const std::vector<CertificateRef>& certificates) {
    std::vector<std::optional<Bytes>> numbers;
    for (const CertificateRef& certificate : certificates)
        numbers.push_back(copySerialNumberData(certificate, nullptr));
    return numbers;
}

CertificateRef parse(const Bytes& bytes) {
    return createCertificateWithBytes(bytes.data(), bytes.size());
}

Bytes operator+(Bytes left, const Bytes& right) {
    left.insert(left.end(), right.begin(), right.end());
    return left;
}

// Where `part` stands in `bytes`.
std::ptrdiff_t positionOf(const Bytes& part, const Bytes& bytes) {
    return std::search(bytes.begin(), bytes.end(), part.begin(), part.end()) - bytes.begin();
}

TEST(CertificateService, theSerialNumberIsTheContentOctetsAsEncoded) {
    const Bytes numbers[] = {
        {0x00},
        {0x01},
        {0x01, 0x0A},
        {0x00, 0x80},
        {0x7F, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x01},
        {0x00, 0x9A, 0x3C, 0x5E, 0x71, 0xD2, 0x04, 0x6B, 0x88},
        Bytes{0x00} + Bytes(20, 0xFF),
        Bytes(20, 0x5A),
        {0xFF},                   // -1
        {0x80},                   // -128
        {0xFF, 0x7F},             // -129
        {0xFF, 0x00},             // -256
        {0x80, 0x00, 0x00, 0x01}, // with a borrow that does not reach the first octet
        Bytes{0xFF, 0x7F} + Bytes(18, 0x00),
    };
    for (const Bytes& number : numbers) {
        const auto made = certificatemaker::module(number);
        EXPECT_EQ(copySerialNumberData(parse(made.certificate), nullptr), number);
        const auto list = copyCertificatesFromCertsOnlyMessage(certificatemaker::certsOnlyMessage({made.certificate}));
        ASSERT_TRUE(list);
        EXPECT_EQ(serialNumbers(*list), std::vector<std::optional<Bytes>>{number});
    }
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

    // Lengths as BER has them: of indefinite form, and with an octet more than is needed, there and in what is signed.
    ASSERT_EQ(good[1], 0x82);
    const Bytes content(good.begin() + 4, good.end());
    EXPECT_FALSE(parse(Bytes{0x30, 0x80} + content + Bytes{0x00, 0x00}));
    EXPECT_FALSE(parse(Bytes{0x30, 0x83, 0x00, good[2], good[3]} + content));
    ASSERT_EQ(content[1], 0x81);
    ASSERT_LT(good[3], 0xFF);
    const Bytes signedContent(content.begin() + 2, content.end());
    EXPECT_FALSE(parse(Bytes{0x30, 0x82, good[2], std::uint8_t(good[3] + 1), 0x30, 0x82, 0x00} + signedContent));

    Bytes padded = good;
    const auto serialNumber = padded.begin() + positionOf({0x02, 0x02, 0x01, 0x80}, good);
    serialNumber[2] = 0x00; // a zero that the number 1 does not need
    serialNumber[3] = 0x01;
    EXPECT_FALSE(parse(padded));

    std::optional<Error> error;
    EXPECT_FALSE(copySerialNumberData(nullptr, &error));
    EXPECT_TRUE(error && !error->text.empty());
}

TEST(CertificateService, certificatesComeInTheOrderOfTheMessage) {
    const Bytes first = certificatemaker::module({0x01}).certificate;
    const Bytes second = certificatemaker::module({0x02}, certificatemaker::KeyKind::RSA2048).certificate;
    const Bytes sorted = certificatemaker::certsOnlyMessage({second, first});
    const auto inOrder = copyCertificatesFromCertsOnlyMessage(sorted);
    ASSERT_TRUE(inOrder);
    // DER sorts a SET OF by encoding, so that the shorter one comes first; a message that does not is read as it
    // stands.
    EXPECT_EQ(serialNumbers(*inOrder), (std::vector<std::optional<Bytes>>{Bytes{0x01}, Bytes{0x02}}));
    Bytes swapped = sorted;
    std::rotate(swapped.begin() + positionOf(first, sorted), swapped.begin() + positionOf(second, sorted),
                swapped.begin() + positionOf(second, sorted) + static_cast<std::ptrdiff_t>(second.size()));
    const auto reversed = copyCertificatesFromCertsOnlyMessage(swapped);
    ASSERT_TRUE(reversed);
    EXPECT_EQ(serialNumbers(*reversed), (std::vector<std::optional<Bytes>>{Bytes{0x02}, Bytes{0x01}}));
}

TEST(CertificateService, onlyASignedDataWithoutSignersIsACertificatesOnlyMessage) {
    const auto made = certificatemaker::module({0x05});
    const Bytes good = certificatemaker::certsOnlyMessage({made.certificate});
    const Bytes none = certificatemaker::certsOnlyMessage({});
    ASSERT_TRUE(copyCertificatesFromCertsOnlyMessage(none));
    EXPECT_TRUE(copyCertificatesFromCertsOnlyMessage(none)->empty());

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
