#include "img4/Img4.h"
#include "platform/Crypto.h"
#include "tools/makers/Img4Maker.h"

#include <algorithm>
#include <array>

#include <gtest/gtest.h>

namespace {

using namespace img4maker;

using Hash = std::array<std::uint8_t, Img4HashLength>;
using Digest = std::array<std::uint8_t, Img4MaxDigestLength>;

// What a digest operation was called with.
struct Call {
    const std::uint8_t* data = nullptr;
    std::uint64_t length = 0;
    std::uint64_t outLength = 0;
    const Img4TrustProfile* profile = nullptr;
};

DERReturn noteHash(const std::uint8_t* data, std::uint64_t length, std::uint8_t* out, void* context) {
    *static_cast<Call*>(context) = {data, length, Img4HashLength, nullptr};
    std::fill(out, out + Img4HashLength, std::uint8_t{0x11});
    return DERDecodeError;
}

Call profileCall;

DERReturn noteDigest(const DERItem* data, std::uint8_t* out, std::uint64_t length, const Img4TrustProfile* profile) {
    profileCall = {data->data, data->length, length, profile};
    std::fill(out, out + length, std::uint8_t{0x22});
    return DERIncompleteSequence;
}

Img4TrustProfile makeProfile() {
    Img4TrustProfile profile = {};
    profile.computeDigest = noteDigest;
    return profile;
}

struct Operations {
    const char* name;
    DERReturn (*hash)(const Img4Record*, std::uint8_t*, std::uint64_t);
    DERReturn (*hashWithCallback)(const Img4Record*, std::uint8_t*, std::uint64_t, Img4DigestFunction, void*);
    DERReturn (*digest)(const Img4Record*, std::uint8_t*, std::uint64_t, const Img4TrustProfile*);
    DERItem Img4Record::*raw;
};

const Operations operations[] = {
    {"payload", Img4DecodeCopyPayloadHash, Img4DecodeCopyPayloadHashWithCallback, Img4DecodeCopyPayloadDigest,
     &Img4Record::payloadRaw},
    {"manifest", Img4DecodeCopyManifestHash, Img4DecodeCopyManifestHashWithCallback, Img4DecodeCopyManifestDigest,
     &Img4Record::manifestRaw},
};

class Img4Digests : public testing::Test {
protected:
    void SetUp() override { ASSERT_EQ(Img4DecodeInit(buffer.data(), buffer.size(), &record), DERSuccess); }

