// Digests of a record's parts, digests of a trust profile, and the length of a whole container.
#include "img4/Img4Trust.h"
#include "platform/Crypto.h"
#include "tests/der/Bytes.h"
#include "tests/support/MissingArguments.h"
#include "tools/makers/Img4Maker.h"

#include <algorithm>
#include <tuple>

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
    DERReturn (*hash)(const Img4Record*, std::uint8_t*, std::uint64_t);
    DERReturn (*hashWithCallback)(const Img4Record*, std::uint8_t*, std::uint64_t, Img4DigestFunction, void*);
    DERReturn (*digest)(const Img4Record*, std::uint8_t*, std::uint64_t, const Img4TrustProfile*);
    DERItem Img4Record::*raw;
} operations[] = {
    {Img4DecodeCopyPayloadHash, Img4DecodeCopyPayloadHashWithCallback, Img4DecodeCopyPayloadDigest,
     &Img4Record::payloadRaw},
    {Img4DecodeCopyManifestHash, Img4DecodeCopyManifestHashWithCallback, Img4DecodeCopyManifestDigest,
     &Img4Record::manifestRaw},
};

TEST(Img4Digests, areTakenOfTheRawEncodingOnceWhereTheyFit) {
    const Bytes buffer = exampleContainer();
    const Img4Record none = {};
    const Img4TrustProfile withoutOperation = {};
    Img4TrustProfile profile = {};
    Img4Record record;
    Bytes out(Img4MaxDigestLength + 1);
    // Expects that `octet` was left in that many places and no others, and clears them.
    const auto expectOut = [&](DERReturn result, DERReturn expected, std::size_t length, std::size_t octet) {
        Bytes filled(out.size());
        std::fill_n(filled.begin(), length, static_cast<std::uint8_t>(octet));
        EXPECT_EQ(result, expected);
        EXPECT_EQ(out, filled);
        out.assign(out.size(), 0);
    };
    profile.computeDigest = noteDigest;
    ASSERT_EQ(Img4DecodeInit(buffer.data(), buffer.size(), &record), DERSuccess);
    std::fill(std::begin(record.payload.digest), std::end(record.payload.digest), std::uint8_t{0x51});
    std::fill(std::begin(record.manifest.digest), std::end(record.manifest.digest), std::uint8_t{0x51});
    for (const auto& row : operations) {
        const DERItem raw = record.*row.raw;
        expectNeedsAll(DERParamError, row.hash, &record, out.data(), 20);
        expectNeedsAll(DERParamError, row.hashWithCallback, &record, out.data(), 20, noteHash, nullptr);
        expectNeedsAll(DERParamError, row.digest, &record, out.data(), 32, &profile);
        EXPECT_EQ(row.hash(&record, out.data(), 32), DERParamError);
        EXPECT_EQ(row.hash(&none, out.data(), 20), DEREndOfSequence);
        EXPECT_EQ(row.digest(&record, out.data(), 49, &profile), DERBufferOverflow);
        EXPECT_EQ(row.digest(&record, out.data(), 32, &withoutOperation), DERParamError);
        expectOut(row.digest(&none, out.data(), 32, &profile), DEREndOfSequence, 0, 0);

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
    const auto ofProperties = Img4DecodeCopyPayloadPropertiesDigest;
    const DERItem properties = record.manifestRaw, absent = {};
    expectNeedsAll(DERParamError, ofProperties, &properties, out.data(), 48, &profile);
    EXPECT_EQ(ofProperties(&properties, out.data(), 48, &withoutOperation), DERParamError);
    EXPECT_EQ(ofProperties(&properties, out.data(), 49, &profile), DERBufferOverflow);
    EXPECT_EQ(ofProperties(&absent, out.data(), 48, &profile), DERParamError);
    expectOut(ofProperties(&properties, out.data(), 48, &profile), DERIncompleteSequence, 48, properties.length);
}

// That the digests are right is seen from the signatures over them.
TEST(Img4TrustDigests, areThoseOfOneDescriptionInPiecesAsAtOnce) {
    Img4TrustProfile profile = {}, other = {}, wrong = {};
    profile.digestInfo = &kQDSupportDigestInfoSha256;
    other.digestInfo = &kQDSupportDigestInfoSha384;
    // One that claims fewer octets than its implementation writes.
    const Img4DigestInfo tooShort = {20, nullptr, other.digestInfo->implementation};
    wrong.digestInfo = &tooShort;
    const DERItem whole = *profile.digestInfo->oid, absent = {};
    Bytes once(32), inPieces(32);
    expectNeedsAll(DERParamError, Img4DecodeComputeDigest, &whole, once.data(), 32, &profile);
    EXPECT_EQ(Img4DecodeComputeDigest(&absent, once.data(), 32, &profile), DERParamError);
    EXPECT_EQ(Img4DecodeComputeDigest(&whole, once.data(), tooShort.length, &wrong), DERParamError);
    EXPECT_EQ(Img4DecodeComputeDigest(&whole, once.data(), 31, &profile), DERBufferOverflow);
    EXPECT_EQ(Img4DecodeComputeDigest(&whole, once.data(), 33, &profile), DERBufferOverflow);
    EXPECT_EQ(Img4DecodeComputeDigest(&whole, once.data(), 32, &profile), DERSuccess);

    Img4DigestState state;
    expectNeedsAll(DERParamError, Img4DecodeDigestInit, &state, &profile);
    EXPECT_EQ(Img4DecodeDigestInit(&state, &wrong), DERParamError);
    ASSERT_EQ(Img4DecodeDigestInit(&state, &profile), DERSuccess);
    for (const DERItem& piece : {DERItem{whole.data, 1}, absent, DERItem{whole.data + 1, whole.length - 1}})
        EXPECT_EQ(Img4DecodeDigestUpdate(&state, &piece, &profile), DERSuccess);
    EXPECT_EQ(Img4DecodeDigestUpdate(&state, &whole, &other), DERParamError);
    expectNeedsAll(DERParamError, Img4DecodeDigestUpdate, &state, &whole, &profile);
    EXPECT_EQ(Img4DecodeDigestReturnHash(&state, inPieces.data(), 32, &profile), DERParamError);
    EXPECT_EQ(Img4DecodeDigestFinal(&state, &profile), DERSuccess);
    EXPECT_EQ(Img4DecodeDigestFinal(&state, &profile), DERParamError) << "twice";
    expectNeedsAll(DERParamError, Img4DecodeDigestReturnHash, &state, inPieces.data(), 32, &profile);
    EXPECT_EQ(Img4DecodeDigestReturnHash(&state, inPieces.data(), 48, &other), DERParamError);
    EXPECT_EQ(Img4DecodeDigestReturnHash(&state, inPieces.data(), 31, &profile), DERBufferOverflow);
    EXPECT_EQ(inPieces, Bytes(32));
    EXPECT_EQ(Img4DecodeDigestReturnHash(&state, inPieces.data(), 33, &profile), DERSuccess);
    EXPECT_EQ(inPieces, once);

    ASSERT_EQ(Img4DecodeDigestInit(&state, &profile), DERSuccess);
    EXPECT_EQ(Img4DecodeDigestFinal(&state, &other), DERParamError);
    EXPECT_EQ(Img4DecodeDigestReturnHash(&state, inPieces.data(), 32, &profile), DERParamError);
    expectNeedsAll(DERParamError, sha1_digest, once.data(), 1, once.data());
}

const Bytes magic = ia5("IMG4");

// The total is 0 on failure.
const std::tuple<const char*, Bytes, DERReturn, std::uint64_t> lengthCases[] = {
    {"longest length that fits", join({{0x30, 0x88}, Bytes(7, 0xFF), {0xF5}, magic}), DERSuccess, UINT64_MAX},
    {"length that wraps", join({{0x30, 0x88}, Bytes(7, 0xFF), {0xF6}, magic}), DERBufferOverflow, 0},
    {"other magic", join({{0x30, 0x10}, ia5("IM4P")}), DERUnexpectedTag, 0},
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
