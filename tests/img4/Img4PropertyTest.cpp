// The properties of one dictionary, read through every family of getters for every type of value. The families look up
// alike and differ in what a failure does to the out-value.
#include "img4/Img4.h"
#include "tests/der/Bytes.h"
#include "tests/support/MissingArguments.h"
#include "tools/makers/Img4Maker.h"

#include <cctype>
#include <functional>
#include <string>

#include <gtest/gtest.h>

namespace {

using namespace img4maker;

constexpr std::uint64_t big = 0x123456789A;
constexpr std::uint32_t sepi = Img4FourCC('s', 'e', 'p', 'i');
const Bytes data = {1, 2, 3};
const Bytes null = {0x05, 0x00};

// An element and what is answered when it is asked for as a boolean, a number of 32 and of 64 bits, data and a string:
// the first letter of success, the end, an unexpected tag, broken encoding, an incomplete sequence, an overflow or a
// parameter that is missing. The letter is large when the value was found and cannot be read.
struct Row {
    const char* name;
    Bytes content;
    std::string answers;
    char single = 0; // for all types, where the property is read by itself; 0: the same
    std::uint64_t number = 0;
    Bytes octets = {};
};

Bytes named(std::string_view name, const Bytes& value) {
    return sequence({ia5(name), value});
}

const Row rows[] = {
    {"bTru", named("bTru", boolean(true)), "suuuu", 0, 1},
    {"bFal", named("bFal", boolean(false)), "suuuu"},
    {"bOdd", named("bOdd", item(DERTagBoolean, {0x01})), "Buuuu"},
    {"iSml", named("iSml", integer(12)), "ussuu", 0, 12},
    {"iBig", named("iBig", integer(big)), "uOsuu", 0, big},
    {"iNeg", named("iNeg", item(DERTagInteger, {0x80})), "uBBuu"},
    {"iEmp", named("iEmp", item(DERTagInteger, {})), "uBBuu"},
    {"data", named("data", octets(data)), "uuusu", 0, 0, data},
    {"dEmp", named("dEmp", octets({})), "uuusu"},
    {"strg", named("strg", ia5("abc")), "uuuus", 0, 0, {'a', 'b', 'c'}},
    {"list", named("list", set({})), "uuuuu"},
    {"twic", named("twic", integer(1)), "ussuu", 0, 1},
    {"absn", {}, "eeeee", 'b'},
    {"name", named("eman", boolean(true)), "uuuuu"},
    {"shrt", named("shr", boolean(true)), "uuuuu"},
    {"utf8", sequence({item(0x0C, {'u', 't', 'f', '8'}), boolean(true)}), "uuuuu"},
    {"thrd", sequence({ia5("thrd"), boolean(true), integer(1)}), "buuuu", 'u'},
    {"miss", sequence({ia5("miss")}), "iiiii"},
    {"void", sequence({}), "iiiii", 'u'},
    {"nSeq", set({ia5("nSeq"), boolean(true)}), "uuuuu"},
    {"elem", property("elem", boolean(true)), "uuuuu"},
    {"none", {}, "bbbbb"},
    {"cutS", {0x30, 0x06, 0x16}, "bbbbb"},
    {"tail", join({named("tail", boolean(true)), null}), "suuuu", 'o', 1},
    {"both", join({sequence({ia5("both"), boolean(true), null}), null}), "buuuu", 'u'},
};

List dictionary() {
    List elements = {integer(99)}; // no property; a lookup passes over it
    for (const Row& row : rows)
        if (row.answers[0] != 'e')
            elements.push_back(item(propertyTag(row.name), row.content));
    elements.push_back(property("twic", integer(2)));
    return elements;
}

DERReturn statusOf(char answer) {
    switch (std::tolower(answer)) {
    case 's':
        return DERSuccess;
    case 'e':
        return DEREndOfSequence;
    case 'u':
        return DERUnexpectedTag;
    case 'i':
        return DERIncompleteSequence;
    case 'o':
        return DERBufferOverflow;
    case 'p':
        return DERParamError;
    default:
        return DERDecodeError;
    }
}

enum class OnFailure {
    Keeps,
    KeepsNumbersNotFound,
    Clears
};

Bytes shown(const DERItem& value) {
    return bytesOf(value);
}

Bytes shown(std::uint64_t value) {
    return integer(value);
}

// Checks a query whose out-value holds `before`.
template <typename Value, typename Query>
void check(char answer, bool isKept, const Bytes& expected, Value before, Query query) {
    Value value = before;
    EXPECT_EQ(query(&value), statusOf(answer));
    EXPECT_EQ(shown(value), answer == 's' ? expected : shown(isKept ? before : Value{}));
    EXPECT_EQ(query(nullptr), DERParamError);
}

template <typename Call, typename... String>
void checkFamily(const char* family, const Img4Record& record, OnFailure onFailure, bool isSingle, Call call,
                 auto getBoolean, auto getInteger, auto getInteger64, auto getData, String... getString) {
    const auto checkRow = [&](const Row& row, const Img4Record* from) {
        SCOPED_TRACE(std::string(family) + " " + row.name);
        const std::string answers = isSingle && row.single != 0 ? std::string(5, row.single) : row.answers;
        const bool keeps = onFailure == OnFailure::Keeps;
        const auto keepsNumber = [&](char answer) {
            return keeps || (onFailure == OnFailure::KeepsNumbersNotFound && std::islower(answer) != 0);
        };
        const DERItem before = itemOf(row.content);
        check(answers[0], true, shown(row.number), row.number == 0,
              [&](bool* out) { return call(getBoolean, from, row, out); });
        check(answers[1], keepsNumber(answers[1]), shown(row.number), std::uint32_t{77},
              [&](std::uint32_t* out) { return call(getInteger, from, row, out); });
        check(answers[2], keepsNumber(answers[2]), shown(row.number), std::uint64_t{77},
              [&](std::uint64_t* out) { return call(getInteger64, from, row, out); });
        check(answers[3], keeps, row.octets, before, [&](DERItem* out) { return call(getData, from, row, out); });
        (check(answers[4], keeps, row.octets, before, [&](DERItem* out) { return call(getString, from, row, out); }),
         ...);
    };
    for (const Row& row : rows)
        checkRow(row, &record);
    checkRow({"data", data, "ppppp"}, nullptr);
}

class Img4Properties : public testing::Test {
protected:
    void SetUp() override {
        Manifest fields;
        Payload image;
        fields.properties = dictionary();
        fields.objects = {object("kern", {}), object("sepi", dictionary())};
        image.properties = payloadProperties(dictionary());
        buffer = container(payload(image), manifest(fields), restoreInfo(dictionary()));
        ASSERT_EQ(Img4DecodeInit(buffer.data(), buffer.size(), &record), DERSuccess);
    }

