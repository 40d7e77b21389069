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
    EXPECT_EQ(hexOf(encode(object.get())), hexOf(BlobParts().whole()));
    add(object, payloadData(keyWCh0, {1, 2}));
    add(object, payloadDeleted(keyMiGB, ""));
    add(object, payloadString(0x01020304, "ab", "c"));
    add(object, metadataString("z", ""));
    add(object, metadataData("a", {7}));
    const BlobParts parts = {.payload = item("31", bytes("30 0D 02 04 30 68 43 57 16 01 2E 04 02 01 02 "
                                                         "30 0C 02 04 42 47 69 4D 16 01 2E 01 01 FF "
                                                         "30 0D 02 04 04 03 02 01 16 01 63 16 02 61 62")),
                             .metadata = item("31", bytes("30 05 16 01 7A 16 00 30 06 16 01 61 04 01 07"))};
    EXPECT_EQ(hexOf(encode(object.get())), hexOf(parts.whole()));
}

TEST(Encode, writesAbsentHMACsAsEmpty) {
    const SysConfig3Ptr object = newObject(0x30001);
    std::uint8_t octet = 5;
    const SysConfigData absent = {};
    for (const SysConfigData& metadataHMAC : {SysConfigData{&octet, 1}, absent}) {
        const sysconfig::ManifestPtr manifest(allocSysConfig3Manifest(0x30001, &absent, &metadataHMAC, &absent));
        ASSERT_TRUE(_sysConfig3SetManifest(object.get(), manifest.get()));
        EXPECT_EQ(manifestOf(decode(encode(object.get()))), metadataHMAC.data ? "absent|05|absent" : "00|00|00");
    }
}

// Encodes, expecting failure and an untouched result.
void expectRefusal(const SysConfig3Ptr& object, const std::string& said) {
    const Recorder recorder;
    std::uint8_t octet = 9;
    SysConfigData out = {&octet, 1};
    EXPECT_FALSE(encodeSysConfig3(object.get(), &out));
    EXPECT_TRUE(out.data == &octet && out.length == 1);
    EXPECT_EQ(Recorder::said, said);
}

TEST(Encode, needsValidHMACsWhereTheVersionHasThem) {
    const SysConfig3Ptr object = newObject(0x30002);
    expectRefusal(object, noKeyRegistered + "\nencodeSysConfig3: Failed to validate HMAC.");
    sysConfig3SetHMACKey(object.get(), hmacKey);
    sysConfig3UpdateHMAC(object.get());
    object->manifest->fullHMAC.data[31] ^= 1;
    expectRefusal(object, "sysConfig3IsValidHMAC: Full HMAC does not match.\n"
                          "encodeSysConfig3: Failed to validate HMAC.");
}

TEST(Encode, refusesWhatExceeds32BitsOfLengthBeforeItAllocates) {
    const SysConfig3Ptr object = newObject();
    for (const std::uint32_t key : {keyWCh0, keyMiGB}) {
        add(object, payloadData(key, {1}));
        // The length is measured, but nothing is read before the sum is known.
        object->payload.last->dataLength = 0x90000000;
    }
    expectRefusal(object, "Failed to encode sequence with return: 7");
}

// Records that only a fault could make.

TEST(EncodeOfABrokenRecord, raisesAnExceptionAndPrefersDataThenAString) {
    const std::pair<sysconfig::Bytes, const char*> rows[] = {{{keyBytes, 1}, "WCh0=data 6B"}, {{}, "WCh0=string text"}};
    for (const auto& [data, list] : rows) {
        const SysConfig3Ptr object = newObject();
        object->payload.appendWithoutIndex(
            sysconfig::makeEntry(sysconfig::PayloadContent{keyWCh0, {}, data, "text", true}));
        const Recorder recorder;
        EXPECT_EQ(payloadOf(decode(encode(object.get()))), list);
        EXPECT_TRUE(Recorder::said.starts_with('!') && Recorder::said.ends_with(" deleted: 255")) << Recorder::said;
    }
}

TEST(EncodeOfABrokenRecord, refusesAnEntryWithoutExactlyOneValue) {
    const SysConfig3Ptr payload = newObject(), both = newObject(), neither = newObject();
    payload->payload.appendWithoutIndex(sysconfig::makeEntry(sysconfig::PayloadContent{keyWCh0, {}, {}, {}, false}));
    both->metadata.appendWithoutIndex(sysconfig::makeEntry(sysconfig::MetadataContent{"k", {keyBytes, 1}, "text"}));
    neither->metadata.appendWithoutIndex(sysconfig::makeEntry(sysconfig::MetadataContent{"k", {}, {}}));
    EXPECT_TRUE(encode(payload.get()).empty()); // without a hook too
    expectRefusal(payload, "!_createDEREncodeSysConfigPayloadEntries: sysconfig payload entry must have exactly one of "
                           "data/string/deleted set. data: (nil) string: (nil) deleted: 0\n"
                           "!_createDEREncodeSysConfigPayloadEntries: should not have happened!\n"
                           "_freeDEREncodeSysConfigPayloadEntries: DERPayload is NULL");
    expectRefusal(both, "!_createDEREncodeSysConfigMetadataEntries: sysconfig metadata entry cannot have both string "
                        "and data fields populated!\n_freeDEREncodeSysConfigMetadataEntries: DERMetadata is NULL");
    expectRefusal(neither,
                  "!_createDEREncodeSysConfigMetadataEntries: sysconfig metadata entry must have EITHER string "
                  "OR data fields populated!\n_freeDEREncodeSysConfigMetadataEntries: DERMetadata is NULL");
}

} // namespace
