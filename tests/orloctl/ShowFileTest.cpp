#include "tools/orloctl/ShowFile.h"

#include "tests/orloctl/PrintedReport.h"
#include "tools/makers/Img4Maker.h"

#include <gtest/gtest.h>

namespace {

using namespace img4maker;
using nlohmann::ordered_json;
using Report = PrintedReport;

Bytes number(std::uint32_t value) {
    return item(DERTagInteger, {static_cast<std::uint8_t>(value), static_cast<std::uint8_t>(value >> 8),
                                static_cast<std::uint8_t>(value >> 16), static_cast<std::uint8_t>(value >> 24)});
}

Bytes blob(const List& payload, const List& metadata = {}) {
    return sequence({number(0x62436667), number(0x30003), item(DERTagPrivateConstructed(0x53504159), set(payload)),
                     item(DERTagPrivateConstructed(0x4D455441), set(metadata)),
                     item(DERTagPrivateConstructed(0x4D414E49), sequence({octets({}), octets({}), octets({})}))});
}

Report show(const Bytes& file) {
    return printed(showFile(file, "", std::nullopt));
}

Bytes textOf(std::string_view text) {
    return {text.begin(), text.end()};
}

TEST(ShowFile, findsOutTheFormat) {
    const struct {
        const char* format;
        Bytes file;
    } rows[] = {
        {"bcfg", blob({})},
        {"bcfg", sequence({number(1), number(2), item(DERTagPrivateConstructed(0x53504159), {})})},
        {"img4", exampleContainer()},
        {"img4", exampleTicket()},
        {"img4", payload({})},
        {"der", sequence({ia5("IMG5")})},
        {"der", sequence({number(1), number(2), set({})})},
        {"der", sequence({})},
        {"der", integer(1)},
        {"der", {}},
        {"pem", textOf("-----BEGIN CERTIFICATE-----\nMIIB\n")},
        {"pem", textOf("subject=CN = x\n-----BEGIN CERTIFICATE-----\n" + std::string(200, 'A') + "\n")},
        {"der", octets(textOf("-----BEGIN "))},
        {"der", sequence({ia5("x\n-----BEGIN ")})},
    };
    for (const auto& row : rows)
        EXPECT_EQ(show(row.file).json["format"], row.format);
    EXPECT_NE(show(rows[11].file).problem.find("at offset 15."), std::string::npos);
}

TEST(ShowFile, printsABlobWholeForProgramsAndItsBeginningForPeople) {
    List entries;
    List metadata;
    for (std::uint32_t key = 1; key <= 1005; ++key)
        entries.push_back(sequence({number(key), ia5(""), octets(filler(100))}));
    for (int i = 0; i < 150; ++i)
        metadata.push_back(sequence({ia5("key")})); // neither data nor string
    const Report report = show(join({blob(entries, metadata), {1, 2, 3}}));
    EXPECT_TRUE(report.ok()) << report.problem;
    ASSERT_EQ(report.json["payload"].size(), 1005U);
    EXPECT_EQ(report.json["payload"][1004]["data"].get<std::string>().size(), 200U);
    EXPECT_NE(report.text.find("  ... and 5 more\n"), std::string::npos);
    EXPECT_EQ(report.json["messages"].size(), 100U);
    EXPECT_GE(report.json["messagesLeftOut"], 50);
    EXPECT_NE(report.text.find("messagesLeftOut: " + report.json["messagesLeftOut"].dump() + "\n"), std::string::npos);
    EXPECT_EQ(report.json["octetsBehind"], 3);
    EXPECT_NE(report.text.find("octetsBehind: 3\n"), std::string::npos);
    EXPECT_LT(report.text.size(), 200'000U);
}

} // namespace