    Bytes buffer;
    Img4Record record;
};

TEST_F(Img4Properties, areFoundByEveryFamilyAlike) {
    for (const std::uint32_t section : {Img4SectionManifest, Img4SectionRestoreInfo})
        checkFamily(
            section == Img4SectionManifest ? "manifest" : "section 1", record, OnFailure::KeepsNumbersNotFound, false,
            [&](auto get, auto* from, const Row& row, auto* out) { return get(from, section, fourCC(row.name), out); },
            Img4DecodeGetBooleanFromSection, Img4DecodeGetIntegerFromSection, Img4DecodeGetInteger64FromSection,
            Img4DecodeGetDataFromSection);
    checkFamily(
        "restore information", record, OnFailure::KeepsNumbersNotFound, false,
        [](auto get, auto* from, const Row& row, auto* out) { return get(from, fourCC(row.name), out); },
        Img4DecodeGetRestoreInfoBoolean, Img4DecodeGetRestoreInfoInteger, Img4DecodeGetRestoreInfoInteger64,
        Img4DecodeGetRestoreInfoData);
    checkFamily(
        "object", record, OnFailure::Clears, false,
        [](auto get, auto* from, const Row& row, auto* out) { return get(from, sepi, fourCC(row.name), out); },
        Img4DecodeGetObjectPropertyBoolean, Img4DecodeGetObjectPropertyInteger, Img4DecodeGetObjectPropertyInteger64,
        Img4DecodeGetObjectPropertyData, Img4DecodeGetObjectPropertyString);
    checkFamily(
        "payload", record, OnFailure::Keeps, false,
        [](auto get, auto* from, const Row& row, auto* out) { return get(from, propertyTag(row.name), out); },
        Img4DecodeGetPayloadPropertiesBoolean, Img4DecodeGetPayloadPropertiesInteger,
        Img4DecodeGetPayloadPropertiesInteger64, Img4DecodeGetPayloadPropertiesData);
    checkFamily(
        "single", record, OnFailure::Clears, true,
        [](auto get, auto* from, const Row& row, auto* out) {
            const DERItem content = itemOf(row.content);
            return get(from != nullptr ? &content : nullptr, fourCC(row.name), out);
        },
        Img4DecodeGetPropertyBoolean, Img4DecodeGetPropertyInteger, Img4DecodeGetPropertyInteger64,
        Img4DecodeGetPropertyData);
}

// Properties as records: the name, the tags and the value; what failure leaves behind.
TEST_F(Img4Properties, areRecordsWithNameTagsAndValue) {
    struct Family {
        const char* name;
        bool keeps;
        std::function<DERReturn(const Img4Record*, DERTag, DERTag, Img4Property*)> get;
    };
    const Family families[] = {
        {"manifest", false, [](auto* r, auto... a) { return Img4DecodeGetPropertyFromSection(r, 0, a...); }},
        {"section 1", false, [](auto* r, auto... a) { return Img4DecodeGetPropertyFromSection(r, 1, a...); }},
        {"object", false, [](auto* r, auto... a) { return Img4DecodeGetObjectProperty(r, sepi, a...); }},
        {"payload", true, Img4DecodePayloadProperty},
        {"dictionary", true,
         [](auto* r, auto... a) {
             return DERImg4DecodeFindProperty(r != nullptr ? &r->restoreInfo.properties : nullptr, a...);
         }},
    };
    const DERTag tag = propertyTag("data");
    for (const Family& family : families) {
        SCOPED_TRACE(family.name);
        Img4Property found = {};
        ASSERT_EQ(family.get(&record, tag, DERTagOctetString, &found), DERSuccess);
        EXPECT_EQ(shown(found.name), Bytes({'d', 'a', 't', 'a'}));
        EXPECT_EQ(shown(found.value), data);
        EXPECT_EQ(found.tag, tag);
        EXPECT_EQ(found.valueTag, DERTagOctetString);
        const Img4Property whole = found;
        for (const auto& [from, expected] : {std::pair(&record, DERUnexpectedTag), {nullptr, DERParamError}}) {
            found = whole;
            EXPECT_EQ(family.get(from, tag, DERTagSet, &found), expected);
            EXPECT_EQ(found.name.length, family.keeps ? 4U : 0U);
            EXPECT_EQ(found.tag, family.keeps ? tag : 0U);
        }
        EXPECT_EQ(family.get(&record, tag, DERTagSet, nullptr), DERParamError);
        // The whole tag counts, not only its number.
        EXPECT_EQ(family.get(&record, fourCC("data"), DERTagOctetString, &found), DEREndOfSequence);
    }
    const Bytes content = named("data", octets(data));
    const DERItem view = itemOf(content);
    Img4Property single;
    expectNeedsAll(DERParamError, DERImg4DecodeProperty, &view, tag, &single);
    EXPECT_EQ(DERImg4DecodeProperty(&view, fourCC("data"), &single), DERUnexpectedTag) << "no property tag";
    EXPECT_EQ(DERImg4DecodeProperty(&view, tag, &single), DERSuccess);
    EXPECT_EQ(single.tag, tag);
    EXPECT_EQ(single.valueTag, DERTagOctetString);
}

// An element with a tag that no four-character code makes is never a property, whatever its name.
TEST(Img4Property, needsAPrivateTag) {
    const DERTag tag = DERTagContextConstructed(1);
    const Bytes content = item(tag, named(std::string_view("\0\0\0\1", 4), integer(1)));
    const DERItem elements = itemOf(content);
    Img4Property found;
    EXPECT_EQ(DERImg4DecodeFindProperty(&elements, tag, DERTagInteger, &found), DERUnexpectedTag);
}

} // namespace
