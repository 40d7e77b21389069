// The properties of one dictionary, read through every family of getters. The families look up alike and differ in what
// a failure does to the out-value.
#include "img4/Img4.h"
#include "tools/makers/Img4Maker.h"

#include <functional>
#include <string>

#include <gtest/gtest.h>

namespace {

using namespace img4maker;

constexpr std::uint64_t big = 0x123456789A;
const Bytes data = {1, 2, 3};

Bytes namedAs(std::string_view tag, const List& content) {
    return item(propertyTag(tag), join(content));
}

const List dictionary = {
    integer(99), // no property; a lookup passes over it
    property("bTru", boolean(true)),
    property("bFal", boolean(false)),
    property("bOdd", item(DERTagBoolean, {0x01})),
    property("iSml", integer(12)),
    property("iBig", integer(big)),
    property("iNeg", item(DERTagInteger, {0x80})),
    property("iEmp", item(DERTagInteger, {})),
    property("data", octets(data)),
    property("strg", ia5("abc")),
    property("twic", integer(1)),
    property("twic", integer(2)),
    namedAs("name", {sequence({ia5("eman"), boolean(true)})}),
    namedAs("shrt", {sequence({ia5("shr"), boolean(true)})}),
    namedAs("utf8", {sequence({item(0x0C, {'u', 't', 'f', '8'}), boolean(true)})}),
    namedAs("thrd", {sequence({ia5("thrd"), boolean(true), integer(1)})}),
    namedAs("miss", {sequence({ia5("miss")})}),
    namedAs("void", {sequence({})}),
    namedAs("nSeq", {set({ia5("nSeq"), boolean(true)})}),
    namedAs("none", {}),
    // The element's content goes on behind the SEQUENCE.
    namedAs("tail", {sequence({ia5("tail"), boolean(true)}), {0x05, 0x00}}),
};

enum class Asked {
    Boolean,
    Integer,
    Integer64,
    Data,
    String
};

struct Case {
    const char* name;
    Asked asked;
    DERReturn expected;
    std::uint64_t value = 0;
};

const Case cases[] = {
    {"bTru", Asked::Boolean, DERSuccess, 1},
    {"bFal", Asked::Boolean, DERSuccess, 0},
    {"bOdd", Asked::Boolean, DERDecodeError},
    {"iSml", Asked::Boolean, DERUnexpectedTag},
    {"absn", Asked::Boolean, DEREndOfSequence},
    {"name", Asked::Boolean, DERUnexpectedTag},
    {"shrt", Asked::Boolean, DERUnexpectedTag},
    {"utf8", Asked::Boolean, DERUnexpectedTag},
    {"thrd", Asked::Boolean, DERDecodeError},
    {"miss", Asked::Boolean, DERIncompleteSequence},
    {"void", Asked::Boolean, DERIncompleteSequence},
    {"nSeq", Asked::Boolean, DERUnexpectedTag},
    {"none", Asked::Boolean, DERDecodeError},
    {"tail", Asked::Boolean, DERSuccess, 1},
    {"iSml", Asked::Integer, DERSuccess, 12},
    {"twic", Asked::Integer, DERSuccess, 1},
    {"iBig", Asked::Integer, DERBufferOverflow},
    {"iNeg", Asked::Integer, DERDecodeError},
    {"iEmp", Asked::Integer, DERDecodeError},
    {"data", Asked::Integer, DERUnexpectedTag},
    {"absn", Asked::Integer, DEREndOfSequence},
    {"iBig", Asked::Integer64, DERSuccess, big},
    {"iNeg", Asked::Integer64, DERDecodeError},
    {"bTru", Asked::Integer64, DERUnexpectedTag},
    {"absn", Asked::Integer64, DEREndOfSequence},
    {"data", Asked::Data, DERSuccess},
    {"strg", Asked::Data, DERUnexpectedTag},
    {"absn", Asked::Data, DEREndOfSequence},
    {"strg", Asked::String, DERSuccess},
    {"data", Asked::String, DERUnexpectedTag},
};

enum class OnFailure {
    Keeps,
    Clears
};

struct Family {
    const char* name;
    std::function<DERReturn(std::string_view, bool*)> boolean;
    std::function<DERReturn(std::string_view, std::uint32_t*)> integer;
    std::function<DERReturn(std::string_view, std::uint64_t*)> integer64;
    std::function<DERReturn(std::string_view, DERItem*)> data;
    std::function<DERReturn(std::string_view, DERItem*)> string; // empty when the family has none
    OnFailure numberNotFound;
    OnFailure numberNotParsed;
    OnFailure item;
};

bool foundButNotParsed(DERReturn result, const std::string& name) {
    return result != DERSuccess && (name == "iBig" || name == "iNeg" || name == "iEmp");
}

template <typename Number>
void checkNumber(const Family& family, const Case& row,
                 const std::function<DERReturn(std::string_view, Number*)>& get) {
    Number value = 77;
    EXPECT_EQ(get(row.name, &value), row.expected);
    const OnFailure rule = foundButNotParsed(row.expected, row.name) ? family.numberNotParsed : family.numberNotFound;
    const std::uint64_t afterFailure = rule == OnFailure::Keeps ? 77 : 0;
    EXPECT_EQ(value, row.expected == DERSuccess ? row.value : afterFailure);
    EXPECT_EQ(get(row.name, nullptr), DERParamError);
}

void checkItem(const Family& family, const Case& row, const std::function<DERReturn(std::string_view, DERItem*)>& get,
               const Bytes& expected) {
    const std::uint8_t other = 0;
    DERItem value = {&other, 77};
    EXPECT_EQ(get(row.name, &value), row.expected);
    if (row.expected == DERSuccess)
        EXPECT_EQ(Bytes(value.data, value.data + value.length), expected);
    else
        EXPECT_EQ(value.length, family.item == OnFailure::Keeps ? 77U : 0U);
    EXPECT_EQ(get(row.name, nullptr), DERParamError);
}

void checkBoolean(const Family& family, const Case& row) {
    for (const bool before : {false, true}) {
        bool value = before;
        EXPECT_EQ(family.boolean(row.name, &value), row.expected);
        EXPECT_EQ(value, row.expected == DERSuccess ? row.value != 0 : before);
    }
    EXPECT_EQ(family.boolean(row.name, nullptr), DERParamError);
}

void checkFamily(const Family& family) {
    for (const Case& row : cases) {
        SCOPED_TRACE(std::string(family.name) + " " + row.name);
        switch (row.asked) {
        case Asked::Boolean:
            checkBoolean(family, row);
            break;
        case Asked::Integer:
            checkNumber(family, row, family.integer);
            break;
        case Asked::Integer64:
            checkNumber(family, row, family.integer64);
            break;
        case Asked::Data:
            checkItem(family, row, family.data, data);
            break;
        case Asked::String:
            if (family.string)
                checkItem(family, row, family.string, {'a', 'b', 'c'});
            break;
        }
    }
}

class Img4Properties : public testing::Test {
protected:
    void SetUp() override {
        Manifest fields;
        fields.properties = dictionary;
        fields.objects = {object("kern", {}), object("sepi", dictionary)};
        Payload image;
        image.properties = payloadProperties(dictionary);
        buffer = container(payload(image), manifest(fields), restoreInfo(dictionary));
        ASSERT_EQ(Img4DecodeInit(buffer.data(), buffer.size(), &record), DERSuccess);
    }

