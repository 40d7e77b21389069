#include "img4/Img4.h"
#include "tools/makers/Img4Maker.h"

#include <gtest/gtest.h>

namespace {

using namespace img4maker;

constexpr std::uint32_t sepi = Img4FourCC('s', 'e', 'p', 'i');
constexpr std::uint32_t eksp = Img4FourCC('e', 'k', 's', 'p');

const Bytes manp = object("MANP", {property("brdI", integer(12))});
const Bytes sep = object("sepi", {property("eksp", boolean(true))});

Bytes manifestWith(std::uint64_t version, const List& body) {
    return sequence({ia5("IM4M"), integer(version), set(body), octets({1}), sequence({})});
}

struct Case {
    const char* name;
    Bytes manifest;
    DERReturn object;  // of the lookup of "eksp" in "sepi"
    DERReturn section; // of the lookup of "brdI" in the manifest's own properties
};

const Case cases[] = {
    {"sound", manifestWith(0, {property("MANB", set({manp, sep}))}), DERSuccess, DERSuccess},
    {"MANP behind the object", manifestWith(1, {property("MANB", set({sep, manp}))}), DERSuccess, DERSuccess},
    {"other elements before MANB",
     manifestWith(0, {integer(1), property("MANA", set({})), property("MANB", set({manp, sep}))}), DERSuccess,
     DERSuccess},
    {"version 2 with a SET", manifestWith(2, {property("MANB", set({manp, sep}))}), DERUnexpectedTag, DERUnexpectedTag},
    {"version 2 with a SEQUENCE", manifestWith(2, {property("MANB", sequence({manp, sep}))}), DERSuccess, DERSuccess},
    {"version 1 with a SEQUENCE", manifestWith(1, {property("MANB", sequence({manp, sep}))}), DERUnexpectedTag,
     DERUnexpectedTag},
    {"no MANB", manifestWith(0, {property("MANA", set({manp, sep}))}), DEREndOfSequence, DEREndOfSequence},
    {"no MANP", manifestWith(0, {property("MANB", set({sep}))}), DEREndOfSequence, DEREndOfSequence},
    {"MANP in a SEQUENCE", manifestWith(0, {property("MANB", set({property("MANP", sequence({})), sep}))}),
     DERUnexpectedTag, DERUnexpectedTag},
    {"no object", manifestWith(0, {property("MANB", set({manp}))}), DEREndOfSequence, DERSuccess},
    {"object in a SEQUENCE", manifestWith(2, {property("MANB", sequence({manp, property("sepi", sequence({}))}))}),
     DERUnexpectedTag, DERSuccess},
    {"object under another name",
     manifestWith(0, {property("MANB", set({manp, item(propertyTag("sepi"), sequence({ia5("ipes"), set({})}))}))}),
     DERUnexpectedTag, DERSuccess},
    {"broken element before the object", manifestWith(0, {property("MANB", set({manp, {0x05, 0x01}}))}), DERDecodeError,
     DERSuccess},
    {"empty body", manifestWith(0, {}), DEREndOfSequence, DEREndOfSequence},
};

TEST(Img4Manifest, lookupsNeedTheBodyTheyRunThrough) {
    for (const Case& row : cases) {
        SCOPED_TRACE(row.name);
        Img4Record record;
        ASSERT_EQ(Img4DecodeInitManifest(row.manifest.data(), row.manifest.size(), &record), DERSuccess);
        bool entitled = false;
        std::uint32_t board = 0;
        EXPECT_EQ(Img4DecodeGetObjectPropertyBoolean(&record, sepi, eksp, &entitled), row.object);
        EXPECT_EQ(entitled, row.object == DERSuccess);
        EXPECT_EQ(Img4DecodeGetIntegerFromSection(&record, Img4SectionManifest, Img4FourCC('b', 'r', 'd', 'I'), &board),
                  row.section);
        EXPECT_EQ(board, row.section == DERSuccess ? 12U : 0U);
    }
}

TEST(Img4Manifest, unsignedOneAnswersLikeASignedOne) {
    Manifest fields;
    fields.objects = {sep};
    const Bytes buffer = unsignedManifest(fields);
    Img4Record record;
    bool entitled = false;
    ASSERT_EQ(Img4DecodeInitUnsignedManifest(buffer.data(), buffer.size(), &record), DERSuccess);
    EXPECT_EQ(Img4DecodeGetObjectPropertyBoolean(&record, sepi, eksp, &entitled), DERSuccess);
    EXPECT_TRUE(entitled);
    EXPECT_EQ(record.manifest.signature.data, nullptr);
}

struct Existence {
    bool manifest;
    bool restoreInfo;
};

void checkExistence(const Img4Record& record, const Existence& expected) {
    bool manifest = !expected.manifest;
    bool section0 = !expected.manifest;
    bool restoreInfo = !expected.restoreInfo;
    bool section1 = !expected.restoreInfo;
    EXPECT_EQ(Img4DecodeManifestExists(&record, &manifest), DERSuccess);
    EXPECT_EQ(Img4DecodeSectionExists(&record, Img4SectionManifest, &section0), DERSuccess);
    EXPECT_EQ(Img4DecodeRestoreInfoExists(&record, &restoreInfo), DERSuccess);
    EXPECT_EQ(Img4DecodeSectionExists(&record, Img4SectionRestoreInfo, &section1), DERSuccess);
    EXPECT_EQ(manifest, expected.manifest);
    EXPECT_EQ(section0, expected.manifest);
    EXPECT_EQ(restoreInfo, expected.restoreInfo);
    EXPECT_EQ(section1, expected.restoreInfo);
}

TEST(Img4Manifest, existenceOfTheSections) {
    Img4Record record;
    const Bytes plain = container(payload({}), {}, {});
    const Bytes full = exampleContainer();
    const Bytes emptyRestoreInfo = container(payload({}), {}, restoreInfo({}));
    const Bytes ticket = exampleTicket();
    ASSERT_EQ(Img4DecodeInit(plain.data(), plain.size(), &record), DERSuccess);
    checkExistence(record, {false, false});
    ASSERT_EQ(Img4DecodeInit(full.data(), full.size(), &record), DERSuccess);
    checkExistence(record, {true, true});
    ASSERT_EQ(Img4DecodeInit(emptyRestoreInfo.data(), emptyRestoreInfo.size(), &record), DERSuccess);
    checkExistence(record, {false, true});
    ASSERT_EQ(Img4DecodeInitManifest(ticket.data(), ticket.size(), &record), DERSuccess);
    checkExistence(record, {true, false});
}

TEST(Img4Manifest, startAndLength) {
    const Bytes ticket = exampleTicket();
    const std::uint8_t* start = nullptr;
    std::uint32_t length = 0;
    Img4Record record;
    ASSERT_EQ(Img4DecodeInitManifest(ticket.data(), ticket.size(), &record), DERSuccess);
    EXPECT_EQ(Img4DecodeGetManifest(&record, &start, &length), DERSuccess);
    EXPECT_EQ(start, ticket.data());
    EXPECT_EQ(length, ticket.size());
    record.manifestRaw.length = 0x100000001;
    EXPECT_EQ(Img4DecodeGetManifest(&record, &start, &length), DERBufferOverflow);
    EXPECT_EQ(length, 0U);
    start = ticket.data();
    record = {};
    EXPECT_EQ(Img4DecodeGetManifest(&record, &start, &length), Img4Failure);
    EXPECT_EQ(start, nullptr);
    EXPECT_EQ(Img4DecodeGetManifest(nullptr, &start, &length), DERParamError);
    EXPECT_EQ(Img4DecodeGetManifest(&record, nullptr, &length), DERParamError);
    EXPECT_EQ(Img4DecodeGetManifest(&record, &start, nullptr), DERParamError);
}

// A record that holds neither manifest nor restore information, a section that does not exist, and missing arguments:
// the data out-value is cleared each time, the number and the boolean stay.
TEST(Img4Manifest, absentSectionsAndMissingArguments) {
    const Img4Record none = {};
    const std::uint8_t octet = 0;
    struct Row {
        const Img4Record* record;
        std::uint32_t section;
        DERReturn expected;
    };
    const Row rows[] = {
        {&none, Img4SectionManifest, DEREndOfSequence},
        {&none, Img4SectionRestoreInfo, DEREndOfSequence},
        {&none, 2, DERParamError},
        {nullptr, Img4SectionManifest, DERParamError},
    };
    for (const Row& row : rows) {
        DERItem data = {&octet, 1};
        std::uint32_t number = 77;
        std::uint64_t number64 = 77;
        bool flag = true;
        Img4Property property = {{&octet, 1}, 1, {&octet, 1}, 1};
        EXPECT_EQ(Img4DecodeGetDataFromSection(row.record, row.section, eksp, &data), row.expected);
        EXPECT_EQ(data.data, nullptr);
        EXPECT_EQ(Img4DecodeGetIntegerFromSection(row.record, row.section, eksp, &number), row.expected);
        EXPECT_EQ(Img4DecodeGetInteger64FromSection(row.record, row.section, eksp, &number64), row.expected);
        EXPECT_EQ(Img4DecodeGetBooleanFromSection(row.record, row.section, eksp, &flag), row.expected);
        EXPECT_EQ(number, 77U);
        EXPECT_EQ(number64, 77U);
        EXPECT_TRUE(flag);
        EXPECT_EQ(
            Img4DecodeGetPropertyFromSection(row.record, row.section, Img4PropertyTag(eksp), DERTagBoolean, &property),
            row.expected);
        EXPECT_EQ(property.value.data, nullptr);
    }
    bool exists = true;
    EXPECT_EQ(Img4DecodeSectionExists(&none, 2, &exists), DERParamError);
    EXPECT_FALSE(exists);
    EXPECT_EQ(Img4DecodeSectionExists(&none, Img4SectionManifest, nullptr), DERParamError);
    EXPECT_EQ(Img4DecodeRestoreInfoExists(nullptr, &exists), DERParamError);
    EXPECT_EQ(Img4DecodeManifestExists(nullptr, &exists), DERParamError);
    EXPECT_EQ(Img4DecodeManifestExists(&none, nullptr), DERParamError);

    std::uint32_t number = 77;
    DERItem string = {&octet, 1};
    EXPECT_EQ(Img4DecodeGetObjectPropertyInteger(&none, sepi, eksp, &number), DERDecodeError);
    EXPECT_EQ(number, 0U);
    EXPECT_EQ(Img4DecodeGetObjectPropertyString(nullptr, sepi, eksp, &string), DERParamError);
    EXPECT_EQ(string.data, nullptr);
    EXPECT_EQ(Img4DecodeGetObjectPropertyString(&none, sepi, eksp, nullptr), DERParamError);
}

} // namespace
