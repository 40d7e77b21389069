#include "tools/orloctl/ShowFile.h"

#include "img4/Img4.h"
#include "tests/orloctl/PrintedReport.h"
#include "tests/support/Img4Answers.h"
#include "tools/makers/Img4Maker.h"

#include <gtest/gtest.h>

namespace {

using namespace img4maker;
using nlohmann::ordered_json;
using Report = PrintedReport;

Report show(const Bytes& bytes) {
    return printed(showImg4({bytes.data(), bytes.size()}));
}

// The property of that name in a list of them.
ordered_json property(const ordered_json& properties, const char* name) {
    for (const ordered_json& candidate : properties)
        if (candidate["name"] == name)
            return candidate;
    return {{"missing", name}};
}

TEST(ShowImg4, showsEverythingInAContainer) {
    const Report report = show(exampleContainer());
    ASSERT_TRUE(report.ok()) << report.problem;
    const ordered_json& json = report.json;
    EXPECT_EQ(json["kind"], "container");
    const ordered_json& payload = json["payload"];
    EXPECT_EQ(payload["type"], "sepi");
    EXPECT_EQ(payload["version"], "sepi-1.0");
    EXPECT_EQ(payload["data"]["length"], 200);
    EXPECT_EQ(payload["keybag"]["length"], 40);
    EXPECT_EQ(payload["compression"]["algorithm"], 1);
    EXPECT_EQ(payload["compression"]["uncompressedSize"], 4096);
    EXPECT_EQ(property(payload["properties"], "lodA")["value"], "18446744005107531776");
    EXPECT_EQ(property(property(payload["properties"], "vers")["properties"], "verS")["value"], "1.0.3");

    const ordered_json manb = property(json["manifest"]["body"], "MANB")["properties"];
    EXPECT_EQ(property(property(manb, "MANP")["properties"], "brdI")["value"], 12);
    EXPECT_EQ(property(property(manb, "sepi")["properties"], "eksp")["value"], true);
    EXPECT_EQ(property(property(manb, "sepi")["properties"], "dgsO")["length"], 48);
    EXPECT_EQ(property(json["restoreInfo"]["properties"], "rbig")["value"], 0x100000000U);
    EXPECT_EQ(property(json["restoreInfo"]["properties"], "nonV")["type"], "OCTET STRING");
    EXPECT_TRUE(json["notes"].empty());

    EXPECT_NE(report.text.find("eksp  BOOLEAN true"), std::string::npos) << report.text;
    EXPECT_NE(report.text.find("osvr  IA5String \"1.2.3\""), std::string::npos);
}

TEST(ShowImg4, knowsBarePartsByTheirMagic) {
    EXPECT_EQ(show(exampleTicket()).json["kind"], "manifest");
    EXPECT_EQ(show(unsignedManifest({})).json["kind"], "unsigned manifest");
    EXPECT_EQ(show(payload({})).json["kind"], "payload");
    for (const Bytes& sound : {exampleTicket(), unsignedManifest({}), payload({})})
        EXPECT_TRUE(show(sound).ok());
}

TEST(ShowImg4, digestsAreThoseOfTheDecoder) {
    const Bytes container = exampleContainer();
    const Report report = show(container);
    Img4Record record;
    Bytes hash(Img4HashLength);
    ASSERT_EQ(Img4DecodeInit(container.data(), container.size(), &record), DERSuccess);
    ASSERT_EQ(Img4DecodeCopyManifestHash(&record, hash.data(), hash.size()), DERSuccess);
    const std::string shown = report.json["manifest"]["sha1"];
    ASSERT_EQ(shown.size(), 2 * hash.size());
    for (std::size_t i = 0; i < hash.size(); ++i)
        EXPECT_EQ(std::stoul(shown.substr(2 * i, 2), nullptr, 16), hash[i]);
    EXPECT_EQ(report.json["manifest"]["sha384"].get<std::string>().size(), 96U);
    EXPECT_EQ(report.json["payload"]["length"], record.payloadRaw.length);
}

Bytes manifestOf(const Bytes& body, std::uint64_t version = 0) {
    return sequence({ia5("IM4M"), integer(version), body, octets({1}), sequence({})});
}

Bytes withProperty(const Bytes& element) {
    return restoreInfo({element});
}

Bytes payloadOf(const List& tail) {
    return sequence({ia5("IM4P"), ia5("sepi"), ia5("1"), octets({1}), join(tail)});
}

struct ProblemCase {
    const char* problem;
    Bytes bytes;
};

Bytes inRestoreInfo(const Bytes& element) {
    return container(payload({}), {}, withProperty(element));
}

Bytes named(std::string_view tag, const Bytes& content) {
    return item(propertyTag(tag), content);
}

const ProblemCase problemCases[] = {
    {"The file is empty, at offset 0.", {}},
    {"The file is no SEQUENCE but SET, at offset 0.", set({ia5("IMG4")})},
    {"The file, which begins at offset 0, is no strict DER: the length is indefinite, which DER does not allow, at "
     "offset 1.",
     {0x30, 0x80, 0x00, 0x00}},
    {"The file is no Img4: it begins with \"IM4R\" instead of \"IMG4\", \"IM4P\" or \"IM4M\", at offset 2.",
     sequence({ia5("IM4R"), set({})})},
    {"The file is no Img4: it begins with no four-character magic", sequence({integer(1)})},
    {"Octets follow the manifest, at offset ", join({exampleTicket(), {0}})},
    {"The container ends before its payload, at offset 8.", sequence({ia5("IMG4")})},
    {"The container's payload is context [0] instead of SEQUENCE, at offset 8.",
     sequence({ia5("IMG4"), context(0, {})})},
    {"The container holds INTEGER behind its last field, at offset ", sequence({ia5("IMG4"), payload({}), integer(1)})},
    {"The magic is \"IM4Q\" instead of \"IM4P\", at offset ",
     sequence({ia5("IMG4"), sequence({ia5("IM4Q"), ia5("sepi"), ia5("1"), octets({1})})})},
    {"The compression algorithm is 2, and 1 is the last, at offset ", payloadOf({compression(2, 1)})},
    {"The uncompressed size does not fit 32 bits, at offset ", payloadOf({compression(1, 0x100000000)})},
    {"The magic is \"PAYQ\" instead of \"PAYP\", at offset ",
     payloadOf({context(0, sequence({ia5("PAYQ"), set({})}))})},
    {"The manifest version is 3, and 2 is the last, at offset 10.", manifestOf(manifestBody({}), 3)},
    {"The manifest's body is SEQUENCE instead of SET, at offset 11.", manifestOf(sequence({}))},
    {"The manifest's body has a \"MANB\" that is SET instead of SEQUENCE, so that every lookup fails, at offset ",
     manifestOf(manifestBody({}), 2)},
    {"\"MANB\" has no \"MANP\", so that every lookup fails, at offset ",
     manifestOf(set({img4maker::property("MANB", set({}))}))},
    {"\"INTEGER\" of the restore information is no property, at offset ", inRestoreInfo(integer(1))},
    {"is named \"tset\" inside, at offset ", inRestoreInfo(named("test", sequence({ia5("tset"), integer(1)})))},
    {"has no four-character name inside, at offset ", inRestoreInfo(named("test", sequence({integer(1)})))},
    {"is empty inside, at offset ", inRestoreInfo(named("test", sequence({})))},
    {"has no value, at offset ", inRestoreInfo(named("test", sequence({ia5("test")})))},
    {"goes on behind its value, at offset ",
     inRestoreInfo(named("test", sequence({ia5("test"), integer(1), integer(2)})))},
    {"goes on behind the SEQUENCE of name and value, at offset ",
     inRestoreInfo(named("test", join({sequence({ia5("test"), integer(1)}), {0}})))},
    {"holds SET instead of SEQUENCE, at offset ", inRestoreInfo(named("test", set({})))},
    {"is no strict DER inside: the header is cut short, at offset ", inRestoreInfo(named("test", {0x30}))},
    {"\"test\" of the restore information has a value that is not DER: a BOOLEAN is 00 or FF",
     inRestoreInfo(img4maker::property("test", item(DERTagBoolean, {0x01})))},
    {"is no non-negative INTEGER in its shortest form, at offset ",
     inRestoreInfo(img4maker::property("test", item(DERTagInteger, {0x80})))},
    {"\"test\" of the restore information has a value that is not DER: DER has OCTET STRING in primitive form only, at "
     "offset ",
     inRestoreInfo(img4maker::property("test", item(0x2000000000000004, octets({1}))))},
    {"The payload's type is constructed IA5String instead of IA5String, at offset 8.",
     sequence({ia5("IM4P"), item(0x2000000000000016, ia5("sepi"))})},
    {"\"test\" of the restore information does not fit 64 bits, at offset ",
     inRestoreInfo(img4maker::property("test", item(DERTagInteger, filler(9, 1))))},
    {"Certificate 1 of the chain, which begins at offset ",
     sequence({ia5("IM4M"), integer(0), manifestBody({}), octets({1}), sequence({sequence({}), {0x30, 0x05}})})},
};

TEST(ShowImg4, saysWhatIsWrongAndWhere) {
    for (const ProblemCase& row : problemCases) {
        const Report report = show(row.bytes);
        EXPECT_FALSE(report.ok()) << row.problem;
        EXPECT_NE(report.problem.find(row.problem), std::string::npos) << row.problem << "\n" << report.problem;
        EXPECT_EQ(report.problem.back(), '.');
    }
}

TEST(ShowImg4, notesWhatTheDecoderPassesOver) {
    const Report behind = show(join({payload({}), {1, 2, 3}}));
    EXPECT_TRUE(behind.ok());
    EXPECT_NE(behind.text.find("followed by octets that belong to nothing, 3 of them, at offset "), std::string::npos)
        << behind.text;

    const Report twice =
        show(inRestoreInfo(join({img4maker::property("test", integer(1)), img4maker::property("test", integer(2))})));
    EXPECT_TRUE(twice.ok());
    const ordered_json& properties = twice.json["restoreInfo"]["properties"];
    EXPECT_FALSE(properties[0].contains("hidden"));
    EXPECT_TRUE(properties[1].contains("hidden"));
}

TEST(ShowImg4, boundsPropertiesAndNesting) {
    List many;
    for (int i = 0; i < 10500; ++i)
        many.push_back(img4maker::property("test", integer(1)));
    const Report wide = show(container(payload({}), {}, restoreInfo(many)));
    EXPECT_EQ(wide.json["restoreInfo"]["properties"].size(), 10500U);
    EXPECT_NE(wide.text.find("... and 500 more"), std::string::npos);

    Bytes nested = img4maker::property("test", integer(1));
    for (int i = 0; i < 500; ++i)
        nested = img4maker::property("test", set({nested}));
    EXPECT_TRUE(show(inRestoreInfo(nested)).ok());
}

// What the report says of damaged files is true: the verdict is the decoder's, the cause is found by the reader itself,
// and a file that answers otherwise is shown otherwise.
TEST(ShowImg4, everyFlippedBitIsShownOrRefused) {
    const Bytes container = exampleContainer();
    const std::string sound = show(container).text;
    Bytes flipped = container;
    for (std::size_t bit = 0; bit < flipped.size() * 8; ++bit) {
        const auto mask = static_cast<std::uint8_t>(1U << (bit % 8));
        flipped[bit / 8] ^= mask;
        const Report report = showImg4({flipped.data(), flipped.size()});
        Img4Record record;
        const DERReturn status = Img4DecodeInit(flipped.data(), flipped.size(), &record);
        EXPECT_FALSE(report.ok() && status != DERSuccess) << "bit " << bit;
        // Each flipped bit changes the decoder's answers, as the decoder's own test proves.
        EXPECT_TRUE(!report.ok() || printed(report).text != sound) << "bit " << bit;
        EXPECT_EQ(report.ok(), report.problem.empty());
        EXPECT_EQ(report.problem.find("The decoder refuses"), std::string::npos) << "bit " << bit << report.problem;
        EXPECT_FALSE(report.json.dump().empty());
        flipped[bit / 8] ^= mask;
    }
}

TEST(ShowImg4, noPrefixIsTakenForSound) {
    for (const Bytes& whole : {exampleContainer(), exampleTicket()})
        for (std::size_t length = 0; length < whole.size(); ++length) {
            const Report report = show(Bytes(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(length)));
            EXPECT_FALSE(report.ok()) << length;
            EXPECT_LE(report.json["problemOffset"], length);
        }
}

} // namespace