    Family section(std::uint32_t number) const {
        return {number == 0 ? "manifest" : "restore information",
                [=, this](auto name, auto* out) {
                    return Img4DecodeGetBooleanFromSection(&record, number, fourCC(name), out);
                },
                [=, this](auto name, auto* out) {
                    return Img4DecodeGetIntegerFromSection(&record, number, fourCC(name), out);
                },
                [=, this](auto name, auto* out) {
                    return Img4DecodeGetInteger64FromSection(&record, number, fourCC(name), out);
                },
                [=, this](auto name, auto* out) {
                    return Img4DecodeGetDataFromSection(&record, number, fourCC(name), out);
                },
                {},
                OnFailure::Keeps,
                OnFailure::Clears,
                OnFailure::Clears};
    }

    Bytes buffer;
    Img4Record record;
};

TEST_F(Img4Properties, ofASection) {
    checkFamily(section(Img4SectionManifest));
    checkFamily(section(Img4SectionRestoreInfo));
}

TEST_F(Img4Properties, ofTheRestoreInformation) {
    checkFamily({"restore information",
                 [this](auto name, auto* out) { return Img4DecodeGetRestoreInfoBoolean(&record, fourCC(name), out); },
                 [this](auto name, auto* out) { return Img4DecodeGetRestoreInfoInteger(&record, fourCC(name), out); },
                 [this](auto name, auto* out) { return Img4DecodeGetRestoreInfoInteger64(&record, fourCC(name), out); },
                 [this](auto name, auto* out) { return Img4DecodeGetRestoreInfoData(&record, fourCC(name), out); },
                 {},
                 OnFailure::Keeps,
                 OnFailure::Clears,
                 OnFailure::Clears});
}

TEST_F(Img4Properties, ofAnObject) {
    constexpr std::uint32_t sepi = Img4FourCC('s', 'e', 'p', 'i');
    checkFamily(
        {"object",
         [=, this](auto name, auto* out) {
             return Img4DecodeGetObjectPropertyBoolean(&record, sepi, fourCC(name), out);
         },
         [=, this](auto name, auto* out) {
             return Img4DecodeGetObjectPropertyInteger(&record, sepi, fourCC(name), out);
         },
         [=, this](auto name, auto* out) {
             return Img4DecodeGetObjectPropertyInteger64(&record, sepi, fourCC(name), out);
         },
         [=, this](auto name, auto* out) { return Img4DecodeGetObjectPropertyData(&record, sepi, fourCC(name), out); },
         [=, this](auto name, auto* out) {
             return Img4DecodeGetObjectPropertyString(&record, sepi, fourCC(name), out);
         },
         OnFailure::Clears, OnFailure::Clears, OnFailure::Clears});
}

TEST_F(Img4Properties, ofThePayload) {
    checkFamily(
        {"payload",
         [this](auto name, auto* out) {
             return Img4DecodeGetPayloadPropertiesBoolean(&record, propertyTag(name), out);
         },
         [this](auto name, auto* out) {
             return Img4DecodeGetPayloadPropertiesInteger(&record, propertyTag(name), out);
         },
         [this](auto name, auto* out) {
             return Img4DecodeGetPayloadPropertiesInteger64(&record, propertyTag(name), out);
         },
         [this](auto name, auto* out) { return Img4DecodeGetPayloadPropertiesData(&record, propertyTag(name), out); },
         {},
         OnFailure::Keeps,
         OnFailure::Keeps,
         OnFailure::Keeps});
}

// Properties as records: the name, the tags and the value; what failure leaves behind.
TEST_F(Img4Properties, asRecords) {
    constexpr std::uint32_t sepi = Img4FourCC('s', 'e', 'p', 'i');
    using Get = std::function<DERReturn(DERTag, DERTag, Img4Property*)>;
    struct Row {
        const char* name;
        Get get;
        OnFailure onFailure;
    };
    const Row rows[] = {
        {"section", [&](auto... a) { return Img4DecodeGetPropertyFromSection(&record, Img4SectionManifest, a...); },
         OnFailure::Clears},
        {"restore information",
         [&](auto... a) { return Img4DecodeGetPropertyFromSection(&record, Img4SectionRestoreInfo, a...); },
         OnFailure::Clears},
        {"object", [&](auto... a) { return Img4DecodeGetObjectProperty(&record, sepi, a...); }, OnFailure::Clears},
        {"payload", [&](auto... a) { return Img4DecodePayloadProperty(&record, a...); }, OnFailure::Keeps},
        {"dictionary", [&](auto... a) { return DERImg4DecodeFindProperty(&record.restoreInfo.properties, a...); },
         OnFailure::Keeps},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.name);
        Img4Property found = {};
        ASSERT_EQ(row.get(propertyTag("data"), DERTagOctetString, &found), DERSuccess);
        EXPECT_EQ(std::string(found.name.data, found.name.data + found.name.length), "data");
        EXPECT_EQ(Bytes(found.value.data, found.value.data + found.value.length), data);
        EXPECT_EQ(found.tag, propertyTag("data"));
        EXPECT_EQ(found.valueTag, DERTagOctetString);
        EXPECT_EQ(row.get(propertyTag("data"), DERTagSet, &found), DERUnexpectedTag);
        EXPECT_EQ(found.name.length, row.onFailure == OnFailure::Clears ? 0U : 4U);
        EXPECT_EQ(found.tag, row.onFailure == OnFailure::Clears ? 0U : propertyTag("data"));
        // The whole tag counts, not only its number.
        EXPECT_EQ(row.get(fourCC("data"), DERTagOctetString, &found), DEREndOfSequence);
        EXPECT_EQ(row.get(propertyTag("data"), DERTagOctetString, nullptr), DERParamError);
    }
}

