// Digests of a record's parts, digests of a trust profile, and the length of a whole container.
#include "img4/Img4Trust.h"
#include "platform/Crypto.h"
#include "tests/der/Bytes.h"
#include "tests/support/MissingArguments.h"
#include "tools/makers/Img4Maker.h"

#include <algorithm>
#include <tuple>
#include <utility>

#include <gtest/gtest.h>

namespace {

using namespace img4maker;

// Operations that fail, and leave the last octet of their data's length.
DERReturn noteDigest(const DERItem* data, std::uint8_t* out, std::uint64_t length, const Img4TrustProfile* profile) {
    EXPECT_EQ(profile->computeDigest, noteDigest);
    std::fill(out, out + length, static_cast<std::uint8_t>(data->length));
    return DERIncompleteSequence;
}

DERReturn noteHash(const std::uint8_t* data, std::uint64_t length, std::uint8_t* out, void* context) {
    const DERItem item = {data, length};
    return noteDigest(&item, out, Img4HashLength, static_cast<const Img4TrustProfile*>(context));
}

const struct {
    const char* name;
    DERReturn (*hash)(const Img4Record*, std::uint8_t*, std::uint64_t);
    DERReturn (*hashWithCallback)(const Img4Record*, std::uint8_t*, std::uint64_t, Img4DigestFunction, void*);
    DERReturn (*digest)(const Img4Record*, std::uint8_t*, std::uint64_t, const Img4TrustProfile*);
    DERItem Img4Record::*raw;
} operations[] = {
    {"payload", Img4DecodeCopyPayloadHash, Img4DecodeCopyPayloadHashWithCallback, Img4DecodeCopyPayloadDigest,
     &Img4Record::payloadRaw},
    {"manifest", Img4DecodeCopyManifestHash, Img4DecodeCopyManifestHashWithCallback, Img4DecodeCopyManifestDigest,
     &Img4Record::manifestRaw},
};

class Img4Digests : public testing::Test {
protected:
    void SetUp() override {
        profile.computeDigest = noteDigest;
        ASSERT_EQ(Img4DecodeInit(buffer.data(), buffer.size(), &record), DERSuccess);
    }
    // Expects that `octet` was left in that many places and no others, and clears them.
    void expectOut(DERReturn result, DERReturn expected, std::size_t length, std::size_t octet) {
        Bytes filled(out.size());
        std::fill_n(filled.begin(), length, static_cast<std::uint8_t>(octet));
        EXPECT_EQ(result, expected);
        EXPECT_EQ(out, filled);
        out.assign(out.size(), 0);
    }

