#include "img4/Img4.h"
#include "tools/makers/Img4Maker.h"

#include <gtest/gtest.h>

namespace {

using namespace img4maker;

Bytes bytesOf(const DERItem& item) {
    return {item.data, item.data + item.length};
}

const std::uint8_t octet = 0;

struct Answers {
    DERItem data = {&octet, 1};
    DERItem version = {&octet, 1};
    DERItem keybag = {&octet, 1};
    std::uint32_t type = 77;
    std::uint32_t algorithm = 77;
    std::uint32_t size = 77;
    bool keybagExists = true;
    bool compressionExists = true;
};

// Runs the queries of the payload and expects `status` of each, but `compression` of the compression information.
Answers ask(const Img4Record* record, DERReturn status, DERReturn compressionStatus) {
    Answers answers;
    EXPECT_EQ(Img4DecodeGetPayload(record, &answers.data), status);
    EXPECT_EQ(Img4DecodeGetPayloadVersion(record, &answers.version), status);
    EXPECT_EQ(Img4DecodeGetPayloadType(record, &answers.type), status);
    EXPECT_EQ(Img4DecodeGetPayloadKeybag(record, &answers.keybag), status);
    EXPECT_EQ(Img4DecodePayloadKeybagExists(record, &answers.keybagExists), status);
    EXPECT_EQ(Img4DecodePayloadCompressionInfoExists(record, &answers.compressionExists), status);
    EXPECT_EQ(Img4DecodeGetPayloadCompressionInfo(record, &answers.algorithm, &answers.size), compressionStatus);
    return answers;
}

void expectCleared(const Answers& answers) {
    for (const DERItem& item : {answers.data, answers.version, answers.keybag}) {
        EXPECT_EQ(item.data, nullptr);
        EXPECT_EQ(item.length, 0U);
    }
    EXPECT_EQ(answers.type, 0U);
    EXPECT_EQ(answers.algorithm, 0xFFFFFFFF);
    EXPECT_EQ(answers.size, 0xFFFFFFFF);
    EXPECT_FALSE(answers.keybagExists);
    EXPECT_FALSE(answers.compressionExists);
}

Img4Record recordOf(const Bytes& buffer) {
    Img4Record record;
    EXPECT_EQ(Img4DecodeInitPayload(buffer.data(), buffer.size(), &record), DERSuccess);
    return record;
}

TEST(Img4Payload, givesItsFields) {
    Payload fields;
    fields.keybag = {9, 8, 7};
    fields.compression = compression(1, 0xFFFFFFFE);
    const Bytes buffer = payload(fields);
    const Img4Record record = recordOf(buffer);
    const Answers answers = ask(&record, DERSuccess, DERSuccess);
    EXPECT_EQ(bytesOf(answers.data), fields.data);
    EXPECT_EQ(bytesOf(answers.version), Bytes(fields.version.begin(), fields.version.end()));
    EXPECT_EQ(bytesOf(answers.keybag), fields.keybag);
    EXPECT_EQ(answers.type, fourCC("sepi"));
    EXPECT_EQ(answers.algorithm, 1U);
    EXPECT_EQ(answers.size, 0xFFFFFFFE);
    EXPECT_TRUE(answers.keybagExists);
    EXPECT_TRUE(answers.compressionExists);
}

TEST(Img4Payload, givesNothingForOptionalFieldsThatItLacks) {
    const Bytes buffer = payload({});
    const Img4Record record = recordOf(buffer);
    const Answers answers = ask(&record, DERSuccess, DEREndOfSequence);
    EXPECT_EQ(answers.keybag.data, nullptr);
    EXPECT_FALSE(answers.keybagExists);
    EXPECT_FALSE(answers.compressionExists);
    EXPECT_EQ(answers.algorithm, 0xFFFFFFFF);
    EXPECT_EQ(answers.size, 0xFFFFFFFF);
}

TEST(Img4Payload, emptyKeybagDoesNotExist) {
    const Bytes buffer = sequence({ia5("IM4P"), ia5("sepi"), ia5("1"), octets({1}), octets({})});
    const Img4Record record = recordOf(buffer);
    EXPECT_FALSE(ask(&record, DERSuccess, DEREndOfSequence).keybagExists);
}

TEST(Img4Payload, sizeThatDoesNotFitIsRefusedWhenAskedFor) {
    Payload fields;
    fields.compression = compression(0, 0x100000000);
    const Bytes buffer = payload(fields);
    const Img4Record record = recordOf(buffer);
    const Answers answers = ask(&record, DERSuccess, DERBufferOverflow);
    EXPECT_EQ(answers.algorithm, 0xFFFFFFFF) << "both numbers say that there is no answer";
    EXPECT_EQ(answers.size, 0xFFFFFFFF);
    EXPECT_TRUE(answers.compressionExists);
}

TEST(Img4Payload, isAbsentWithoutData) {
    bool exists = true;
    const Bytes ticket = exampleTicket();
    Img4Record record;
    ASSERT_EQ(Img4DecodeInitManifest(ticket.data(), ticket.size(), &record), DERSuccess);
    EXPECT_EQ(Img4DecodePayloadExists(&record, &exists), DERSuccess);
    EXPECT_FALSE(exists);
    expectCleared(ask(&record, DEREndOfSequence, DEREndOfSequence));

    Payload empty;
    empty.data = {};
    const Bytes buffer = payload(empty);
    record = recordOf(buffer);
    EXPECT_EQ(Img4DecodePayloadExists(&record, &exists), DERSuccess);
    EXPECT_FALSE(exists);
    expectCleared(ask(&record, DEREndOfSequence, DEREndOfSequence));
}

TEST(Img4Payload, missingArgumentsAreRefused) {
    const Bytes buffer = exampleContainer();
    Img4Record record;
    std::uint32_t number = 77;
    bool flag = true;
    ASSERT_EQ(Img4DecodeInit(buffer.data(), buffer.size(), &record), DERSuccess);
    expectCleared(ask(nullptr, DERParamError, DERParamError));
    EXPECT_EQ(Img4DecodePayloadExists(nullptr, &flag), DERParamError);
    EXPECT_EQ(Img4DecodePayloadExists(&record, nullptr), DERParamError);
    EXPECT_EQ(Img4DecodeGetPayload(&record, nullptr), DERParamError);
    EXPECT_EQ(Img4DecodeGetPayloadType(&record, nullptr), DERParamError);
    EXPECT_EQ(Img4DecodePayloadKeybagExists(&record, nullptr), DERParamError);
    EXPECT_EQ(Img4DecodeGetPayloadCompressionInfo(&record, nullptr, &number), DERParamError);
    EXPECT_EQ(number, 0xFFFFFFFF);
    EXPECT_EQ(Img4DecodeGetPayloadCompressionInfo(&record, &number, nullptr), DERParamError);
    EXPECT_EQ(Img4DecodePayloadPropertiesExists(&record, nullptr), DERParamError);
    EXPECT_EQ(Img4DecodePayloadPropertiesExists(nullptr, &flag), DERParamError);
    EXPECT_EQ(Img4DecodeGetPayloadProperties(&record, nullptr), DERParamError);
    EXPECT_EQ(Img4DecodePayloadPropertyExistsByTag(&record, 0, nullptr), DERParamError);
    EXPECT_EQ(Img4DecodePayloadPropertyExistsByTag(nullptr, 0, &flag), DERParamError);
    EXPECT_EQ(Img4DecodePayloadPropertiesFindItemWithTag(&record.payloadRaw, 0, nullptr), DERParamError);
}

TEST(Img4PayloadProperties, presence) {
    struct Row {
        const char* name;
        Bytes properties;
        bool exists;
        DERReturn query; // of a query that needs the properties
    };
    const Row rows[] = {
        {"some", payloadProperties({property("entP", integer(1))}), true, DERSuccess},
        {"none", {}, false, DERParamError},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.name);
        Payload fields;
        fields.properties = row.properties;
        const Bytes buffer = payload(fields);
        const Img4Record record = recordOf(buffer);
        bool exists = !row.exists;
        bool found = false;
        DERItem item = {&octet, 1};
        EXPECT_EQ(Img4DecodePayloadPropertiesExists(&record, &exists), DERSuccess);
        EXPECT_EQ(exists, row.exists);
        EXPECT_EQ(Img4DecodeGetPayloadProperties(&record, &item), row.query);
        EXPECT_EQ(bytesOf(item), row.exists ? row.properties : Bytes{octet}) << "failure leaves the item alone";
        EXPECT_EQ(Img4DecodePayloadPropertyExistsByTag(&record, propertyTag("entP"), &found), row.query);
        EXPECT_EQ(found, row.exists);
        if (!row.exists)
            continue;
        EXPECT_EQ(Img4DecodePayloadPropertyExistsByTag(&record, propertyTag("entL"), &found), DEREndOfSequence);
        EXPECT_FALSE(found);
    }
}