// An element with a tag that no four-character code makes is never a property, whatever its name.
TEST_F(Img4Properties, needAPrivateTag) {
    const Bytes content =
        item(DERTagContextConstructed(1), sequence({ia5(std::string_view("\0\0\0\1", 4)), integer(1)}));
    const DERItem elements = {content.data(), content.size()};
    Img4Property found;
    EXPECT_EQ(DERImg4DecodeFindProperty(&elements, DERTagContextConstructed(1), DERTagInteger, &found),
              DERUnexpectedTag);
}

struct SingleCase {
    const char* name;
    Bytes content;
    DERReturn expected;
    Bytes value = {};
};

const SingleCase singles[] = {
    {"sound", sequence({ia5("prop"), octets(data)}), DERSuccess, data},
    {"empty value", sequence({ia5("prop"), octets({})}), DERSuccess},
    {"other type", sequence({ia5("prop"), ia5("abc")}), DERUnexpectedTag},
    {"other name", sequence({ia5("porp"), octets(data)}), DERUnexpectedTag},
    {"name of another type", sequence({octets({'p', 'r', 'o', 'p'}), octets(data)}), DERUnexpectedTag},
    {"no name", sequence({}), DERUnexpectedTag},
    {"no value", sequence({ia5("prop")}), DERIncompleteSequence},
    {"third element", sequence({ia5("prop"), octets(data), boolean(true)}), DERUnexpectedTag},
    {"octets behind", join({sequence({ia5("prop"), octets(data)}), {0}}), DERBufferOverflow},
    {"third element and octets behind", join({sequence({ia5("prop"), octets(data), boolean(true)}), {0}}),
     DERUnexpectedTag},
    {"SET", set({ia5("prop"), octets(data)}), DERUnexpectedTag},
    {"whole element", property("prop", octets(data)), DERUnexpectedTag},
    {"cut short", {0x30, 0x06, 0x16}, DERDecodeError},
};

