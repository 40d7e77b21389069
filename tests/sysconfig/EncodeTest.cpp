// Objects, encoded.
#include <string>

#include <gtest/gtest.h>

#include "sysconfig/SysConfig3Internal.h"
#include "tests/sysconfig/Blob.h"
#include "tests/sysconfig/Recorder.h"

namespace {

using sysconfig::SysConfig3Ptr;

TEST(Encode, writesEntriesInListOrder) {
    const SysConfig3Ptr object = newObject();
    EXPECT_EQ(hexOf(encode(object)), hexOf(BlobParts().whole()));
    add(object, payloadData(keyWCh0, {1, 2}));
    add(object, payloadDeleted(keyMiGB, ""));
    add(object, payloadString(0x01020304, "ab", "c"));
    add(object, metadataString("z", ""));
    add(object, metadataData("a", {7}));
    const BlobParts parts = {.payload = item("31", bytes("30 0D 02 04 30 68 43 57 16 01 2E 04 02 01 02 "
                                                         "30 0C 02 04 42 47 69 4D 16 01 2E 01 01 FF "
                                                         "30 0D 02 04 04 03 02 01 16 01 63 16 02 61 62")),
                             .metadata = item("31", bytes("30 05 16 01 7A 16 00 30 06 16 01 61 04 01 07"))};
    EXPECT_EQ(hexOf(encode(object)), hexOf(parts.whole()));
}

TEST(Encode, writesAbsentHMACsAsEmpty) {
    const SysConfig3Ptr object = newObject(0x30001);
    std::uint8_t octet = 5;
    const SysConfigData absent = {};
    for (const SysConfigData& metadataHMAC : {SysConfigData{&octet, 1}, absent}) {
        const sysconfig::ManifestPtr manifest(allocSysConfig3Manifest(0x30001, &absent, &metadataHMAC, &absent));
        ASSERT_TRUE(_sysConfig3SetManifest(object.get(), manifest.get()));
        EXPECT_EQ(manifestOf(decode(encode(object))), metadataHMAC.data ? "absent | 05 | absent" : "00 | 00 | 00");
    }
}

// Encodes, expecting failure and an untouched result.
void expectRefusal(const SysConfig3Ptr& object, const Lines& lines) {
    const Recorder recorder;
    std::uint8_t octet = 9;
    SysConfigData out = {&octet, 1};
    EXPECT_FALSE(encodeSysConfig3(object.get(), &out));
    EXPECT_EQ(out.data, &octet);
    EXPECT_EQ(out.length, 1U);
    EXPECT_EQ(Recorder::lines, lines);
}

TEST(Encode, needsAnObjectAndAPlaceForTheResult) {
    const Recorder recorder;
    const Refusal refusals[] = {
        REFUSAL(encodeSysConfig3(nullptr, nullptr), "Invalid arguments. sysconfig = %p<(nil)>, sData = %p<(nil)>"),
    };
    Recorder::expect(refusals);
    EXPECT_FALSE(encodeSysConfig3(newObject().get(), nullptr));
}

TEST(Encode, needsValidHMACsWhereTheVersionHasThem) {
    const SysConfig3Ptr object = newObject(0x30002);
    expectRefusal(object, {"Invalid HMAC key. sysconfig->hmacKey.data = %p<(nil)>, sysconfig->hmacKey.length = "
                           "%d<0>. Did you register HMAC key?",
                           "encodeSysConfig3: Failed to validate HMAC."});
    sysConfig3SetHMACKey(object.get(), hmacKey);
    sysConfig3UpdateHMAC(object.get());
    object->manifest->fullHMAC.data[31] ^= 1;
    expectRefusal(object,
                  {"sysConfig3IsValidHMAC: Full HMAC does not match.", "encodeSysConfig3: Failed to validate HMAC."});
}

TEST(Encode, refusesWhatExceeds32BitsOfLengthBeforeItAllocates) {
    const SysConfig3Ptr object = newObject();
    for (const std::uint32_t key : {keyWCh0, keyMiGB}) {
        add(object, payloadData(key, {1}));
        // The length is measured, but nothing is read before the sum is known.
        object->payload.last->dataLength = 0x90000000;
    }
    expectRefusal(object, {"Failed to encode sequence with return: %d<7>"});
}

// Records that only a fault could make.

TEST(EncodeOfABrokenRecord, raisesAnExceptionAndPrefersDataThenAString) {
    const std::pair<sysconfig::Bytes, const char*> rows[] = {{{keyBytes, 1}, "WCh0=data 6B"}, {{}, "WCh0=string text"}};
    for (const auto& [data, list] : rows) {
        const SysConfig3Ptr object = newObject();
        object->payload.appendWithoutIndex(
            sysconfig::makeEntry(sysconfig::PayloadContent{keyWCh0, "c", data, "text", true}));
        const Recorder recorder;
        EXPECT_EQ(payloadOf(decode(encode(object))), list);
        ASSERT_EQ(Recorder::lines.size(), 1U);
        EXPECT_TRUE(Recorder::lines[0].ends_with("> deleted: %d<255>")) << Recorder::lines[0];
    }
}

TEST(EncodeOfABrokenRecord, refusesAPayloadEntryWithoutAValue) {
    const SysConfig3Ptr object = newObject();
    object->payload.appendWithoutIndex(sysconfig::makeEntry(sysconfig::PayloadContent{keyWCh0, "c", {}, {}, false}));
    expectRefusal(object, {"!_createDEREncodeSysConfigPayloadEntries: sysconfig payload entry must have exactly "
                           "one of data/string/deleted set. data: %p<(nil)> string: %p<(nil)> deleted: %d<0>",
                           "!_createDEREncodeSysConfigPayloadEntries: should not have happened!",
                           "_freeDEREncodeSysConfigPayloadEntries: DERPayload is NULL"});
    EXPECT_EQ(getSysConfig3ExceptionHandler(), nullptr);
    EXPECT_TRUE(encode(object).empty()); // without a hook too
}

TEST(EncodeOfABrokenRecord, refusesAMetadataEntryWithoutExactlyOneValue) {
    const std::pair<sysconfig::MetadataContent, const char*> rows[] = {
        {{"k", {keyBytes, 1}, "text"}, "sysconfig metadata entry cannot have both string and data fields populated!"},
        {{"k", {}, {}}, "sysconfig metadata entry must have EITHER string OR data fields populated!"},
    };
    for (const auto& [content, exception] : rows) {
        const SysConfig3Ptr object = newObject();
        object->metadata.appendWithoutIndex(sysconfig::makeEntry(content));
        expectRefusal(object, {std::string("!_createDEREncodeSysConfigMetadataEntries: ") + exception,
                               "_freeDEREncodeSysConfigMetadataEntries: DERMetadata is NULL"});
    }
}

} // namespace