TEST(Img4PayloadProperties, needAPayloadToBeDecoded) {
    const Img4Record none = {};
    bool flag = true;
    std::uint32_t number = 77;
    DERItem item = {&octet, 1};
    EXPECT_EQ(Img4DecodePayloadPropertiesExists(&none, &flag), DERDecodeError);
    EXPECT_EQ(Img4DecodeGetPayloadProperties(&none, &item), DERDecodeError);
    EXPECT_EQ(Img4DecodeGetPayloadPropertiesInteger(&none, propertyTag("entP"), &number), DERDecodeError);
    EXPECT_EQ(Img4DecodePayloadPropertyExistsByTag(&none, propertyTag("entP"), &flag), DERDecodeError);
    EXPECT_TRUE(flag);
    EXPECT_EQ(number, 77U);
    EXPECT_EQ(item.length, 1U);
}

struct FindCase {
    const char* name;
    Bytes properties;
    DERReturn expected;
    Bytes value = {};
};

Bytes inSet(const List& elements) {
    return sequence({ia5("PAYP"), set(elements)});
}

const Bytes wanted = property("want", integer(5));

const FindCase findCases[] = {
    {"sound", inSet({property("othr", integer(1)), wanted}), DERSuccess, {5}},
    {"first SEQUENCE behind another item", join({integer(1), inSet({wanted})}), DERSuccess, {5}},
    {"name counts, not the tag",
     inSet({item(propertyTag("othr"), sequence({ia5("want"), integer(6)}))}),
     DERSuccess,
     {6}},
    {"value of any type", inSet({property("want", set({boolean(true)}))}), DERSuccess, {1, 1, 0xFF}},
    {"element that holds no item", inSet({octets({0x30}), wanted}), DERSuccess, {5}},
    {"name without a value", inSet({item(propertyTag("want"), sequence({ia5("want")})), wanted}), DERSuccess, {5}},
    {"value before the name",
     inSet({item(propertyTag("want"), sequence({integer(1), ia5("want")})), wanted}),
     DERSuccess,
     {5}},
    {"SET for a SEQUENCE", inSet({item(propertyTag("want"), set({ia5("want"), integer(1)})), wanted}), DERSuccess, {5}},
    {"third element",
     inSet({item(propertyTag("want"), sequence({ia5("want"), integer(1), integer(2)})), wanted}),
     DERSuccess,
     {5}},
    {"element without any IA5String", inSet({item(propertyTag("want"), sequence({integer(1)})), wanted}),
     DEREndOfSequence},
    {"broken item before the name", inSet({item(propertyTag("want"), item(DERTagSequence, {5, 9})), wanted}),
     DERDecodeError},
    {"empty value", inSet({property("want", octets({}))}), DERUnexpectedTag},
    {"absent", inSet({property("othr", integer(1))}), DEREndOfSequence},
    {"broken element", sequence({ia5("PAYP"), item(DERTagSet, {0x05})}), DERDecodeError},
    {"wrong magic", sequence({ia5("PAYQ"), set({wanted})}), DERParamError},
    {"no magic", sequence({set({wanted})}), DERParamError},
    {"no SET", sequence({ia5("PAYP"), sequence({wanted})}), DEREndOfSequence},
    {"empty SEQUENCE", sequence({}), DERUnexpectedTag},
    {"no SEQUENCE", set({}), DEREndOfSequence},
    {"broken", {0x30, 0x05}, DERDecodeError},
};

