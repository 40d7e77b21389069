// The properties of one dictionary, read through every family of getters for every type of value. The families look up
// alike and differ in what a failure does to the out-value.
#include "img4/Img4.h"
#include "tests/der/Bytes.h"
#include "tests/support/MissingArguments.h"
#include "tools/makers/Img4Maker.h"

#include <cctype>
#include <string>
#include <string_view>

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
    {"bOdd", named("bOdd", item(DERTagBoolean, {0x01})), "Buuuu"},
    {"iSml", named("iSml", integer(12)), "ussuu", 0, 12},
    {"iBig", named("iBig", integer(big)), "uOsuu", 0, big},
    {"data", named("data", octets(data)), "uuusu", 0, 0, data},
    {"strg", named("strg", ia5("abc")), "uuuus", 0, 0, {'a', 'b', 'c'}},
    {"twic", named("twic", integer(1)), "ussuu", 0, 1},
    {"absn", {}, "eeeee", 'b'},
    {"name", named("eman", boolean(true)), "uuuuu"},
    {"utf8", sequence({item(0x0C, {'u', 't', 'f', '8'}), boolean(true)}), "uuuuu"},
    {"thrd", sequence({ia5("thrd"), boolean(true), integer(1)}), "buuuu", 'u'},
    {"miss", sequence({ia5("miss")}), "iiiii"},
    {"void", sequence({}), "iiiii", 'u'},
    {"nSeq", set({ia5("nSeq"), boolean(true)}), "uuuuu"},
    {"none", {}, "bbbbb"},
    {"cutS", {0x30, 0x06, 0x16}, "bbbbb"},
    {"tail", join({named("tail", boolean(true)), null}), "suuuu", 'o', 1},
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
    constexpr std::string_view letters = "seub?ipo"; // in the order of the statuses
    return static_cast<DERReturn>(letters.find(static_cast<char>(std::tolower(answer))));
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

// The answers that a row has for these getters, which `call` calls with the row's name behind what they look in.
template <typename Call, typename... String>
void checkFamily(const char* family, const Row& row, const std::string& answers, OnFailure onFailure, Call call,
                 auto getBoolean, auto getInteger, auto getInteger64, auto getData, String... getString) {
    SCOPED_TRACE(std::string(family) + " " + row.name);
    const bool keeps = onFailure == OnFailure::Keeps;
    const auto keepsNumber = [&](char answer) {
        return keeps || (onFailure == OnFailure::KeepsNumbersNotFound && std::islower(answer) != 0);
    };
    const DERItem before = itemOf(row.content);
    check(answers[0], true, shown(row.number), row.number == 0, [&](bool* out) { return call(getBoolean, out); });
    check(answers[1], keepsNumber(answers[1]), shown(row.number), std::uint32_t{77},
          [&](std::uint32_t* out) { return call(getInteger, out); });
    check(answers[2], keepsNumber(answers[2]), shown(row.number), std::uint64_t{77},
          [&](std::uint64_t* out) { return call(getInteger64, out); });
    check(answers[3], keeps, row.octets, before, [&](DERItem* out) { return call(getData, out); });
    (check(answers[4], keeps, row.octets, before, [&](DERItem* out) { return call(getString, out); }), ...);
}

// The same for properties as records, with their names and tags.
template <typename Call>
void checkRecords(const char* family, const Row& row, const std::string& answers, bool keeps, Call call) {
    constexpr DERTag types[] = {DERTagBoolean, DERTagInteger, DERTagInteger, DERTagOctetString, DERTagIA5String};
    SCOPED_TRACE(std::string(family) + " " + row.name);
    const DERTag tag = propertyTag(row.name);
    for (std::size_t i = 0; i < std::size(types); ++i) {
        Img4Property found = {itemOf(data), 77, itemOf(data), 77};
        const DERReturn expected = std::isupper(answers[i]) != 0 ? DERSuccess : statusOf(answers[i]);
        const bool isFound = expected == DERSuccess;
        EXPECT_EQ(call(tag, types[i], &found), expected);
        EXPECT_EQ(bytesOf(found.name), isFound ? Bytes(row.name, row.name + 4) : keeps ? data : Bytes());
        EXPECT_EQ(found.tag, isFound ? tag : keeps ? 77 : 0);
        EXPECT_EQ(found.valueTag, isFound ? types[i] : keeps ? 77 : 0);
        EXPECT_EQ(call(tag, types[i], nullptr), DERParamError);
    }
}

