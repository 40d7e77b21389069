#include "img4/Img4.h"
#include "tests/der/Bytes.h"
#include "tools/makers/Img4Maker.h"

#include <cstring>
#include <string>
#include <tuple>

#include <gtest/gtest.h>

namespace {

using namespace img4maker;

using Initialise = DERReturn (*)(const std::uint8_t*, std::uint64_t, Img4Record*);

const Bytes soundPayload = payload({});
const Bytes soundManifest = manifest({});
const Bytes emptySequence = sequence({});

Bytes payloadWith(const List& tail) {
    return sequence({ia5("IM4P"), ia5("sepi"), ia5("1"), octets(filler(8)), join(tail)});
}

const Bytes body = manifestBody({});
const Bytes negative = item(DERTagInteger, {0x80});

Bytes manifestOf(const Bytes& version, const Bytes& content = body, const Bytes& magic = ia5("IM4M")) {
    return sequence({magic, version, content, octets(filler(8)), emptySequence});
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
    {"unknown entry at the end", asContainer, sequence({ia5("IMG4"), soundPayload, context(2, {})}), DERUnexpectedTag},
    {"entry after the last", asContainer,
     sequence({ia5("IMG4"), soundPayload, context(1, restoreInfo({})), integer(1)}), DERDecodeError},
    {"unsigned manifest in a container", asContainer, container(soundPayload, unsignedManifest({}), {}),
     DERIncompleteSequence},
    {"wrong magic of the restore information", asContainer,
     container(soundPayload, {}, sequence({ia5("IM4S"), set({})})), DERUnexpectedTag},
    {"restore information in a SEQUENCE", asContainer,
     container(soundPayload, {}, sequence({ia5("IM4R"), emptySequence})), DERUnexpectedTag},

    {"wrong magic of the payload", asPayload, sequence({ia5("IM4Q"), ia5("sepi"), ia5("1"), octets({1})}),
     DERUnexpectedTag},
    {"payload without data", asPayload, sequence({ia5("IM4P"), ia5("sepi"), ia5("1")}), DERIncompleteSequence},
    {"algorithm 2", asContainer, container(payloadWith({compression(2, 5)}), {}, {}), DERParamError},
    {"compression without size", asPayload, payloadWith({sequence({integer(1)})}), DERParamError},
    {"payload properties with a wrong magic", asPayload, payloadWith({context(0, sequence({ia5("PAYQ"), set({})}))}),
     DERUnexpectedTag},
    {"compression is looked at before the properties", asPayload, payloadWith({compression(2, 1), context(0, {})}),
     DERParamError},
    // Neither table fits; the status is that of the table without properties.
    {"entry after the payload properties", asPayload, payloadWith({context(0, payloadProperties({})), integer(1)}),
     DERUnexpectedTag},
    {"entry after compression and properties", asPayload,
     payloadWith({compression(1, 1), context(0, payloadProperties({})), integer(1)}), DERDecodeError},

    {"manifest with a trailing octet", asManifest, join({soundManifest, {0}}), DERBufferOverflow},
    {"wrong magic of the manifest", asManifest, manifestOf(integer(0), body, ia5("IM4N")), DERUnexpectedTag},
    {"version 2", asManifest, manifestOf(integer(2)), DERSuccess},
    {"version 3", asManifest, manifestOf(integer(3)), DERUnexpectedTag},
    {"negative version", asManifest, manifestOf(negative), DERDecodeError},
    {"the magic is looked at before the version", asManifest, manifestOf(negative, body, ia5("IM4N")),
     DERUnexpectedTag},
    {"body in a SEQUENCE", asManifest, manifestOf(integer(0), emptySequence), DERUnexpectedTag},
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
    const Bytes buffer = exampleContainer();
    const Bytes ticket = exampleTicket();
    Img4Record record;
    ASSERT_EQ(Img4DecodeInit(buffer.data(), buffer.size(), &record), DERSuccess);
    EXPECT_EQ(bytesOf(record.manifestRaw), ticket);
    EXPECT_EQ(record.payloadRaw.data[0], 0x30);
    EXPECT_EQ(record.payloadRaw.data + record.payloadRaw.length + 4 /* header of [0] */, record.manifestRaw.data);
    EXPECT_EQ(bytesOf(record.manifest.version), Bytes({0}));
    EXPECT_EQ(bytesOf(record.manifest.body).front(), 0x31) << "the body is recorded with its header";
    EXPECT_EQ(bytesOf(record.manifest.signature), filler(48));
    EXPECT_EQ(bytesOf(record.restoreInfo.magic), Bytes({'I', 'M', '4', 'R'}));

    ASSERT_EQ(Img4DecodeInitManifest(ticket.data(), ticket.size(), &record), DERSuccess);
    EXPECT_EQ(record.manifestRaw.data, ticket.data());
    EXPECT_EQ(record.manifestRaw.length, ticket.size());
    EXPECT_EQ(record.payloadRaw.data, nullptr) << "nothing is left of the earlier use";

    const Bytes tailed = join({soundPayload, {7}});
    ASSERT_EQ(Img4DecodeInitPayload(tailed.data(), tailed.size(), &record), DERSuccess);
    EXPECT_EQ(record.payloadRaw.data, tailed.data());
    EXPECT_EQ(record.payloadRaw.length, tailed.size()) << "the buffer as it was given";
}

} // namespace
