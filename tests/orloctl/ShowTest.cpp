// The offline readers, from the bytes of a file to what people and programs get.
#include "tools/orloctl/ShowFile.h"

#include <cstdio>
#include <sstream>

#include "tests/orloctl/PrintedReport.h"
#include "tests/support/OpenSSLTool.h"
#include "tests/sysconfig/Blob.h"
#include "tools/makers/Img4Maker.h"
#include "tools/orloctl/LocalFiles.h"

#include <gtest/gtest.h>

namespace {

using namespace img4maker;
using nlohmann::ordered_json;
using Key = std::optional<Bytes>;

const std::string examples = TEST_EXAMPLES "/blobs/", printed = TEST_PRINTED "/";

PrintedReport show(const Bytes& file, const char* format = "", const Key& key = std::nullopt) {
    return showFile(file, format, key);
}

// A small number of a configuration blob.
Bytes number(std::uint32_t value) {
    return item(DERTagInteger, {static_cast<std::uint8_t>(value), static_cast<std::uint8_t>(value >> 8), 0, 0});
}

Bytes blob(const List& payload, const List& metadata = {}) {
    return BlobParts{.payload = set(payload), .metadata = set(metadata)}.whole();
}

Bytes manifestOf(const Bytes& body, std::uint64_t version = 0, const List& chain = {}) {
    return sequence({ia5("IM4M"), integer(version), body, octets({1}), sequence(chain)});
}

Bytes payloadOf(const List& tail, const char* magic = "IM4P") {
    return sequence({ia5(magic), ia5("sepi"), ia5("1"), octets({1}), join(tail)});
}

Bytes inRestoreInfo(const Bytes& element) {
    return container(payload({}), {}, restoreInfo({element}));
}

// A property in the restore information with that inside its tag.
Bytes holding(const Bytes& content) {
    return inRestoreInfo(item(propertyTag("test"), content));
}

Bytes withValue(const Bytes& value) {
    return inRestoreInfo(property("test", value));
}

Bytes textOf(std::string_view text) {
    return {text.begin(), text.end()};
}

TEST(Show, printsForPeopleWhatAFileHolds) {
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
        Key key = std::nullopt;
    } rows[] = {
        {"blob.txt", readLocalFile(examples + "every-kind.bin")},
        {"blob-with-key.txt", readLocalFile(examples + "bCfg-30002.bin"), readLocalFile(examples + "hmac-key.bin")},
        {"container.txt", exampleContainer()},
        {"items.txt", everyTag},
    };
    for (const auto& row : rows) {
        const PrintedReport report = show(row.file, "", row.key);
        const Bytes expected = readLocalFile(printed + row.expected);
        EXPECT_TRUE(report.ok()) << report.problem;
        EXPECT_EQ(report.text, std::string(expected.begin(), expected.end()));
    }
    const ordered_json forPrograms = show(everyTag).json["items"][0]["items"];
    EXPECT_EQ(forPrograms[6]["value"].get<std::string>().size(), 400U) << "whole";
    EXPECT_EQ(forPrograms[10]["value"], "9007199254740993") << "no double holds it";
    EXPECT_EQ(show(rows[1].file).json["hmacState"], "not checked, for want of a key");
}

// Expects the items, each at the start of one of the lines of `openssl asn1parse`.
void expectItems(const ordered_json& items, int depth, std::istream& lines) {
    for (const ordered_json& item : items) {
        char shown[64];
        std::string line;
        std::snprintf(shown, sizeof shown, "%5d:d=%-2d hl=%d l=%4d %s: ", item["offset"].get<int>(), depth,
                      item["headerLength"].get<int>(), item["contentLength"].get<int>(),
                      item["constructed"].get<bool>() ? "cons" : "prim");
        std::getline(lines, line);
        EXPECT_TRUE(line.starts_with(shown)) << line << "\n" << shown;
        if (item.contains("items"))
            expectItems(item["items"], depth + 1, lines);
    }
}

