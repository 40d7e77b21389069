#include "img4/Img4.h"
#include "tests/orloctl/PrintedReport.h"
#include "tools/makers/Img4Maker.h"
#include "tools/orloctl/ShowFile.h"

#include <gtest/gtest.h>

namespace {

using namespace img4maker;
using Report = PrintedReport;

Report show(const Bytes& bytes) {
    return showImg4({bytes.data(), bytes.size()});
}

Bytes manifestOf(const Bytes& body, std::uint64_t version = 0, const List& chain = {}) {
    return sequence({ia5("IM4M"), integer(version), body, octets({1}), sequence(chain)});
}

Bytes payloadOf(const List& tail) {
    return sequence({ia5("IM4P"), ia5("sepi"), ia5("1"), octets({1}), join(tail)});
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

struct ProblemCase {
    const char* problem;
    Bytes bytes;
};

const ProblemCase problemCases[] = {
    {"The file is empty, at offset 0.", {}},
    {"The file is SET instead of SEQUENCE, at offset 0.", set({ia5("IMG4")})},
    {"The file is no strict DER: the length is indefinite", {0x30, 0x80, 0x00, 0x00}},
    {"begins with \"IM4R\" instead of \"IMG4\", \"IM4P\" or \"IM4M\", at offset 2.", sequence({ia5("IM4R"), set({})})},
    {"begins with no four-character magic", sequence({integer(1)})},
    {"Octets follow the manifest, at offset ", join({exampleTicket(), {0}})},
    {"The container ends before its payload, at offset 8.", sequence({ia5("IMG4")})},
    {"The container has context [0] instead of SEQUENCE as its payload", sequence({ia5("IMG4"), context(0, {})})},
    {"The container holds INTEGER behind its last field", sequence({ia5("IMG4"), payload({}), integer(1)})},
    {"The magic is \"IM4Q\" instead of \"IM4P\"",
     sequence({ia5("IMG4"), sequence({ia5("IM4Q"), ia5("sepi"), ia5("1"), octets({1})})})},
    {"The compression algorithm is 2, and 1 is the last", payloadOf({compression(2, 1)})},
    {"The uncompressed size does not fit 32 bits", payloadOf({compression(1, 0x100000000)})},
    {"The magic is \"PAYQ\" instead of \"PAYP\"", payloadOf({context(0, sequence({ia5("PAYQ"), set({})}))})},
    {"The manifest version is 3, and 2 is the last, at offset 10.", manifestOf(manifestBody({}), 3)},
    {"The manifest has SEQUENCE instead of SET as its body, at offset 11.", manifestOf(sequence({}))},
    {"The manifest's body has a \"MANB\" that is SET instead of SEQUENCE, so", manifestOf(manifestBody({}), 2)},
    {"\"MANB\" has no \"MANP\", so that every lookup fails", manifestOf(set({property("MANB", set({}))}))},
    {"Certificate 1 of the chain is no strict DER in the item at offset ",
     manifestOf(manifestBody({}), 0, {sequence({}), {0x30, 0x05}})},
    {"Certificate 0 of the chain is SET instead of SEQUENCE", manifestOf(manifestBody({}), 0, {set({})})},
    {"\"INTEGER\" of the restore information is no property", inRestoreInfo(integer(1))},
    {"is named \"tset\" inside", holding(sequence({ia5("tset"), integer(1)}))},
    {"has no four-character name inside", holding(sequence({integer(1)}))},
    {"has a content that ends before its name", holding(sequence({}))},
    {"has a content that ends before its value", holding(sequence({ia5("test")}))},
    {"has a content that holds an item behind its last field",
     holding(sequence({ia5("test"), integer(1), integer(2)}))},
    {"goes on behind the SEQUENCE of name and value", holding(join({sequence({ia5("test"), integer(1)}), {0}}))},
    {"has a content that is SET instead of SEQUENCE", holding(set({}))},
    {"has a content that is no strict DER: the header is cut short", holding({0x30})},
    {"\"the rest\" of the restore information is no strict DER: the header is cut short", inRestoreInfo({0x30})},
    {"\"tes2\" of \"test\" has a value that is not DER", withValue(set({property("tes2", item(0x01, {2}))}))},
    {"is no non-negative INTEGER in its shortest form", withValue(item(DERTagInteger, {0x80}))},
    {"does not fit 64 bits", withValue(item(DERTagInteger, filler(9, 1)))},
};

TEST(ShowImg4, saysWhatIsWrongAndWhere) {
    for (const ProblemCase& row : problemCases) {
        const Report report = show(row.bytes);
        EXPECT_FALSE(report.ok()) << row.problem;
        EXPECT_NE(report.problem.find(row.problem), std::string::npos) << row.problem << "\n" << report.problem;
    }
}

TEST(ShowImg4, notesWhatTheDecoderPassesOver) {
    const Report behind = show(join({payload({}), {1, 2, 3}}));
    EXPECT_TRUE(behind.ok());
    EXPECT_TRUE(behind.says("followed by octets that belong to nothing, 3 of them, at offset "));
    const Report twice = show(inRestoreInfo(join({property("test", integer(1)), property("test", integer(2))})));
    EXPECT_TRUE(twice.ok());
    EXPECT_TRUE(twice.says("\n    test  INTEGER 1\n    test  INTEGER 2  hidden behind an earlier one"));
}

TEST(ShowImg4, boundsPropertiesAndNesting) {
    const Report wide = show(container(payload({}), {}, restoreInfo(List(10500, property("test", integer(1))))));
    EXPECT_EQ(wide.json["restoreInfo"]["properties"].size(), 10500U);
    EXPECT_TRUE(wide.says("... and 500 more"));
    Bytes nested = property("test", integer(1));
    for (int i = 0; i < 500; ++i)
        nested = property("test", set({nested}));
    EXPECT_TRUE(show(inRestoreInfo(nested)).ok());
}

// The verdict is the decoder's, and a file that answers otherwise is shown otherwise.
TEST(ShowImg4, everyPrefixAndFlippedBitIsRefusedOrShown) {
    Payload small;
    small.data = filler(8);
    const Bytes whole = container(payload(small), {}, restoreInfo({property("rcnt", integer(3))}));
    const std::string sound = show(whole).text;
    for (std::size_t length = 0; length < whole.size(); ++length)
        EXPECT_FALSE(show({whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(length)}).ok()) << length;
    for (std::size_t bit = 0; bit < whole.size() * 8; ++bit) {
        Bytes flipped = whole;
        flipped[bit / 8] ^= static_cast<std::uint8_t>(1U << (bit % 8));
        const Report report = show(flipped);
        Img4Record record;
        EXPECT_TRUE(!report.ok() || Img4DecodeInit(flipped.data(), flipped.size(), &record) == DERSuccess) << bit;
        EXPECT_TRUE(!report.ok() || report.text != sound) << bit;
        EXPECT_LE(report.json.value("problemOffset", 0U), whole.size());
    }
}

} // namespace