    const Bytes buffer = exampleContainer();
    Img4TrustProfile profile = {};
    Img4Record record;
    Bytes out = Bytes(Img4MaxDigestLength + 1);
};

TEST_F(Img4Digests, areTakenOfTheRawEncodingOnce) {
    std::fill(std::begin(record.payload.digest), std::end(record.payload.digest), std::uint8_t{0x51});
    std::fill(std::begin(record.manifest.digest), std::end(record.manifest.digest), std::uint8_t{0x51});
    for (const auto& row : operations) {
        SCOPED_TRACE(row.name);
        const DERItem raw = record.*row.raw;
        Bytes expected(out.size());
        ASSERT_TRUE(crypto::sha1(raw.data, raw.length, expected.data()));
        record.payloadHashed = record.manifestHashed = 0;
        EXPECT_EQ(row.hash(&record, out.data(), Img4HashLength), DERSuccess);
        EXPECT_EQ(out, expected);
        out.assign(out.size(), 0);
        expectOut(row.hashWithCallback(&record, out.data(), Img4HashLength, noteHash, &profile), DERIncompleteSequence,
                  Img4HashLength, raw.length);
        expectOut(row.digest(&record, out.data(), 32, &profile), DERIncompleteSequence, 32, raw.length);
        record.payloadHashed = record.manifestHashed = 1;
        expectOut(row.hash(&record, out.data(), Img4HashLength), DERSuccess, Img4HashLength, 0x51);
        expectOut(row.digest(&record, out.data(), 32, &profile), DERSuccess, 32, 0x51);
    }
    const DERItem& properties = record.manifestRaw;
    expectOut(Img4DecodeCopyPayloadPropertiesDigest(&properties, out.data(), 48, &profile), DERIncompleteSequence, 48,
              properties.length);
}

TEST_F(Img4Digests, refuseLengthsThatDoNotFitAndMissingArguments) {
    const Img4TrustProfile withoutOperation = {};
    const Img4Record none = {};
    const DERItem absent = {};
    for (const auto& row : operations) {
        SCOPED_TRACE(row.name);
        expectNeedsAll(DERParamError, row.hash, &record, out.data(), 20);
        expectNeedsAll(DERParamError, row.hashWithCallback, &record, out.data(), 20, noteHash, nullptr);
        expectNeedsAll(DERParamError, row.digest, &record, out.data(), 32, &profile);
        EXPECT_EQ(row.hash(&record, out.data(), 32), DERParamError);
        EXPECT_EQ(row.hash(&none, out.data(), 20), DEREndOfSequence);
        EXPECT_EQ(row.digest(&record, out.data(), 49, &profile), DERBufferOverflow);
        EXPECT_EQ(row.digest(&record, out.data(), 32, &withoutOperation), DERParamError);
        EXPECT_EQ(row.digest(&none, out.data(), 32, &profile), DEREndOfSequence);
    }
    const auto ofProperties = Img4DecodeCopyPayloadPropertiesDigest;
    expectNeedsAll(DERParamError, ofProperties, &record.payloadRaw, out.data(), 48, &profile);
    EXPECT_EQ(ofProperties(&record.payloadRaw, out.data(), 48, &withoutOperation), DERParamError);
    EXPECT_EQ(ofProperties(&record.payloadRaw, out.data(), 49, &profile), DERBufferOverflow);
    EXPECT_EQ(ofProperties(&absent, out.data(), 48, &profile), DERParamError);
    EXPECT_EQ(out, Bytes(out.size()));
}

TEST(Img4TrustDigests, areThoseOfFIPS180) {
    // FIPS 180-4's own example: "abc".
    const Bytes abc = {'a', 'b', 'c'};
    const DERItem view = itemOf(abc), absent = {};
    const std::pair<const Img4DigestInfo*, Bytes> rows[] = {
        {&kQDSupportDigestInfoSha1, {0xa9, 0x99, 0x3e, 0x36}},
        {&kQDSupportDigestInfoSha256, {0xba, 0x78, 0x16, 0xbf}},
        {&kQDSupportDigestInfoSha384, {0xcb, 0x00, 0x75, 0x3f}},
        {&kQDSupportDigestInfoSha512, {0xdd, 0xaf, 0x35, 0xa1}},
    };
    for (const auto& [info, start] : rows) {
        Img4TrustProfile profile = {};
        profile.digestInfo = info;
        const std::uint64_t length = info->length;
        Bytes once(length), inPieces(length);
        EXPECT_EQ(Img4DecodeComputeDigest(&view, once.data(), length, &profile), DERSuccess);
        EXPECT_EQ(Bytes(once.begin(), once.begin() + 4), start);
        for (const std::uint64_t other : {length - 1, length + 1})
            EXPECT_EQ(Img4DecodeComputeDigest(&view, inPieces.data(), other, &profile), DERBufferOverflow);

        Img4DigestState state;
        EXPECT_EQ(Img4DecodeDigestInit(&state, &profile), DERSuccess);
        for (const DERItem& piece : {DERItem{abc.data(), 1}, absent, DERItem{abc.data() + 1, 2}})
            EXPECT_EQ(Img4DecodeDigestUpdate(&state, &piece, &profile), DERSuccess);
        EXPECT_EQ(Img4DecodeDigestReturnHash(&state, inPieces.data(), length, &profile), DERParamError);
        EXPECT_EQ(Img4DecodeDigestFinal(&state, &profile), DERSuccess);
        EXPECT_EQ(Img4DecodeDigestReturnHash(&state, inPieces.data(), length - 1, &profile), DERBufferOverflow);
        EXPECT_EQ(inPieces, Bytes(length));
        EXPECT_EQ(Img4DecodeDigestReturnHash(&state, inPieces.data(), length + 1, &profile), DERSuccess);
        EXPECT_EQ(inPieces, once);
        EXPECT_EQ(Img4DecodeDigestFinal(&state, &profile), DERParamError) << "twice";
    }
}

TEST(Img4TrustDigests, areThoseOfOneDescriptionFromInitToReturnHash) {
    Img4TrustProfile profile = {}, other = {}, wrong = {};
    profile.digestInfo = &kQDSupportDigestInfoSha256;
    other.digestInfo = &kQDSupportDigestInfoSha384;
    // One that claims fewer octets than its implementation writes.
    const Img4DigestInfo tooShort = {20, nullptr, other.digestInfo->implementation};
    wrong.digestInfo = &tooShort;
    const DERItem piece = *profile.digestInfo->oid, absent = {};
    std::uint8_t out[Img4LongestDigest];
    Img4DigestState state;
    ASSERT_EQ(Img4DecodeDigestInit(&state, &profile), DERSuccess);
    EXPECT_EQ(Img4DecodeDigestUpdate(&state, &piece, &other), DERParamError);
    expectNeedsAll(DERParamError, Img4DecodeDigestUpdate, &state, &piece, &profile);
    EXPECT_EQ(Img4DecodeDigestFinal(&state, &other), DERParamError);
    EXPECT_EQ(Img4DecodeDigestReturnHash(&state, out, sizeof out, &profile), DERParamError);

    ASSERT_EQ(Img4DecodeDigestInit(&state, &profile), DERSuccess);
    ASSERT_EQ(Img4DecodeDigestFinal(&state, &profile), DERSuccess);
    EXPECT_EQ(Img4DecodeDigestReturnHash(&state, out, sizeof out, &other), DERParamError);
    expectNeedsAll(DERParamError, Img4DecodeDigestReturnHash, &state, out, sizeof out, &profile);
    expectNeedsAll(DERParamError, Img4DecodeDigestInit, &state, &profile);
    expectNeedsAll(DERParamError, Img4DecodeComputeDigest, &piece, out, 32, &profile);
    EXPECT_EQ(Img4DecodeComputeDigest(&absent, out, 32, &profile), DERParamError);
    EXPECT_EQ(Img4DecodeComputeDigest(&piece, out, tooShort.length, &wrong), DERParamError);
    EXPECT_EQ(Img4DecodeDigestInit(&state, &wrong), DERParamError);
    expectNeedsAll(DERParamError, sha1_digest, out, 1, out);
}

const Bytes magic = ia5("IMG4");

// The total is 0 on failure.
const std::tuple<const char*, Bytes, DERReturn, std::uint64_t> lengthCases[] = {
    {"short length", join({{0x30, 0x10}, magic}), DERSuccess, 18},
    {"long length", join({{0x30, 0x83, 0x01, 0x00, 0x00}, magic}), DERSuccess, 0x10005},
    {"longest length that fits", join({{0x30, 0x88}, Bytes(7, 0xFF), {0xF5}, magic}), DERSuccess, UINT64_MAX},
    {"length that wraps", join({{0x30, 0x88}, Bytes(7, 0xFF), {0xF6}, magic}), DERBufferOverflow, 0},
    {"other magic", join({{0x30, 0x10}, ia5("IM4P")}), DERUnexpectedTag, 0},
    {"magic of five characters", join({{0x30, 0x10}, ia5("IMG44")}), DERUnexpectedTag, 0},
    {"magic cut short", {0x30, 0x10, 0x16, 0x04, 'I', 'M', 'G'}, DERUnexpectedTag, 0},
    {"empty magic", {0x30, 0x10, 0x16, 0x00, 0x00, 0x00}, DERDecodeError, 0},
    {"SET", join({{0x31, 0x10}, magic}), DERUnexpectedTag, 0},
    {"empty SEQUENCE", join({{0x30, 0x00}, magic}), DERDecodeError, 0},
    {"nothing behind the header", {0x30, 0x10}, DERDecodeError, 0},
};

TEST(Img4Length, isKnownFromTheFirstOctets) {
    for (const auto& [name, prefix, expected, expectedTotal] : lengthCases) {
        std::uint64_t total = 77;
        EXPECT_EQ(Img4DecodeParseLengthFromBuffer(prefix.data(), prefix.size(), &total), expected) << name;
        EXPECT_EQ(total, expectedTotal) << name;
    }
    const Bytes ticket = exampleTicket();
    const std::uint32_t magicOfTicket = fourCC("IM4M");
    std::uint64_t total = 77;
    expectNeedsAll(Img4Failure, Img4DecodeParseLengthFromBufferWithTag, ticket.data(), 12, magicOfTicket, &total);
    EXPECT_EQ(total, 0U);
    EXPECT_EQ(Img4DecodeParseLengthFromBufferWithTag(ticket.data(), 12, magicOfTicket, &total), DERSuccess);
    EXPECT_EQ(total, ticket.size());
}

} // namespace