TEST(Show, agreesWithOpenSSLOnEveryItem) {
    const Bytes files[] = {
        exampleContainer(),
        sequence({octets(filler(70000)), item(5, {}), item(DERTagObjectIdentifier, {0x2A, 0x86, 0x48}), set({})}),
        join({integer(1), sequence({boolean(true)})}),
        item(DERTagContextConstructed(40), item(DERTagContextPrimitive(200), {1})),
    };
    for (const Bytes& file : files) {
        const PrintedReport report = show(file, "der");
        EXPECT_TRUE(report.ok()) << report.problem;
        std::istringstream lines(asn1parse({reinterpret_cast<const char*>(file.data()), file.size()}));
        expectItems(report.json["items"], 0, lines);
        EXPECT_EQ(lines.peek(), EOF);
    }
}

TEST(Show, findsOutTheFormat) {
    const struct {
        const char* format;
        Bytes file;
        const char* kind = "";
    } rows[] = {
        {"img4", exampleTicket(), "manifest"},
        {"img4", unsignedManifest({}), "unsigned manifest"},
        {"img4", payload({}), "payload"},
        {"der", sequence({ia5("IMG5")})},
        {"der", sequence({number(1), number(2), set({})})},
        {"der", sequence({})},
        {"der", {}},
        {"pem", textOf("-----BEGIN CERTIFICATE-----\nMIIB\n")},
        {"der", octets(textOf("-----BEGIN "))},
        {"der", sequence({ia5("x\n-----BEGIN ")})},
    };
    for (const auto& row : rows) {
        const PrintedReport report = show(row.file);
        EXPECT_EQ(report.json["format"], row.format);
        EXPECT_EQ(report.json.value("kind", ""), row.kind);
        EXPECT_TRUE(report.ok() || *row.kind == '\0') << report.problem;
    }
}

struct ProblemCase {
    const char* format;
    const char* problem;
    Bytes file;
    Key key = std::nullopt;
};

