#include "tools/orloctl/ShowFile.h"

#include <algorithm>
#include <sstream>

#include "tests/orloctl/PrintedReport.h"
#include "tests/support/OpenSSLTool.h"
#include "tools/makers/Img4Maker.h"

#include <gtest/gtest.h>

namespace {

using namespace img4maker;
using nlohmann::ordered_json;
using Report = PrintedReport;

Report show(const Bytes& bytes) {
    return printed(showDer({bytes.data(), bytes.size()}));
}

// Offset, depth, header length, content length and form of each item, a line each.
void listItems(const ordered_json& items, int depth, std::ostream& out) {
    for (const ordered_json& item : items) {
        out << item["offset"] << " " << depth << " " << item["headerLength"] << " " << item["contentLength"] << " "
            << (item["constructed"].get<bool>() ? "cons" : "prim") << "\n";
        if (item.contains("items"))
            listItems(item["items"], depth + 1, out);
    }
}

// The same from the lines of `openssl asn1parse`, such as "   12:d=1  hl=2 l=   3 prim:  OCTET STRING".
std::string listOfOpenSSL(const std::string& output) {
    constexpr const char* digits = "0123456789";
    std::istringstream lines(output);
    std::ostringstream out;
    for (std::string line; std::getline(lines, line);) {
        std::size_t end = 0;
        for (int number = 0; number < 4; ++number) {
            const std::size_t begin = std::min(line.find_first_of(digits, end), line.size());
            end = std::min(line.find_first_not_of(digits, begin), line.size());
            out << line.substr(begin, end - begin) << " ";
        }
        out << line.substr(std::min(end + 1, line.size()), 4) << "\n";
    }
    return out.str();
}

TEST(ShowDer, agreesWithOpenSSLOnEveryItem) {
    const Bytes longContent = octets(filler(70000));
    const Bytes files[] = {
        exampleTicket(),
        exampleContainer(),
        largeManifest(50),
        sequence({longContent, item(5, {}), item(DERTagObjectIdentifier, {0x2A, 0x86, 0x48}), set({})}),
        join({integer(1), sequence({boolean(true)})}),
        item(DERTagContextConstructed(40), item(DERTagContextPrimitive(200), {1})),
    };
    for (const Bytes& file : files) {
        const Report report = show(file);
        EXPECT_TRUE(report.ok()) << report.problem;
        std::ostringstream items;
        listItems(report.json["items"], 0, items);
        EXPECT_EQ(items.str(), listOfOpenSSL(asn1parse(file)));
    }
}

TEST(ShowDer, spellsTagsAndValues) {
    const Bytes file = sequence({
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
    const Report report = show(file);
    ASSERT_TRUE(report.ok()) << report.problem;
    const ordered_json& items = report.json["items"].at(0)["items"];
    EXPECT_EQ(items[0]["value"], true);
    EXPECT_EQ(items[1]["value"], "18446744073709551615");
    EXPECT_EQ(items[2]["value"], -128);
    EXPECT_EQ(items[3]["value"], "1.2.840.113549");
    EXPECT_EQ(items[4]["value"], "2.999");
    EXPECT_EQ(items[5]["value"], "a\"b\\x5c\\x0a");
    EXPECT_EQ(items[6]["value"].get<std::string>().size(), 400U) << "whole";
    EXPECT_EQ(items[7]["tag"], "private \"sepi\"");
    EXPECT_EQ(items[8]["tag"], "private [16909060]");
    EXPECT_EQ(items[9]["tag"], "context [2]");
    EXPECT_EQ(items[10]["value"], "9007199254740993") << "no double holds it";
    EXPECT_NE(report.text.find("private \"sepi\"\n"), std::string::npos) << report.text;
    EXPECT_NE(report.text.find("IA5String a\"b\\x5c\\x0a\n"), std::string::npos) << report.text;
    EXPECT_EQ(report.text.find(items[6]["value"].get<std::string>()), std::string::npos) << "shortened";
}

struct FaultCase {
    const char* reason;
    Bytes bytes;
    std::uint64_t offset;
};

const FaultCase faultCases[] = {
    {"There are no octets", {}, 0},
    {"the header is cut short", {0x30}, 1},
    {"the length is indefinite", {0x30, 0x80, 0x00, 0x00}, 1},
    {"the length is not in its shortest form", {0x30, 0x03, 0x04, 0x81, 0x00}, 3},
    {"the length is not in its shortest form", {0x04, 0x82, 0x00, 0x90}, 1},
    {"the length takes 9 octets", {0x04, 0x89, 1, 2, 3, 4, 5, 6, 7, 8, 9}, 1},
    {"the header is cut short", {0x04, 0x82, 0x01}, 3},
    {"the content is cut short: 1 of 5 octets are there", {0x04, 0x05, 0x00}, 3},
    {"the tag number begins with a zero digit", {0x1F, 0x80, 0x01, 0x00}, 1},
    {"the tag number fits one octet", {0x1F, 0x1E, 0x00}, 1},
    {"the tag number does not fit 61 bits", {0xFF, 0xA0, 0x80, 0x80, 0x80, 0x80, 0x80, 0x80, 0x80, 0x00, 0x00}, 9},
    {"the header is cut short", {0xFF, 0x84, 0xEA}, 3},
    {"a BOOLEAN is 00 or FF, and this one is 01", {0x30, 0x03, 0x01, 0x01, 0x01}, 4},
    {"a BOOLEAN has one octet", {0x01, 0x00}, 2},
    {"the number is not in its shortest form", {0x02, 0x02, 0x00, 0x7F}, 2},
    {"the number is not in its shortest form", {0x02, 0x02, 0xFF, 0x80}, 2},
    {"the number has no octets", {0x02, 0x00}, 2},
    {"a NULL has no content", {0x05, 0x01, 0x00}, 2},
    {"the count of unused bits is 8", {0x03, 0x02, 0x08, 0x00}, 2},
    {"the unused bits are not zero", {0x03, 0x02, 0x03, 0xF9}, 3},
    {"a BIT STRING has at least one octet", {0x03, 0x00}, 2},
    {"an identifier has at least one octet", {0x06, 0x00}, 2},
    {"a component is not in its shortest form", {0x06, 0x03, 0x2A, 0x80, 0x01}, 3},
    {"the last component is cut short", {0x06, 0x02, 0x2A, 0x86}, 3},
    {"DER has OCTET STRING in primitive form only", {0x24, 0x02, 0x04, 0x00}, 2},
    {"DER has SEQUENCE in constructed form only", {0x10, 0x00}, 2},
    {"no universal type with the number 0", {0x00, 0x00}, 2},
};

TEST(ShowDer, saysWhereAndWhyStrictDEREnds) {
    for (const FaultCase& row : faultCases) {
        const Report report = show(row.bytes);
        EXPECT_FALSE(report.ok()) << row.reason;
        EXPECT_NE(report.problem.find(row.reason), std::string::npos) << row.reason << ": " << report.problem;
        EXPECT_EQ(report.json["problemOffset"], row.offset) << row.reason;
    }
}

TEST(ShowDer, showsWhatComesBeforeAFault) {
    const Report report = show(sequence({integer(7), item(DERTagBoolean, {0x01}), {0x04, 0x80}}));
    EXPECT_NE(report.problem.find("offset 7"), std::string::npos) << "the first fault: " << report.problem;
    const ordered_json& items = report.json["items"].at(0)["items"];
    ASSERT_EQ(items.size(), 3U);
    EXPECT_EQ(items[0]["value"], 7);
    EXPECT_TRUE(items[1].contains("fault"));
    EXPECT_FALSE(items[2].contains("tag"));
}

TEST(ShowDer, boundsDepthAndNumber) {
    Bytes nested;
    for (int i = 0; i < 1000; ++i)
        nested = sequence({nested});
    const Report deep = show(nested);
    EXPECT_FALSE(deep.ok());
    EXPECT_NE(deep.problem.find("deeper than 64 levels"), std::string::npos) << deep.problem;

    Bytes many;
    for (int i = 0; i < 60000; ++i)
        many.insert(many.end(), {0x05, 0x00});
    const Report wide = show(many);
    EXPECT_TRUE(wide.ok());
    EXPECT_EQ(wide.json["items"].size(), 60000U);
    EXPECT_NE(wide.text.find("... and 50000 more\n"), std::string::npos);
    many.push_back(0x05);
    EXPECT_FALSE(show(many).ok()) << "items that are not shown are checked all the same";
}

TEST(ShowDer, survivesEveryPrefixAndFlippedBit) {
    Payload small;
    small.data = filler(8);
    const Bytes container = img4maker::container(payload(small), {}, restoreInfo({property("rcnt", integer(3))}));
    for (std::size_t length = 0; length < container.size(); ++length) {
        const Report report = show(Bytes(container.begin(), container.begin() + static_cast<std::ptrdiff_t>(length)));
        EXPECT_FALSE(report.ok());
        EXPECT_LE(report.json["problemOffset"], length);
    }
    Bytes flipped = container;
    for (std::size_t bit = 0; bit < flipped.size() * 8; ++bit) {
        const auto mask = static_cast<std::uint8_t>(1U << (bit % 8));
        flipped[bit / 8] ^= mask;
        const Report report = show(flipped);
        EXPECT_EQ(report.ok(), report.problem.empty());
        EXPECT_FALSE(report.json.dump().empty());
        flipped[bit / 8] ^= mask;
    }
}

} // namespace