TEST(Img4SingleProperty, isCheckedToItsLastOctet) {
    constexpr std::uint32_t prop = Img4FourCC('p', 'r', 'o', 'p');
    for (const SingleCase& row : singles) {
        SCOPED_TRACE(row.name);
        const DERItem content = {row.content.data(), row.content.size()};
        DERItem value = {row.content.data(), 77};
        std::uint32_t number = 77;
        std::uint64_t number64 = 77;
        bool flag = true;
        EXPECT_EQ(Img4DecodeGetPropertyData(&content, prop, &value), row.expected);
        EXPECT_EQ(Bytes(value.data, value.data + value.length), row.value) << "cleared on failure";
        EXPECT_NE(Img4DecodeGetPropertyInteger(&content, prop, &number), DERSuccess);
        EXPECT_NE(Img4DecodeGetPropertyInteger64(&content, prop, &number64), DERSuccess);
        EXPECT_NE(Img4DecodeGetPropertyBoolean(&content, prop, &flag), DERSuccess);
        EXPECT_EQ(number, 0U);
        EXPECT_EQ(number64, 0U);
        EXPECT_TRUE(flag);
    }
}

TEST(Img4SingleProperty, givesTypedValues) {
    constexpr std::uint32_t prop = Img4FourCC('p', 'r', 'o', 'p');
    const Bytes number = sequence({ia5("prop"), integer(big)});
    const Bytes small = sequence({ia5("prop"), integer(5)});
    const Bytes truth = sequence({ia5("prop"), boolean(true)});
    const DERItem numberItem = {number.data(), number.size()};
    const DERItem smallItem = {small.data(), small.size()};
    const DERItem truthItem = {truth.data(), truth.size()};
    std::uint32_t value = 77;
    std::uint64_t value64 = 77;
    bool flag = false;
    Img4Property found;
    EXPECT_EQ(Img4DecodeGetPropertyInteger64(&numberItem, prop, &value64), DERSuccess);
    EXPECT_EQ(value64, big);
    EXPECT_EQ(Img4DecodeGetPropertyInteger(&smallItem, prop, &value), DERSuccess);
    EXPECT_EQ(value, 5U);
    EXPECT_EQ(Img4DecodeGetPropertyInteger(&numberItem, prop, &value), DERBufferOverflow);
    EXPECT_EQ(value, 0U);
    EXPECT_EQ(Img4DecodeGetPropertyBoolean(&truthItem, prop, &flag), DERSuccess);
    EXPECT_TRUE(flag);
    EXPECT_EQ(DERImg4DecodeProperty(&truthItem, Img4PropertyTag(prop), &found), DERSuccess);
    EXPECT_EQ(found.valueTag, DERTagBoolean);
    EXPECT_EQ(found.tag, propertyTag("prop"));
    EXPECT_EQ(DERImg4DecodeProperty(&truthItem, prop, &found), DERUnexpectedTag) << "a bare code is no property tag";
    EXPECT_EQ(DERImg4DecodeProperty(nullptr, Img4PropertyTag(prop), &found), DERParamError);
    EXPECT_EQ(DERImg4DecodeProperty(&truthItem, Img4PropertyTag(prop), nullptr), DERParamError);
    value64 = 77;
    EXPECT_EQ(Img4DecodeGetPropertyInteger64(nullptr, prop, &value64), DERParamError);
    EXPECT_EQ(value64, 0U);
}

} // namespace
