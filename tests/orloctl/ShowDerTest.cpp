#include <cstdio>
#include <sstream>

#include "tests/orloctl/PrintedReport.h"
#include "tests/support/OpenSSLTool.h"
#include "tools/makers/Img4Maker.h"
#include "tools/orloctl/ShowFile.h"

#include <gtest/gtest.h>

namespace {

using namespace img4maker;
using nlohmann::ordered_json;
using Report = PrintedReport;

Report show(const Bytes& bytes) {
    return showDer({bytes.data(), bytes.size()});
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
    std::istringstream lines(output);
    std::ostringstream out;
    for (std::string line; std::getline(lines, line);) {
        int offset = 0, depth = 0, header = 0, content = 0;
        char form[5] = "";
        EXPECT_EQ(std::sscanf(line.c_str(), "%d:d=%d hl=%d l=%d %4s", &offset, &depth, &header, &content, form), 5);
        out << offset << " " << depth << " " << header << " " << content << " " << form << "\n";
    }
    return out.str();
}

TEST(ShowDer, agreesWithOpenSSLOnEveryItem) {
    const Bytes files[] = {
        exampleContainer(),
        sequence({octets(filler(70000)), item(5, {}), item(DERTagObjectIdentifier, {0x2A, 0x86, 0x48}), set({})}),
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
    {"the length takes 9 octets", {0x04, 0x89, 1, 2, 3, 4, 5, 6, 7, 8, 9}, 1},
    {"the content is cut short: 1 of 5 octets are there", {0x04, 0x05, 0x00}, 3},
    {"the tag number begins with a zero digit", {0x1F, 0x80, 0x01, 0x00}, 1},
    {"the tag number fits one octet", {0x1F, 0x1E, 0x00}, 1},
    {"the tag number does not fit 61 bits", {0xFF, 0xA0, 0x80, 0x80, 0x80, 0x80, 0x80, 0x80, 0x80, 0x00, 0x00}, 9},
    {"a BOOLEAN is 00 or FF, and this one is 01", {0x30, 0x03, 0x01, 0x01, 0x01}, 4},
    {"BOOLEAN never has 0 octets", {0x01, 0x00}, 2},
    {"the number is not in its shortest form", {0x02, 0x02, 0x00, 0x7F}, 2},
    {"the number is not in its shortest form", {0x02, 0x02, 0xFF, 0x80}, 2},
    {"INTEGER never has 0 octets", {0x02, 0x00}, 2},
    {"NULL never has 1 octets", {0x05, 0x01, 0x00}, 2},
    {"the count of unused bits is 8", {0x03, 0x02, 0x08, 0x00}, 2},
    {"the unused bits are not zero", {0x03, 0x02, 0x03, 0xF9}, 3},
    {"BIT STRING never has 0 octets", {0x03, 0x00}, 2},
    {"OBJECT IDENTIFIER never has 0 octets", {0x06, 0x00}, 2},
    {"a component is not in its shortest form", {0x06, 0x03, 0x2A, 0x80, 0x01}, 3},
    {"the last component is cut short", {0x06, 0x02, 0x2A, 0x86}, 3},
    {"DER has OCTET STRING in primitive form only", {0x24, 0x02, 0x04, 0x00}, 2},
    {"DER has SEQUENCE in constructed form only", {0x10, 0x00}, 2},
    {"no universal type with the number 0", {0x00, 0x00}, 2},
    {"in the item at offset 4: the last component is cut short", {0x30, 0x05, 0x05, 0x00, 0x06, 0x01, 0xAA}, 6},
};

TEST(ShowDer, saysWhereAndWhyStrictDEREnds) {
    for (const FaultCase& row : faultCases) {
        const Report report = show(row.bytes);
        EXPECT_FALSE(report.ok()) << row.reason;
        EXPECT_NE(report.problem.find(row.reason), std::string::npos) << row.reason << ": " << report.problem;
        EXPECT_EQ(report.json["problemOffset"], row.offset) << row.reason;
    }
}

// The first fault is the problem.
TEST(ShowDer, showsWhatStandsAroundAFault) {
    const Report report = show(sequence({integer(7), item(DERTagBoolean, {0x01}), {0x04, 0x80}}));
    EXPECT_EQ(report.json["problemOffset"], 7);
    EXPECT_TRUE(report.says("       2    2        1    INTEGER 7\n       5    2        1    BOOLEAN true  not DER: a "
                            "BOOLEAN is 00 or FF, and this one is 01\n       8  not DER: the length is indefinite"));
}

TEST(ShowDer, boundsDepthAndNumber) {
    Bytes nested;
    for (int i = 0; i < 64; ++i)
        nested = sequence({nested});
    EXPECT_TRUE(show(nested).ok());
    EXPECT_NE(show(sequence({nested})).problem.find("deeper than 64 levels"), std::string::npos);

    Bytes many;
    for (int i = 0; i < 10002; ++i)
        many.insert(many.end(), {0x05, 0x00});
    const Report wide = show(many);
    EXPECT_TRUE(wide.ok());
    EXPECT_EQ(wide.json["items"].size(), 10002U);
    EXPECT_TRUE(wide.says("\n  ... and 2 more\n"));
    many.push_back(0x05);
    EXPECT_FALSE(show(many).ok()) << "items that are not shown are checked all the same";
}

} // namespace