TEST(Img4Properties, areFoundByEveryFamilyAlike) {
    const Bytes buffer =
        container(payload({.properties = payloadProperties(dictionary())}),
                  manifest({.properties = dictionary(), .objects = {object("kern", {}), object("sepi", dictionary())}}),
                  restoreInfo(dictionary()));
    Img4Record record;
    ASSERT_EQ(Img4DecodeInit(buffer.data(), buffer.size(), &record), DERSuccess);
    const auto checkRow = [](const Img4Record* from, const Row& row, const std::string& answers) {
        const std::uint32_t name = fourCC(row.name);
        checkFamily(
            "manifest", row, answers, OnFailure::KeepsNumbersNotFound,
            [&](auto get, auto* out) { return get(from, Img4SectionManifest, name, out); },
            Img4DecodeGetBooleanFromSection, Img4DecodeGetIntegerFromSection, Img4DecodeGetInteger64FromSection,
            Img4DecodeGetDataFromSection);
        checkFamily(
            "restore information", row, answers, OnFailure::KeepsNumbersNotFound,
            [&](auto get, auto* out) { return get(from, name, out); }, Img4DecodeGetRestoreInfoBoolean,
            Img4DecodeGetRestoreInfoInteger, Img4DecodeGetRestoreInfoInteger64, Img4DecodeGetRestoreInfoData);
        checkFamily(
            "object", row, answers, OnFailure::Clears, [&](auto get, auto* out) { return get(from, sepi, name, out); },
            Img4DecodeGetObjectPropertyBoolean, Img4DecodeGetObjectPropertyInteger,
            Img4DecodeGetObjectPropertyInteger64, Img4DecodeGetObjectPropertyData, Img4DecodeGetObjectPropertyString);
        checkFamily(
            "payload", row, answers, OnFailure::Keeps,
            [&](auto get, auto* out) { return get(from, propertyTag(row.name), out); },
            Img4DecodeGetPayloadPropertiesBoolean, Img4DecodeGetPayloadPropertiesInteger,
            Img4DecodeGetPayloadPropertiesInteger64, Img4DecodeGetPayloadPropertiesData);
        for (const std::uint32_t section : {Img4SectionManifest, Img4SectionRestoreInfo})
            checkRecords("section", row, answers, false,
                         [&](auto... a) { return Img4DecodeGetPropertyFromSection(from, section, a...); });
        checkRecords("object", row, answers, false,
                     [&](auto... a) { return Img4DecodeGetObjectProperty(from, sepi, a...); });
        checkRecords("payload", row, answers, true, [&](auto... a) { return Img4DecodePayloadProperty(from, a...); });
        const DERItem* const dictionary = from != nullptr ? &from->restoreInfo.properties : nullptr;
        checkRecords("dictionary", row, answers, true,
                     [&](auto... a) { return DERImg4DecodeFindProperty(dictionary, a...); });
        const DERItem content = itemOf(row.content);
        const DERItem* const item = from != nullptr ? &content : nullptr;
        checkFamily(
            "single", row, row.single != 0 ? std::string(5, row.single) : answers, OnFailure::Clears,
            [&](auto get, auto* out) { return get(item, name, out); }, Img4DecodeGetPropertyBoolean,
            Img4DecodeGetPropertyInteger, Img4DecodeGetPropertyInteger64, Img4DecodeGetPropertyData);
    };
    for (const Row& row : rows)
        checkRow(&record, row, row.answers);
    checkRow(nullptr, rows[0], "ppppp");
}

// An element with a tag that no four-character code makes is never a property, whatever its name.
TEST(Img4Property, isARecordByItselfTooAndNeedsAPrivateTag) {
    const DERTag tag = propertyTag("data"), context = DERTagContextConstructed(1);
    const Bytes content = named("data", octets(data));
    const Bytes other = item(context, named(std::string_view("\0\0\0\1", 4), integer(1)));
    const DERItem view = itemOf(content), elements = itemOf(other);
    Img4Property found;
    expectNeedsAll(DERParamError, DERImg4DecodeProperty, &view, tag, &found);
    EXPECT_EQ(DERImg4DecodeProperty(&view, fourCC("data"), &found), DERUnexpectedTag);
    EXPECT_EQ(DERImg4DecodeProperty(&view, tag, &found), DERSuccess);
    EXPECT_EQ(found.tag, tag);
    EXPECT_EQ(found.valueTag, DERTagOctetString);
    EXPECT_EQ(DERImg4DecodeFindProperty(&elements, context, DERTagInteger, &found), DERUnexpectedTag);
}

} // namespace