TEST(Img4PayloadProperties, canBeFoundByName) {
    for (const FindCase& row : findCases) {
        SCOPED_TRACE(row.name);
        const DERItem properties = {row.properties.data(), row.properties.size()};
        DERItem value = {&octet, 1};
        EXPECT_EQ(Img4DecodePayloadPropertiesFindItemWithTag(&properties, fourCC("want"), &value), row.expected);
        EXPECT_EQ(bytesOf(value), row.expected == DERSuccess ? row.value : Bytes{octet});
    }
    const DERItem absent = {};
    DERItem value;
    EXPECT_EQ(Img4DecodePayloadPropertiesFindItemWithTag(&absent, fourCC("want"), &value), DERParamError);
    EXPECT_EQ(Img4DecodePayloadPropertiesFindItemWithTag(nullptr, fourCC("want"), &value), DERParamError);
}

TEST(Img4PayloadProperties, canHoldPropertiesThemselves) {
    const Bytes inner = property("verS", ia5("1.0"));
    const FindCase rows[] = {
        {"in a SET", sequence({ia5("vers"), set({property("bldn", integer(1)), inner})}), DERSuccess, {'1', '.', '0'}},
        {"in a SEQUENCE", sequence({ia5("vers"), sequence({inner})}), DERSuccess, {'1', '.', '0'}},
        {"absent", sequence({ia5("vers"), set({})}), DEREndOfSequence},
        {"value that holds no properties", sequence({ia5("vers"), octets(inner)}), DERUnexpectedTag},
        {"inner one with another name",
         sequence({ia5("vers"), set({item(propertyTag("verS"), sequence({ia5("verT"), ia5("1")}))})}),
         DERUnexpectedTag},
        {"octets behind", join({sequence({ia5("vers"), set({inner})}), {0}}), DERBufferOverflow},
        {"no SEQUENCE", set({ia5("vers"), set({inner})}), DERUnexpectedTag},
    };
    for (const FindCase& row : rows) {
        SCOPED_TRACE(row.name);
        const DERItem outer = {row.properties.data(), row.properties.size()};
        DERItem value = {&octet, 1};
        EXPECT_EQ(Img4DecodeGetPayloadVersionPropertyString(&outer, propertyTag("verS"), &value), row.expected);
        EXPECT_EQ(bytesOf(value), row.expected == DERSuccess ? row.value : Bytes{octet});
        EXPECT_EQ(Img4DecodeGetPayloadVersionPropertyString(nullptr, propertyTag("verS"), &value), DERParamError);
        EXPECT_EQ(Img4DecodeGetPayloadVersionPropertyString(&outer, propertyTag("verS"), nullptr), DERParamError);
    }
}

} // namespace