const ProblemCase problemCases[] = {
    {"", "with openssl, at offset 15.", textOf("subject=CN = x\n-----BEGIN X-----\n" + std::string(200, 'A') + "\n")},

    {"der", "There are no octets, at offset 0.", {}},
    {"der", "the length is not in its shortest form, at offset 3.", {0x30, 0x03, 0x04, 0x81, 0x00}},
    {"der", "the length takes 9 octets, and at most 8 are", {0x04, 0x89, 1, 2, 3, 4, 5, 6, 7, 8, 9}},
    {"der", "the content is cut short: 1 of 5 octets are there, at offset 3.", {0x04, 0x05, 0x00}},
    {"der", "a BOOLEAN is 00 or FF, and this one is 01, at offset 4.", {0x30, 0x03, 0x01, 0x01, 0x01}},
    {"der", "the length of BOOLEAN is never 0, at offset 2.", {0x01, 0x00}},
    {"der", "the number is not in its shortest form, at offset 2.", {0x02, 0x02, 0xFF, 0x80}},
    {"der", "the length of INTEGER is never 0, at offset 2.", {0x02, 0x00}},
    {"der", "the length of NULL is never 1, at offset 2.", {0x05, 0x01, 0x00}},
    {"der", "the length of BIT STRING is never 0, at offset 2.", {0x03, 0x00}},
    {"der", "the length of OBJECT IDENTIFIER is never 0, at offset 2.", {0x06, 0x00}},
    {"der", "the count of unused bits is 8, at offset 2.", {0x03, 0x02, 0x08, 0x00}},
    {"der", "the count of unused bits is 1, at offset 2.", {0x03, 0x01, 0x01}},
    {"der", "the unused bits are not zero, at offset 3.", {0x03, 0x02, 0x03, 0xF9}},
    {"der", "a component is not in its shortest form, at offset 3.", {0x06, 0x03, 0x2A, 0x80, 0x01}},
    {"der", "a component is not in its shortest form, at offset 2.", {0x06, 0x02, 0x80, 0x01}},
    {"der", "the last component is cut short, at offset 3.", {0x06, 0x02, 0xAA, 0x80}},
    {"der", "DER has OCTET STRING in primitive form only", {0x24, 0x02, 0x04, 0x00}},
    {"der", "DER has SEQUENCE in constructed form only", {0x10, 0x00}},
    {"der", "no universal type with the number 0", {0x00, 0x00}},
    {"der", "in the item at offset 4: the last component is", {0x30, 0x05, 0x05, 0x00, 0x06, 0x01, 0xAA}},

    {"img4", "The file is SET instead of SEQUENCE, at offset 0.", set({ia5("IMG4")})},
    {"img4", "The file is no strict DER: the length is indefinite", {0x30, 0x80, 0x00, 0x00}},
    {"img4", "\"IM4R\" instead of \"IMG4\", \"IM4P\" or \"IM4M\", at offset 2.", sequence({ia5("IM4R"), set({})})},
    {"img4", "begins with no four-character magic", sequence({integer(1)})},
    {"img4", "Octets follow the manifest, at offset ", join({exampleTicket(), {0}})},
    {"img4", "The container ends before its payload, at offset 8.", sequence({ia5("IMG4")})},
    {"img4", "The container has context [0] instead of SEQUENCE as its", sequence({ia5("IMG4"), context(0, {})})},
    {"img4", "The container holds INTEGER behind its last field", sequence({ia5("IMG4"), payload({}), integer(1)})},
    {"img4", "The uncompressed size does not fit 32 bits", payloadOf({compression(1, 0x100000000)})},
    {"img4", "The magic is \"PAYQ\" instead of", payloadOf({context(0, sequence({ia5("PAYQ"), set({})}))})},
    {"img4", "The magic is \"IM4X\" instead of \"IM4R\"",
     sequence({ia5("IMG4"), payload({}), context(1, sequence({ia5("IM4X"), set({})}))})},
    {"img4", "The manifest version is no non-negative INTEGER in its shortest form, at offset 10.",
     sequence({ia5("IM4M"), item(DERTagInteger, {0x80}), manifestBody({}), octets({}), sequence({})})},
    {"img4", "The manifest version is 3, and 2 is the last, at offset 10.", manifestOf(manifestBody({}), 3)},
    {"img4", "The manifest has SEQUENCE instead of SET as its body, at offset 11.", manifestOf(sequence({}))},
    {"img4", "The manifest's body has a \"MANB\" that is SET instead of SEQUENCE, so", manifestOf(manifestBody({}), 2)},
    {"img4", "\"MANB\" has no \"MANP\", so that every lookup fails", manifestOf(set({property("MANB", set({}))}))},
    {"img4", "\"MANB\" has an element that is no strict DER: the header",
     manifestOf(set({property("MANB", set({{0x30}}))}))},
    {"img4", "Certificate 0 of the chain is INTEGER instead of SEQUENCE",
     manifestOf(manifestBody({}), 0, {integer(1)})},
    {"img4", "Certificate 1 of the chain is no strict DER in the item at offset ",
     manifestOf(manifestBody({}), 0, {sequence({}), {0x30, 0x05}})},
    {"img4", "\"INTEGER\" of the restore information is no property", inRestoreInfo(integer(1))},
    {"img4", "is named \"tset\" inside", holding(sequence({ia5("tset"), integer(1)}))},
    {"img4", "has no four-character name inside", holding(sequence({integer(1)}))},
    {"img4", "has a content that ends before its value", holding(sequence({ia5("test")}))},
    {"img4", "has a content that holds an item behind", holding(sequence({ia5("test"), integer(1), integer(2)}))},
    {"img4", "goes on behind the SEQUENCE of name and", holding(join({sequence({ia5("test"), integer(1)}), {0}}))},
    {"img4", "\"the rest\" of the restore information is no strict DER: the header", inRestoreInfo({0x30})},
    {"img4", "\"tes2\" of \"test\" has a value that is", withValue(sequence({property("tes2", item(0x01, {2}))}))},
    {"img4", "is no non-negative INTEGER in its shortest form", withValue(item(DERTagInteger, {0x80}))},

    {"bcfg", "The HMACs do not match the entries", readLocalFile(examples + "bCfg-30002.bin"), Bytes(32, 7)},
    {"bcfg", "The file is empty, at offset 0.", {}},
    {"bcfg", "The blob has IA5String instead of INTEGER as its version", sequence({number(1), ia5("x")})},
    {"bcfg", "Sysconfig magic 0x1 is not valid, at offset 4.", BlobParts{.magic = bytes("01 00 00 00")}.whole()},
    {"bcfg", "The payload entry is no strict DER in the item at offset 23: the header", blob({{0x30}})},
    {"bcfg", "The payload entry has a deleted flag that is no DER BOOLEAN, at offset 23.",
     blob({sequence({number(1), ia5(""), item(DERTagBoolean, {1})})})},
    {"bcfg", "The payload entry has SET instead of INTEGER as its key, at offset 36.",
     blob({sequence({number(1), ia5(""), octets({1})}), sequence({set({})})})},
};

