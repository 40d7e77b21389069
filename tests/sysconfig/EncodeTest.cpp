// Objects, encoded.
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "sysconfig/SysConfig3Internal.h"
#include "tests/sysconfig/Blob.h"
#include "tests/sysconfig/Recorder.h"

namespace {

using sysconfig::SysConfig3Ptr;
using Lines = std::vector<std::string>;

std::uint8_t keyBytes[] = {'k', 'e', 'y'};
const SysConfigData hmacKey = {keyBytes, sizeof keyBytes};

TEST(Encode, writesTheSmallestBlob) {
    EXPECT_EQ(
        hexOf(encode(newObject().get())),
        "30 30 02 04 67 66 43 62 02 04 03 00 03 00 FF 85 9A C1 82 59 02 31 00 FF 84 EA 95 A8 41 02 31 00 FF 84 EA "
        "85 9C 49 0B 30 09 04 01 00 04 01 00 04 01 00");
}

TEST(Encode, writesEntriesInListOrder) {
    const SysConfig3Ptr object = newObject();
    sysConfig3AddPayloadEntry(object.get(), payloadData(keyWCh0, {1, 2}).get());
    sysConfig3AddPayloadEntry(object.get(), payloadDeleted(keyMiGB).get());
    sysConfig3AddPayloadEntry(object.get(), payloadString(0x01020304, "ab", "c").get());
    sysConfig3AddMetadataEntry(object.get(), metadataString("z", "").get());
    sysConfig3AddMetadataEntry(object.get(), metadataData("a", {7}).get());
    BlobParts parts;
    parts.payload = item("31", bytes("30 0D 02 04 30 68 43 57 16 01 2E 04 02 01 02 "
                                     "30 0C 02 04 42 47 69 4D 16 01 2E 01 01 FF "
                                     "30 0D 02 04 04 03 02 01 16 01 63 16 02 61 62"));
    parts.metadata = item("31", bytes("30 05 16 01 7A 16 00 30 06 16 01 61 04 01 07"));
    EXPECT_EQ(hexOf(encode(object.get())), hexOf(parts.whole()));
}

// One entry of each kind that the version takes, with lengths on both sides of where the length octets grow.
SysConfig3Ptr everyKind(SysConfig3Version version) {
    SysConfig3Ptr object = newObject(version);
    if (sysConfig3HMACIsSupported(version)) {
        sysConfig3SetHMACKey(object.get(), hmacKey);
        sysConfig3UpdateHMAC(object.get());
    }
    std::uint32_t key = 1;
    for (const std::size_t length : {1U, 127U, 128U, 255U, 256U, 70000U}) {
        const std::string characters(length, 'x');
        sysConfig3AddPayloadEntry(object.get(), payloadData(key++, text(characters)).get());
        sysConfig3AddPayloadEntry(object.get(), payloadString(key++, characters.c_str(), characters.c_str()).get());
        sysConfig3AddMetadataEntry(object.get(), metadataData(characters.c_str(), text(characters)).get());
        sysConfig3AddMetadataEntry(object.get(), metadataString(("s" + characters).c_str(), "").get());
    }
    if (version >= 0x30003)
        sysConfig3AddPayloadEntry(object.get(), payloadDeleted(key).get());
    return object;
}

TEST(Encode, isTheInverseOfDecodeInEveryVersion) {
    for (const SysConfig3Version version : {0x30001U, 0x30002U, 0x30003U}) {
        const Recorder recorder;
        const SysConfig3Ptr object = everyKind(version);
        const Bytes blob = encode(object.get());
        const SysConfig3Ptr decoded = decode(blob);
        EXPECT_TRUE(sysConfig3ObjectsAreEqual(object.get(), decoded.get())) << version;
        sysConfig3SetHMACKey(decoded.get(), hmacKey);
        EXPECT_EQ(encode(decoded.get()), blob) << version;
        EXPECT_EQ(Recorder::lines, Lines{}) << version;
    }
}

TEST(Encode, takesMoreEntriesThanSixteenBitsCount) {
    constexpr std::uint32_t count = 70000;
    const SysConfig3Ptr object = newObject();
    for (std::uint32_t key = 1; key <= count; ++key)
        ASSERT_TRUE(sysConfig3AddPayloadEntry(object.get(), payloadData(key, {1}).get()));
    const SysConfig3Ptr decoded = decode(encode(object.get()));
    EXPECT_EQ(sysConfig3GetPayloadEntryCount(decoded.get()), count);
    EXPECT_TRUE(sysConfig3ObjectsAreEqual(object.get(), decoded.get()));
}

TEST(Encode, writesAbsentHMACsAsEmpty) {
    const SysConfig3Ptr object = newObject(0x30001);
    std::uint8_t octet = 5;
    const SysConfigData absent = {};
    const SysConfigData present = {&octet, 1};
    const sysconfig::ManifestPtr some(allocSysConfig3Manifest(0x30001, &absent, &present, &absent));
    const sysconfig::ManifestPtr none(allocSysConfig3Manifest(0x30001, &absent, &absent, &absent));
    ASSERT_TRUE(_sysConfig3SetManifest(object.get(), some.get()));
    EXPECT_EQ(manifestOf(decode(encode(object.get())).get()), "absent | 05 | absent");
    ASSERT_TRUE(_sysConfig3SetManifest(object.get(), none.get()));
    EXPECT_EQ(manifestOf(decode(encode(object.get())).get()), "00 | 00 | 00");
}

// Encodes, expecting failure and an untouched result.
void expectRefusal(const __SysConfig3* object, const Lines& lines) {
    const Recorder recorder;
    std::uint8_t octet = 9;
    SysConfigData out = {&octet, 1};
    EXPECT_FALSE(encodeSysConfig3(object, &out));
    EXPECT_EQ(out.data, &octet);
    EXPECT_EQ(out.length, 1U);
    EXPECT_EQ(Recorder::lines, lines);
}

TEST(Encode, needsAnObjectAndAPlaceForTheResult) {
    const Recorder recorder;
    EXPECT_FALSE(encodeSysConfig3(nullptr, nullptr));
    EXPECT_EQ(Recorder::formats, Lines{"%s Invalid arguments. sysconfig = %p, sData = %p"});
    EXPECT_EQ(Recorder::lines, Lines{"encodeSysConfig3: Invalid arguments. sysconfig = (nil), sData = (nil)"});
    EXPECT_FALSE(encodeSysConfig3(newObject().get(), nullptr));
}

TEST(Encode, needsValidHMACsWhereTheVersionHasThem) {
    const SysConfig3Ptr object = newObject(0x30002);
    expectRefusal(object.get(),
                  {"Invalid HMAC key. sysconfig->hmacKey.data = (nil), sysconfig->hmacKey.length = 0. Did "
                   "you register HMAC key?",
                   "encodeSysConfig3: Failed to validate HMAC."});
    sysConfig3SetHMACKey(object.get(), hmacKey);
    expectRefusal(object.get(),
                  {"sysConfig3IsValidHMAC: Payload HMAC does not match.",
                   "sysConfig3IsValidHMAC: Metadata HMAC does not match.",
                   "sysConfig3IsValidHMAC: Full HMAC does not match.", "encodeSysConfig3: Failed to validate HMAC."});
    sysConfig3UpdateHMAC(object.get());
    EXPECT_FALSE(encode(object.get()).empty());
}

TEST(Encode, refusesWhatExceeds32BitsOfLengthBeforeItAllocates) {
    const SysConfig3Ptr object = newObject();
    for (const std::uint32_t key : {keyWCh0, keyMiGB}) {
        sysConfig3AddPayloadEntry(object.get(), payloadData(key, {1}).get());
        // The length is measured, but nothing is read before the sum is known.
        object->payload.last->dataLength = 0x90000000;
    }
    expectRefusal(object.get(), {"Failed to encode sequence with return: 7"});
}

// Records that only a fault could make.

TEST(EncodeOfABrokenRecord, raisesAnExceptionAndPrefersData) {
    const SysConfig3Ptr object = newObject();
    const sysconfig::PayloadContent content = {keyWCh0, "c", {keyBytes, 1}, "text", true};
    object->payload.appendWithoutIndex(sysconfig::makeEntry(content));
    const Recorder recorder;
    const Bytes blob = encode(object.get());
    EXPECT_EQ(Recorder::formats,
              Lines{"%s sysconfig payload entry must have exactly one of data/string/deleted set. data: %p string: %p "
                    "deleted: %d"});
    EXPECT_EQ(Recorder::lines.at(0).substr(0, 42), "!_createDEREncodeSysConfigPayloadEntries: ");
    EXPECT_NE(Recorder::lines.at(0).find("deleted: 255"), std::string::npos);
    EXPECT_EQ(payloadOf(decode(blob).get()), "WCh0=data 6B");
}

TEST(EncodeOfABrokenRecord, raisesAnExceptionAndPrefersAStringToTheFlag) {
    const SysConfig3Ptr object = newObject();
    object->payload.appendWithoutIndex(sysconfig::makeEntry(sysconfig::PayloadContent{keyWCh0, "c", {}, "text", true}));
    const Recorder recorder;
    EXPECT_EQ(payloadOf(decode(encode(object.get())).get()), "WCh0=string text");
    EXPECT_EQ(Recorder::lines.size(), 1U);
}

TEST(EncodeOfABrokenRecord, refusesAPayloadEntryWithoutAValue) {
    const SysConfig3Ptr object = newObject();
    object->payload.appendWithoutIndex(sysconfig::makeEntry(sysconfig::PayloadContent{keyWCh0, "c", {}, {}, false}));
    expectRefusal(object.get(), {"!_createDEREncodeSysConfigPayloadEntries: sysconfig payload entry must have exactly "
                                 "one of data/string/deleted set. data: (nil) string: (nil) deleted: 0",
                                 "!_createDEREncodeSysConfigPayloadEntries: should not have happened!",
                                 "_freeDEREncodeSysConfigPayloadEntries: DERPayload is NULL"});
}

TEST(EncodeOfABrokenRecord, refusesAMetadataEntryWithoutExactlyOneValue) {
    const struct {
        sysconfig::MetadataContent content;
        const char* exception;
    } rows[] = {
        {{"k", {keyBytes, 1}, "text"}, "sysconfig metadata entry cannot have both string and data fields populated!"},
        {{"k", {}, {}}, "sysconfig metadata entry must have EITHER string OR data fields populated!"},
    };
    for (const auto& row : rows) {
        const SysConfig3Ptr object = newObject();
        object->metadata.appendWithoutIndex(sysconfig::makeEntry(row.content));
        expectRefusal(object.get(), {std::string("!_createDEREncodeSysConfigMetadataEntries: ") + row.exception,
                                     "_freeDEREncodeSysConfigMetadataEntries: DERMetadata is NULL"});
    }
}

TEST(ExceptionHook, maySimplyBeAbsent) {
    const SysConfig3Ptr object = newObject();
    object->payload.appendWithoutIndex(sysconfig::makeEntry(sysconfig::PayloadContent{keyWCh0, "c", {}, {}, false}));
    EXPECT_EQ(getSysConfig3ExceptionHandler(), nullptr);
    EXPECT_TRUE(encode(object.get()).empty());
}

} // namespace
