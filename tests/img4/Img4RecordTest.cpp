// What makes a record, and what it says of its parts: of the payload and its properties, of the manifest and its
// sections.
#include "img4/Img4.h"
#include "tests/der/Bytes.h"
#include "tests/support/MissingArguments.h"
#include "tools/makers/Img4Maker.h"

#include <cstring>
#include <span>
#include <sstream>
#include <tuple>

#include <gtest/gtest.h>

namespace {

using namespace img4maker;

constexpr std::uint32_t sepi = Img4FourCC('s', 'e', 'p', 'i');
constexpr std::uint32_t eksp = Img4FourCC('e', 'k', 's', 'p');
constexpr std::uint32_t brdI = Img4FourCC('b', 'r', 'd', 'I');
const std::uint8_t octet = 0;

using Initialise = DERReturn (*)(const std::uint8_t*, std::uint64_t, Img4Record*);

Img4Record recordOf(Initialise initialise, const Bytes& buffer) {
    Img4Record record;
    EXPECT_EQ(initialise(buffer.data(), buffer.size(), &record), DERSuccess);
    return record;
}

const Bytes soundPayload = payload({});
const Bytes soundManifest = manifest({});
const Bytes emptySequence = sequence({});

Bytes payloadWith(const List& tail) {
    return sequence({ia5("IM4P"), ia5("sepi"), ia5("1"), octets(filler(8)), join(tail)});
}

Bytes manifestOf(const Bytes& version, const Bytes& magic = ia5("IM4M")) {
    return sequence({magic, version, manifestBody({}), octets(filler(8)), emptySequence});
}

constexpr Initialise asContainer = Img4DecodeInit;
constexpr Initialise asPayload = Img4DecodeInitPayload;
constexpr Initialise asManifest = Img4DecodeInitManifest;
constexpr Initialise asUnsigned = Img4DecodeInitUnsignedManifest;

const std::tuple<const char*, Initialise, Bytes, DERReturn> cases[] = {
    {"trailing octet", asContainer, join({container(soundPayload, {}, {}), {0}}), DERBufferOverflow},
    {"SET for a container", asContainer, set({ia5("IMG4"), soundPayload}), DERUnexpectedTag},
    {"wrong magic", asContainer, sequence({ia5("IMG5"), soundPayload}), DERUnexpectedTag},
    {"no payload", asContainer, sequence({ia5("IMG4")}), DERIncompleteSequence},
    {"unsigned manifest in a container", asContainer, container(soundPayload, unsignedManifest({}), {}),
     DERIncompleteSequence},
    {"wrong magic of the restore information", asContainer,
     container(soundPayload, {}, sequence({ia5("IM4S"), set({})})), DERUnexpectedTag},

    {"wrong magic of the payload", asPayload, sequence({ia5("IM4Q"), ia5("sepi"), ia5("1"), octets({1})}),
     DERUnexpectedTag},
    {"algorithm 2", asContainer, container(payloadWith({compression(2, 5)}), {}, {}), DERParamError},
    {"compression without size", asPayload, payloadWith({sequence({integer(1)})}), DERParamError},
    {"payload properties with a wrong magic", asPayload, payloadWith({context(0, sequence({ia5("PAYQ"), set({})}))}),
     DERUnexpectedTag},
    // Neither table fits; the status is that of the table without properties.
    {"entry after the payload properties", asPayload, payloadWith({context(0, payloadProperties({})), integer(1)}),
     DERUnexpectedTag},

    {"manifest with a trailing octet", asManifest, join({soundManifest, {0}}), DERBufferOverflow},
    {"wrong magic of the manifest", asManifest, manifestOf(integer(0), ia5("IM4N")), DERUnexpectedTag},
    {"version 2", asManifest, manifestOf(integer(2)), DERSuccess},
    {"version 3", asManifest, manifestOf(integer(3)), DERUnexpectedTag},
    {"negative version", asManifest, manifestOf(item(DERTagInteger, {0x80})), DERDecodeError},
    {"unsigned for a signed manifest", asManifest, unsignedManifest({}), DERIncompleteSequence},
    {"signed for an unsigned manifest", asUnsigned, soundManifest, DERDecodeError},
    {"unsigned manifest", asUnsigned, unsignedManifest({}), DERSuccess},
    {"no octets", asContainer, {}, DERDecodeError},
};

TEST(Img4Init, reportsTheFirstCheckThatFails) {
    for (const auto& [name, initialise, octets, expected] : cases) {
        Img4Record record;
        // A vector's data may be null when it is empty; the buffer must not be.
        const std::uint8_t none = 0;
        EXPECT_EQ(initialise(octets.empty() ? &none : octets.data(), octets.size(), &record), expected) << name;
    }
}

TEST(Img4Init, missingArgumentsAreRefusedAndTheRecordIsZeroedAllTheSame) {
    const Img4Record zero = {};
    for (const Initialise initialise : {asContainer, asPayload, asManifest, asUnsigned}) {
        Img4Record record;
        std::memset(&record, 0xA5, sizeof record);
        EXPECT_EQ(initialise(nullptr, 4, &record), DERParamError);
        EXPECT_EQ(record.manifestHashed | record.payloadHashed, 0);
        EXPECT_EQ(std::memcmp(&record.payloadRaw, &zero.payloadRaw, sizeof record - offsetof(Img4Record, payloadRaw)),
                  0);
        EXPECT_EQ(initialise(soundPayload.data(), soundPayload.size(), nullptr), DERParamError);
    }
}

TEST(Img4Init, fieldsLieWhereTheyWereWritten) {
    const Bytes buffer = exampleContainer(), tailed = join({soundPayload, {7}});
    Img4Record record = recordOf(Img4DecodeInit, buffer);
    EXPECT_EQ(bytesOf(record.manifestRaw), exampleTicket());
    EXPECT_EQ(record.payloadRaw.data + record.payloadRaw.length + 4 /* header of [0] */, record.manifestRaw.data);
    EXPECT_EQ(bytesOf(record.manifest.body).front(), 0x31) << "the body is recorded with its header";
    EXPECT_EQ(bytesOf(record.manifest.signature), filler(48));
    record = recordOf(Img4DecodeInitPayload, tailed);
    EXPECT_EQ(record.payloadRaw.data, tailed.data());
    EXPECT_EQ(record.payloadRaw.length, tailed.size()) << "the buffer as it was given";
}

// Queries

std::uint64_t shown(const DERItem& item) {
    return item.length;
}

std::uint64_t shown(std::uint64_t number) {
    return number;
}

// What queries answer to these keys, as text: for each its status and what it leaves in an out-value that something
// stands in: the number, or how long the item is.
template <typename Keys, typename... Queries>
std::string answers(const Keys& keys, Queries... queries) {
    std::ostringstream text;
    const auto ask = [&]<typename... Parameters>(DERReturn (*query)(Parameters...)) {
        std::remove_pointer_t<std::tuple_element_t<std::tuple_size_v<Keys>, std::tuple<Parameters...>>> answer;
        if constexpr (std::is_same_v<decltype(answer), DERItem>)
            answer = {&octet, 1};
        else
            answer = true;
        text << std::apply([&](auto... key) { return query(key..., &answer); }, keys) << ':' << shown(answer) << ' ';
        EXPECT_EQ(std::apply([&](auto... key) { return query(key..., nullptr); }, keys), DERParamError);
    };
    (ask(queries), ...);
    return text.str();
}

std::string askSection(const Img4Record* record, std::uint32_t section) {
    return answers(std::tuple(record, section), Img4DecodeSectionExists) +
           answers(std::tuple(record, section, brdI), Img4DecodeGetIntegerFromSection);
}

// What all queries of a record's parts say: of the payload, of its properties, whether there are a manifest and restore
// information, each asked in two ways, what is found in these and in a third section, and in an object.
std::string ask(const Img4Record* record) {
    std::uint32_t algorithm = 77, size = 77;
    std::ostringstream compression;
    compression << Img4DecodeGetPayloadCompressionInfo(record, &algorithm, &size) << ':' << algorithm << ',' << size;
    return answers(std::tuple(record), Img4DecodePayloadExists, Img4DecodeGetPayload, Img4DecodeGetPayloadVersion,
                   Img4DecodeGetPayloadType, Img4DecodePayloadKeybagExists, Img4DecodeGetPayloadKeybag,
                   Img4DecodePayloadCompressionInfoExists) +
           compression.str() + " | " +
           answers(std::tuple(record), Img4DecodePayloadPropertiesExists, Img4DecodeGetPayloadProperties) +
           answers(std::tuple(record, propertyTag("entP")), Img4DecodePayloadPropertyExistsByTag,
                   Img4DecodeGetPayloadPropertiesInteger) +
           "| " + answers(std::tuple(record), Img4DecodeManifestExists, Img4DecodeRestoreInfoExists) +
           askSection(record, Img4SectionManifest) + askSection(record, Img4SectionRestoreInfo) +
           askSection(record, 2) + answers(std::tuple(record, sepi, eksp), Img4DecodeGetObjectPropertyBoolean);
}

// The payload's out-values are cleared on failure, those of its properties are left alone.
TEST(Img4Queries, sayWhatARecordHas) {
    const std::string nothing = "4294967295,4294967295 | ";
    const std::string plain = "0:1 0:64 0:8 0:1936027753 0:0 0:0 0:0 1:" + nothing;
    const std::string noPayload = "0:0 1:0 1:0 1:0 1:0 1:0 1:0 1:" + nothing;
    const std::string noProperties = "0:0 6:1 6:1 6:1 | ", noSections = "0:0 0:0 0:0 1:1 0:0 1:1 6:0 6:1 3:1 ";
    const Bytes emptyKeybag = sequence({ia5("IM4P"), ia5("sepi"), ia5("1"), octets({1}), octets({})});
    const auto withProperty = [](const char* name) {
        return payload({.properties = payloadProperties({property(name, integer(5))})});
    };
    const std::tuple<Initialise, Bytes, std::string> rows[] = {
        {Img4DecodeInitPayload,
         payload({.type = "ABCD", .keybag = {9, 8, 7}, .compression = compression(1, 0xFFFFFFFE)}),
         "0:1 0:64 0:8 0:1094861636 0:1 0:3 0:1 0:1,4294967294 | " + noProperties + noSections},
        {Img4DecodeInitPayload, emptyKeybag,
         "0:1 0:1 0:1 0:1936027753 0:0 0:0 0:0 1:" + nothing + noProperties + noSections},
        // A size that does not fit is refused when it is asked for; both numbers say that there is no answer.
        {Img4DecodeInitPayload, payload({.compression = compression(0, 0x100000000)}),
         "0:1 0:64 0:8 0:1936027753 0:0 0:0 0:1 7:" + nothing + noProperties + noSections},
        {Img4DecodeInitPayload, payload({.data = {}}), noPayload + noProperties + noSections},
        {Img4DecodeInitPayload, withProperty("entP"), plain + "0:1 0:28 0:1 0:5 | " + noSections},
        {Img4DecodeInitPayload, withProperty("entL"), plain + "0:1 0:28 1:0 1:1 | " + noSections},
        {Img4DecodeInit, container(payload({}), {}, restoreInfo({})),
         plain + noProperties + "0:0 0:1 0:0 1:1 0:1 1:1 6:0 6:1 3:1 "},
        {Img4DecodeInitManifest, exampleTicket(),
         noPayload + "3:1 3:1 3:1 3:1 | 0:1 0:0 0:1 0:12 0:0 1:1 6:0 6:1 0:1 "},
    };
    for (const auto& [initialise, octets, expected] : rows) {
        const Img4Record record = recordOf(initialise, octets);
        EXPECT_EQ(ask(&record), expected);
    }
    EXPECT_EQ(ask(nullptr),
              "6:0 6:0 6:0 6:0 6:0 6:0 6:0 6:" + nothing + "6:1 6:1 6:1 6:1 | 6:0 6:0 6:0 6:1 6:0 6:1 6:0 6:1 6:1 ");
    const Img4Record none = {};
    std::uint32_t number = 77;
    expectNeedsAll(DERParamError, Img4DecodeGetPayloadCompressionInfo, &none, &number, &number);
    EXPECT_EQ(number, 0xFFFFFFFF);
}

struct FindCase {
    const char* name;
    Bytes properties;
    DERReturn expected;
    Bytes value = {};
};

// Failure leaves the value alone.
template <typename Key>
void checkFinds(DERReturn (*find)(const DERItem*, Key, DERItem*), Key key, std::span<const FindCase> rows) {
    for (const FindCase& row : rows) {
        const DERItem properties = itemOf(row.properties);
        DERItem value = {&octet, 1};
        expectNeedsAll(DERParamError, find, &properties, key, &value);
        EXPECT_EQ(find(&properties, key, &value), row.expected) << row.name;
        EXPECT_EQ(bytesOf(value), row.expected == DERSuccess ? row.value : Bytes{octet}) << row.name;
    }
}

Bytes inSet(const List& elements) {
    return sequence({ia5("PAYP"), set(elements)});
}

// Before a sound property of that name, an element with the content `content`.
Bytes behind(const Bytes& content) {
    return inSet({item(propertyTag("want"), content), property("want", integer(5))});
}

TEST(Img4PayloadProperties, canBeFoundByName) {
    const Bytes wanted = property("want", integer(5)), wanted6 = sequence({ia5("want"), integer(6)});
    const FindCase rows[] = {
        {"sound", inSet({property("othr", integer(1)), wanted}), DERSuccess, {5}},
        {"first SEQUENCE behind another item", join({integer(1), inSet({wanted})}), DERSuccess, {5}},
        {"name counts, not the tag", inSet({item(propertyTag("othr"), wanted6)}), DERSuccess, {6}},
        {"value of any type", inSet({property("want", set({boolean(true)}))}), DERSuccess, {1, 1, 0xFF}},
        {"element that holds no item", inSet({octets({0x30}), wanted}), DERSuccess, {5}},
        {"third element", behind(sequence({ia5("want"), integer(1), integer(2)})), DERSuccess, {5}},
        {"element without any IA5String", behind(sequence({integer(1)})), DEREndOfSequence},
        {"broken item before the name", behind(item(DERTagSequence, {5, 9})), DERDecodeError},
        {"empty value", inSet({property("want", octets({}))}), DERUnexpectedTag},
        {"absent", inSet({property("othr", integer(1))}), DEREndOfSequence},
        {"broken element", sequence({ia5("PAYP"), item(DERTagSet, {0x05})}), DERDecodeError},
        {"wrong magic", sequence({ia5("PAYQ"), set({wanted})}), DERParamError},
        {"no SET", sequence({ia5("PAYP"), sequence({wanted})}), DEREndOfSequence},
        {"empty SEQUENCE", sequence({}), DERUnexpectedTag},
        {"no SEQUENCE", set({}), DEREndOfSequence},
        {"nothing", {}, DERParamError},
    };
    checkFinds(Img4DecodePayloadPropertiesFindItemWithTag, fourCC("want"), rows);
}

TEST(Img4PayloadProperties, canHoldPropertiesThemselves) {
    const Bytes inner = property("verS", ia5("1.0"));
    const Bytes misnamed = item(propertyTag("verS"), sequence({ia5("verT"), ia5("1")}));
    const FindCase rows[] = {
        {"in a SET", sequence({ia5("vers"), set({property("bldn", integer(1)), inner})}), DERSuccess, {'1', '.', '0'}},
        {"in a SEQUENCE", sequence({ia5("vers"), sequence({inner})}), DERSuccess, {'1', '.', '0'}},
        {"value that holds no properties", sequence({ia5("vers"), octets(inner)}), DERUnexpectedTag},
        {"inner one with another name", sequence({ia5("vers"), set({misnamed})}), DERUnexpectedTag},
    };
    checkFinds(Img4DecodeGetPayloadVersionPropertyString, propertyTag("verS"), rows);
}

Bytes manifestWith(std::uint64_t version, const List& manb, const char* name = "MANB") {
    return sequence({ia5("IM4M"), integer(version),
                     set({integer(1), property(name, version == 2 ? sequence(manb) : set(manb))}), octets({1}),
                     sequence({})});
}

TEST(Img4Manifest, lookupsNeedTheBodyTheyRunThrough) {
    const Bytes manp = object("MANP", {property("brdI", integer(12))});
    const Bytes sep = object("sepi", {property("eksp", boolean(true))});
    Bytes mixed = manifestWith(2, {manp, sep});
    mixed[10] = 1; // the version
    // With what becomes of a lookup of "eksp" in "sepi", and of one of "brdI" in the manifest's own properties.
    const std::tuple<const char*, Bytes, DERReturn, DERReturn> rows[] = {
        {"sound", manifestWith(0, {manp, sep}), DERSuccess, DERSuccess},
        {"MANP behind the object", manifestWith(1, {sep, manp}), DERSuccess, DERSuccess},
        {"version 2 with a SEQUENCE", manifestWith(2, {manp, sep}), DERSuccess, DERSuccess},
        {"version 1 with a SEQUENCE", mixed, DERUnexpectedTag, DERUnexpectedTag},
        {"no MANB", manifestWith(0, {manp, sep}, "MANA"), DEREndOfSequence, DEREndOfSequence},
        {"no MANP", manifestWith(0, {sep}), DEREndOfSequence, DEREndOfSequence},
        {"no object", manifestWith(0, {manp}), DEREndOfSequence, DERSuccess},
        {"broken element before the object", manifestWith(0, {manp, {0x05, 0x01}}), DERDecodeError, DERSuccess},
    };
    for (const auto& [name, manifest, ofObject, ofSection] : rows) {
        const Img4Record record = recordOf(Img4DecodeInitManifest, manifest);
        bool entitled = false;
        std::uint32_t board = 0;
        EXPECT_EQ(Img4DecodeGetObjectPropertyBoolean(&record, sepi, eksp, &entitled), ofObject) << name;
        EXPECT_EQ(entitled, ofObject == DERSuccess) << name;
        EXPECT_EQ(Img4DecodeGetIntegerFromSection(&record, Img4SectionManifest, brdI, &board), ofSection) << name;
        EXPECT_EQ(board, ofSection == DERSuccess ? 12U : 0U) << name;
    }
}

TEST(Img4Manifest, hasAStartAndALength) {
    const Bytes ticket = exampleTicket();
    const std::uint8_t* start = nullptr;
    std::uint32_t length = 0;
    Img4Record record = recordOf(Img4DecodeInitManifest, ticket);
    expectNeedsAll(DERParamError, Img4DecodeGetManifest, &record, &start, &length);
    EXPECT_EQ(Img4DecodeGetManifest(&record, &start, &length), DERSuccess);
    EXPECT_EQ(start, ticket.data());
    EXPECT_EQ(length, ticket.size());
    record.manifestRaw.length = 0x100000001;
    EXPECT_EQ(Img4DecodeGetManifest(&record, &start, &length), DERBufferOverflow);
    EXPECT_EQ(start, nullptr);
    EXPECT_EQ(length, 0U);
    record.manifestRaw = {};
    EXPECT_EQ(Img4DecodeGetManifest(&record, &start, &length), Img4Failure);
}

} // namespace