TEST(Show, saysWhatIsWrongAndWhere) {
    for (const ProblemCase& row : problemCases) {
        const PrintedReport report = show(row.file, row.format, row.key);
        EXPECT_EQ(report.outcome, Outcome::BadInput) << row.problem;
        EXPECT_NE(report.problem.find(row.problem), std::string::npos) << row.problem << "\n" << report.problem;
        EXPECT_LE(report.json.value("problemOffset", 0U), row.file.size()) << row.problem;
    }
}

// The first fault is the problem.
TEST(Show, showsWhatStandsAroundAFault) {
    const PrintedReport report =
        show(sequence({item(DERTagInteger, {0x00, 0x07}), item(DERTagBoolean, {0x01}), {0x04, 0x80}}));
    EXPECT_EQ(report.json["problemOffset"], 4);
    EXPECT_TRUE(
        report.says("       2    2        2    INTEGER 7  not DER: the number is not in its shortest form\n"
                    "       6    2        1    BOOLEAN true  not DER: a BOOLEAN is 00 or FF, and this one is 01\n"
                    "       9  not DER: the length is indefinite"))
        << report.text;
    const PrintedReport behind = show(join({payload({}), {1, 2, 3}}));
    EXPECT_TRUE(behind.ok());
    EXPECT_TRUE(behind.says("followed by octets that belong to nothing, 3 of them, at offset "));
    EXPECT_TRUE(show(item(DERTagObjectIdentifier, Bytes(100, 0x7F))).says("OBJECT IDENTIFIER 7f7f")); // too long
    EXPECT_TRUE(show(payload({.data = {}})).says("data is empty, so that the payload counts as absent"));
    const PrintedReport twice = show(inRestoreInfo(join({property("test", integer(1)), property("test", integer(2))})));
    EXPECT_TRUE(twice.ok());
    EXPECT_TRUE(twice.says("\n    test  INTEGER 1\n    test  INTEGER 2  hidden behind an earlier one"));
}

TEST(Show, boundsDepthAndNumberForPeople) {
    Bytes items, properties = property("test", integer(1)), nested;
    for (int i = 0; i < 64; ++i) {
        nested = sequence({nested});
        properties = property("test", set({properties}));
    }
    EXPECT_TRUE(show(nested).ok());
    EXPECT_NE(show(sequence({nested})).problem.find("deeper than 64 levels"), std::string::npos);
    const PrintedReport deep = show(inRestoreInfo(properties));
    EXPECT_TRUE(deep.ok());
    EXPECT_TRUE(deep.says("\n" + std::string(4 + 2 * 8, ' ') + "test  SET, ")) << "whole at the eighth level";

    for (int i = 0; i < 10002; ++i)
        items.insert(items.end(), {0x05, 0x00});
    EXPECT_NE(linesOf(showFile(items, "der", {})).find("\n  ... and 2 more\n"), std::string::npos);
    items.push_back(0x05);
    EXPECT_FALSE(showFile(items, "der", {}).ok()) << "items that are not shown are checked all the same";
    const Bytes many = inRestoreInfo(join(List(10500, property("test", integer(1)))));
    EXPECT_NE(linesOf(showFile(many, "img4", {})).find("... and 500 more"), std::string::npos);

    List entries;
    for (std::uint32_t key = 1; key <= 1005; ++key)
        entries.push_back(sequence({number(key), ia5(""), octets(filler(100))}));
    const List neitherDataNorString(150, sequence({ia5("key")}));
    const PrintedReport report = show(join({blob(entries, neitherDataNorString), {1, 2, 3}}));
    EXPECT_TRUE(report.ok()) << report.problem;
    EXPECT_EQ(report.json["payload"].size(), 1005U);
    EXPECT_EQ(report.json["payload"].back()["data"].get<std::string>().size(), 200U);
    EXPECT_EQ(report.json["messages"].size(), 100U);
    EXPECT_EQ(report.json["messages"][0], "either data or string must be non-null");
    EXPECT_GE(report.json["messagesLeftOut"], 50);
    EXPECT_TRUE(report.says("  ... and 5 more\n"));
    EXPECT_TRUE(report.says("\noctetsBehind: 3\n"));
    EXPECT_LT(report.text.size(), 200'000U);
}

} // namespace