    const Bytes buffer = exampleContainer();
    const Img4TrustProfile profile = makeProfile();
    Img4Record record;
};

TEST_F(Img4Digests, areTakenOfTheRawEncoding) {
    for (const Operations& row : operations) {
        SCOPED_TRACE(row.name);
        const DERItem raw = record.*row.raw;
        Hash expected;
        Hash hash = {};
        ASSERT_TRUE(crypto::sha1(raw.data, raw.length, expected.data()));
        EXPECT_EQ(row.hash(&record, hash.data(), hash.size()), DERSuccess);
        EXPECT_EQ(hash, expected);

        Call call;
        EXPECT_EQ(row.hashWithCallback(&record, hash.data(), hash.size(), noteHash, &call), DERDecodeError)
            << "the callback's own result";
        EXPECT_EQ(call.data, raw.data);
        EXPECT_EQ(call.length, raw.length);
        EXPECT_EQ(hash[19], 0x11);

        Digest digest = {};
        EXPECT_EQ(row.digest(&record, digest.data(), 32, &profile), DERIncompleteSequence)
            << "the profile's own result";
        EXPECT_EQ(profileCall.data, raw.data);
        EXPECT_EQ(profileCall.length, raw.length);
        EXPECT_EQ(profileCall.outLength, 32U);
        EXPECT_EQ(profileCall.profile, &profile);
        EXPECT_EQ(digest[31], 0x22);
        EXPECT_EQ(digest[32], 0x00);
    }
}

TEST_F(Img4Digests, comeFromTheRecordOnceItHoldsThem) {
    std::fill(std::begin(record.payload.digest), std::end(record.payload.digest), std::uint8_t{0x51});
    std::fill(std::begin(record.manifest.digest), std::end(record.manifest.digest), std::uint8_t{0x51});
    record.payloadHashed = 1;
    record.manifestHashed = 1;
    for (const Operations& row : operations) {
        SCOPED_TRACE(row.name);
        Hash hash = {};
        Digest digest = {};
        EXPECT_EQ(row.hash(&record, hash.data(), hash.size()), DERSuccess);
        EXPECT_EQ(hash.back(), 0x51);
        EXPECT_EQ(row.hashWithCallback(&record, hash.data(), hash.size(), noteHash, nullptr), DERSuccess);
        EXPECT_EQ(row.digest(&record, digest.data(), 32, &profile), DERSuccess);
        EXPECT_EQ(digest[31], 0x51);
        EXPECT_EQ(digest[32], 0x00) << "no more than was asked for";
    }
}

TEST_F(Img4Digests, refuseLengthsThatDoNotFitAndMissingArguments) {
    Img4TrustProfile withoutOperation = {};
    const Img4Record none = {};
    for (const Operations& row : operations) {
        SCOPED_TRACE(row.name);
        Digest out = {};
        Call call;
        EXPECT_EQ(row.hash(&record, out.data(), 32), DERParamError);
        EXPECT_EQ(row.hash(&record, out.data(), 19), DERParamError);
        EXPECT_EQ(row.hash(&record, nullptr, 20), DERParamError);
        EXPECT_EQ(row.hash(nullptr, out.data(), 20), DERParamError);
        EXPECT_EQ(row.hash(&none, out.data(), 20), DEREndOfSequence);
        EXPECT_EQ(row.hashWithCallback(&record, out.data(), 32, noteHash, &call), DERParamError);
        EXPECT_EQ(row.hashWithCallback(&record, out.data(), 20, nullptr, &call), DERParamError);
        EXPECT_EQ(row.digest(&record, out.data(), 49, &profile), DERBufferOverflow);
        EXPECT_EQ(row.digest(&record, nullptr, 32, &profile), DERParamError);
        EXPECT_EQ(row.digest(&record, out.data(), 32, nullptr), DERParamError);
        EXPECT_EQ(row.digest(&record, out.data(), 32, &withoutOperation), DERParamError);
        EXPECT_EQ(row.digest(nullptr, out.data(), 32, &profile), DERParamError);
        EXPECT_EQ(row.digest(&none, out.data(), 32, &profile), DEREndOfSequence);
        EXPECT_EQ(out, Digest{});
    }
}

TEST_F(Img4Digests, ofPayloadPropertiesAreThoseOfTheItem) {
    DERItem properties;
    const DERItem absent = {};
    Digest digest = {};
    ASSERT_EQ(Img4DecodeGetPayloadProperties(&record, &properties), DERSuccess);
    EXPECT_EQ(Img4DecodeCopyPayloadPropertiesDigest(&properties, digest.data(), 48, &profile), DERIncompleteSequence);
    EXPECT_EQ(profileCall.data, properties.data);
    EXPECT_EQ(profileCall.length, properties.length);
    EXPECT_EQ(Img4DecodeCopyPayloadPropertiesDigest(&properties, digest.data(), 49, &profile), DERBufferOverflow);
    EXPECT_EQ(Img4DecodeCopyPayloadPropertiesDigest(&absent, digest.data(), 48, &profile), DERParamError);
    EXPECT_EQ(Img4DecodeCopyPayloadPropertiesDigest(nullptr, digest.data(), 48, &profile), DERParamError);
    EXPECT_EQ(Img4DecodeCopyPayloadPropertiesDigest(&properties, nullptr, 48, &profile), DERParamError);
    EXPECT_EQ(Img4DecodeCopyPayloadPropertiesDigest(&properties, digest.data(), 48, nullptr), DERParamError);
}

struct LengthCase {
    const char* name;
    Bytes prefix;
    DERReturn expected;
    std::uint64_t total = 0;
};

const LengthCase lengthCases[] = {
    {"short length", {0x30, 0x10, 0x16, 0x04, 'I', 'M', 'G', '4'}, DERSuccess, 18},
    {"long length", {0x30, 0x83, 0x01, 0x00, 0x00, 0x16, 0x04, 'I', 'M', 'G', '4'}, DERSuccess, 0x10005},
    {"longest length that fits",
     {0x30, 0x88, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xF5, 0x16, 0x04, 'I', 'M', 'G', '4'},
     DERSuccess,
     UINT64_MAX},
    {"length that wraps",
     {0x30, 0x88, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xF6, 0x16, 0x04, 'I', 'M', 'G', '4'},
     DERBufferOverflow},
    {"other magic", {0x30, 0x10, 0x16, 0x04, 'I', 'M', '4', 'P'}, DERUnexpectedTag},
    {"magic of five characters", {0x30, 0x10, 0x16, 0x05, 'I', 'M', 'G', '4', '4'}, DERUnexpectedTag},
    {"magic cut short", {0x30, 0x10, 0x16, 0x04, 'I', 'M', 'G'}, DERUnexpectedTag},
    {"empty magic", {0x30, 0x10, 0x16, 0x00, 0x00, 0x00}, DERDecodeError},
    {"SET", {0x31, 0x10, 0x16, 0x04, 'I', 'M', 'G', '4'}, DERUnexpectedTag},
    {"empty SEQUENCE", {0x30, 0x00, 0x16, 0x04, 'I', 'M', 'G', '4'}, DERDecodeError},
    {"indefinite length", {0x30, 0x80, 0x16, 0x04, 'I', 'M', 'G', '4'}, DERDecodeError},
    {"nothing behind the header", {0x30, 0x10}, DERDecodeError},
    {"one octet", {0x30}, DERDecodeError},
};

TEST(Img4Length, isKnownFromTheFirstOctets) {
    for (const LengthCase& row : lengthCases) {
        std::uint64_t total = 77;
        EXPECT_EQ(Img4DecodeParseLengthFromBuffer(row.prefix.data(), row.prefix.size(), &total), row.expected)
            << row.name;
        EXPECT_EQ(total, row.total) << row.name;
    }
}

TEST(Img4Length, ofOtherItemsGoesByTheirMagic) {
    const Bytes ticket = exampleTicket();
    std::uint64_t total = 77;
    EXPECT_EQ(Img4DecodeParseLengthFromBufferWithTag(ticket.data(), 12, fourCC("IM4M"), &total), DERSuccess);
    EXPECT_EQ(total, ticket.size());
    EXPECT_EQ(Img4DecodeParseLengthFromBuffer(ticket.data(), 12, &total), DERUnexpectedTag);
    EXPECT_EQ(Img4DecodeParseLengthFromBufferWithTag(nullptr, 12, fourCC("IM4M"), &total), Img4Failure);
    EXPECT_EQ(Img4DecodeParseLengthFromBufferWithTag(ticket.data(), 12, fourCC("IM4M"), nullptr), Img4Failure);
}

} // namespace
