#include "tools/orloctl/ShowFile.h"

#include "tests/orloctl/PrintedReport.h"
#include "tools/makers/Img4Maker.h"
#include "tools/orloctl/LocalFiles.h"

#include <gtest/gtest.h>

namespace {

using namespace img4maker;
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

Report show(const Bytes& file, const std::optional<Bytes>& key = std::nullopt) {
    return showFile(file, "", key);
}

Bytes textOf(std::string_view text) {
    return {text.begin(), text.end()};
}

const std::string examples = TEST_EXAMPLES, printed = TEST_PRINTED;

TEST(ShowFile, printsForPeopleWhatAFileHolds) {
    const Bytes everyTag = sequence({
        boolean(true),
        integer(0xFFFFFFFFFFFFFFFF),
        item(DERTagInteger, {0x80}),
        item(DERTagObjectIdentifier, {0x2A, 0x86, 0x48, 0x86, 0xF7, 0x0D}),
        item(DERTagObjectIdentifier, {0x88, 0x37}),
        ia5("a\"b\\\n"),
        octets(filler(200)),
        item(propertyTag("sepi"), {}),
        item(DERTagPrivateConstructed(0x01020304), {}),
        item(DERTagContextConstructed(2), {}),
        integer((std::uint64_t{1} << 53) + 1),
    });
    const struct {
        const char* expected;
        Bytes file;
        std::optional<Bytes> key = std::nullopt;
    } rows[] = {
        {"blob.txt", readLocalFile(examples + "/blobs/every-kind.bin")},
        {"blob-with-key.txt", readLocalFile(examples + "/blobs/bCfg-30002.bin"),
         readLocalFile(examples + "/blobs/hmac-key.bin")},
        {"container.txt", exampleContainer()},
        {"items.txt", everyTag},
    };
    for (const auto& row : rows) {
        const Report report = show(row.file, row.key);
        const Bytes expected = readLocalFile(printed + "/" + row.expected);
        EXPECT_TRUE(report.ok()) << report.problem;
        EXPECT_EQ(report.text, std::string(expected.begin(), expected.end()));
    }
    const Report forPrograms = show(everyTag);
    const auto& items = forPrograms.json["items"][0]["items"];
    EXPECT_EQ(items[6]["value"].get<std::string>().size(), 400U) << "whole";
    EXPECT_EQ(items[10]["value"], "9007199254740993") << "no double holds it";
}

TEST(ShowFile, findsOutTheFormat) {
    const struct {
        const char* format;
        Bytes file;
        const char* kind = "";
    } rows[] = {
        {"bcfg", blob({})},
        {"bcfg", sequence({number(1), number(2), item(DERTagPrivateConstructed(0x53504159), {})})},
        {"img4", exampleContainer(), "container"},
        {"img4", exampleTicket(), "manifest"},
        {"img4", unsignedManifest({}), "unsigned manifest"},
        {"img4", payload({}), "payload"},
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
    for (const auto& row : rows) {
        const Report report = show(row.file);
        EXPECT_EQ(report.json["format"], row.format);
        EXPECT_EQ(report.json.value("kind", ""), row.kind);
        EXPECT_TRUE(report.ok() || *row.kind == '\0') << report.problem;
    }
    EXPECT_NE(show(rows[12].file).problem.find("at offset 15."), std::string::npos);
}

TEST(ShowFile, saysWhyABlobIsNoneOrNotProtected) {
    const Bytes key(32, 7);
    const Bytes entry = sequence({number(1), ia5(""), octets({1})});
    const struct {
        const char* problem;
        Bytes file;
        std::optional<Bytes> key = std::nullopt;
    } rows[] = {
        {"The HMACs do not match the entries under this key.", readLocalFile(examples + "/blobs/bCfg-30002.bin"), key},
        {"The file is empty, at offset 0.", {}},
        {"The blob is SET instead of SEQUENCE, at offset 0.", set({})},
        {"The blob ends before its magic, at offset 2.", sequence({})},
        {"The blob has IA5String instead of INTEGER as its version, at offset 8.", sequence({number(1), ia5("x")})},
        {"The blob is no strict DER: the content is cut short: 0 of 3 octets are there, at offset 0.", {0x30, 0x03}},
        {"The payload entry lacks a field, at offset 23.", blob({sequence({number(1)})})},
        {"The payload entry has a field that does not belong there, at offset 36.", blob({entry, sequence({set({})})})},
    };
    for (const auto& row : rows) {
        const Report report = showFile(row.file, "bcfg", row.key);
        EXPECT_EQ(report.outcome, Outcome::BadInput);
        EXPECT_NE(report.problem.find(row.problem), std::string::npos) << row.problem << "\n" << report.problem;
    }
    EXPECT_EQ(show(readLocalFile(examples + "/blobs/bCfg-30002.bin")).json["hmacState"],
              "not checked, for want of a key");
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
    EXPECT_EQ(report.json["payload"].size(), 1005U);
    EXPECT_EQ(report.json["payload"].back()["data"].get<std::string>().size(), 200U);
    EXPECT_EQ(report.json["messages"].size(), 100U);
    EXPECT_GE(report.json["messagesLeftOut"], 50);
    EXPECT_TRUE(report.says("  ... and 5 more\n"));
    EXPECT_TRUE(report.says("\noctetsBehind: 3\n"));
    EXPECT_LT(report.text.size(), 200'000U);
}

} // namespace
