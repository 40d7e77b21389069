// Keys and HMACs. The expected values were made with an independent tool:
//     printf '<message>' | openssl mac -digest SHA256 -macopt hexkey:6B6579 HMAC
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
const SysConfigData key = {keyBytes, sizeof keyBytes};

const char* const ofNothing = "5D5D139563C95B5967B9BD9A8C9B233A9DEDB45072794CD232DC1B74832607D0";
// 30 68 43 57 2E 01 02
const char* const ofWCh0 = "13E84F77C9BE42878526FB27C04762114F5638B117374283426185604A95267B";
// 30 68 43 57 2E 01 02, 42 47 69 4D "note" "text"
const char* const ofBoth = "6E9C73294E467068510AABCFD17C7FA414232E977E9ACA2DB5CFA2BA2CF37F5A";
// 42 47 69 4D "note" "text", 30 68 43 57 2E 01 02
const char* const ofBothReversed = "5956B2BFB9CB3A2E67B98E6AD0492F0995E68C21B38F30A07FBDA880296808CE";
// "name" "value", "blob" 07 08
const char* const ofMetadata = "3366491A800376F26A132D1C915300ABF7FBD8E2135305C47231BE5EE4C2C3EB";
// The stream of ofBoth, then that of ofMetadata.
const char* const ofAll = "12DDDEE5C9B199D6893AD8D1ED940968F6B6831E8576173A74A0FAF9734B38D2";
// 30 68 43 57 2E
const char* const ofDeleted = "471FE7DE8F0B79A3BBEE50736025292D6352A7B6B3BAAA3AB628C61BBC48EF17";

std::string withoutBlanks(std::string text) {
    std::erase(text, ' ');
    return text;
}

std::string hmacs(const char* payload, const char* metadata, const char* full) {
    return std::string(payload) + "|" + metadata + "|" + full;
}

SysConfig3Ptr keyedObject() {
    return SysConfig3Ptr(allocSysConfig3WithHMACKey(bCfg, 0x30002, key));
}

TEST(HMAC, coversTheEntriesInOrder) {
    const Recorder recorder;
    const SysConfig3Ptr object = keyedObject();
    const auto expect = [&](const char* payload, const char* metadata, const char* full) {
        EXPECT_EQ(withoutBlanks(manifestOf(object.get())), hmacs(payload, metadata, full));
        EXPECT_TRUE(sysConfig3IsValidHMAC(object.get()));
    };
    expect(ofNothing, ofNothing, ofNothing);
    EXPECT_TRUE(sysConfig3AddPayloadEntry(object.get(), payloadData(keyWCh0, {1, 2}).get()));
    expect(ofWCh0, ofNothing, ofWCh0);
    EXPECT_TRUE(sysConfig3AddPayloadEntry(object.get(), payloadString(keyMiGB, "text", "note").get()));
    expect(ofBoth, ofNothing, ofBoth);
    EXPECT_TRUE(sysConfig3AddMetadataEntry(object.get(), metadataString("name", "value").get()));
    EXPECT_TRUE(sysConfig3AddMetadataEntry(object.get(), metadataData("blob", {7, 8}).get()));
    expect(ofBoth, ofMetadata, ofAll);

    EXPECT_TRUE(sysConfig3DeleteMetadataEntryForKey(object.get(), "name"));
    EXPECT_TRUE(sysConfig3DeleteMetadataEntryForKey(object.get(), "blob"));
    expect(ofBoth, ofNothing, ofBoth);
    EXPECT_TRUE(sysConfig3AddPayloadEntry(object.get(), payloadData(keyWCh0, {1, 2}).get()));
    expect(ofBothReversed, ofNothing, ofBothReversed);
    EXPECT_TRUE(sysConfig3DeletePayloadEntryForKey(object.get(), keyMiGB));
    expect(ofWCh0, ofNothing, ofWCh0);
    EXPECT_EQ(Recorder::lines, Lines{});
}

TEST(HMAC, coversKeyAndCommentOfADeletedEntry) {
    BlobParts parts;
    parts.version = bytes("02 00 03 00");
    parts.payload = bytes("31 0E 30 0C 02 04 30 68 43 57 16 01 2E 01 01 FF");
    const SysConfig3Ptr object = decode(parts.whole());
    EXPECT_TRUE(sysConfig3SetHMACKey(object.get(), key));
    EXPECT_TRUE(sysConfig3UpdateHMAC(object.get()));
    EXPECT_EQ(withoutBlanks(manifestOf(object.get())), hmacs(ofDeleted, ofNothing, ofDeleted));
}

TEST(HMAC, isSupportedByVersion30002Only) {
    EXPECT_FALSE(sysConfig3HMACIsSupported(0x30001));
    EXPECT_TRUE(sysConfig3HMACIsSupported(0x30002));
    EXPECT_FALSE(sysConfig3HMACIsSupported(0x30003));
}

TEST(HMAC, isMadeInABufferOfTheCaller) {
    const SysConfig3Ptr object = keyedObject();
    for (const auto create : {sysConfig3CreatePayloadHMAC, sysConfig3CreateMetadataHMAC, sysConfig3CreateFullHMAC}) {
        SysConfigData out = {};
        ASSERT_TRUE(create(object.get(), &out));
        const sysconfig::BytesPtr owner(out.data);
        EXPECT_EQ(withoutBlanks(hexOf(out.data, out.length)), ofNothing);
    }
}

TEST(HMACKey, makesAnObjectThatIsNewStaleOrValid) {
    const Lines noKey = {"Invalid HMAC key. sysconfig->hmacKey.data = (nil), sysconfig->hmacKey.length = 0. Did you "
                         "register HMAC key?"};
    const Lines noMatch = {"sysConfig3IsValidHMAC: Payload HMAC does not match.",
                           "sysConfig3IsValidHMAC: Metadata HMAC does not match.",
                           "sysConfig3IsValidHMAC: Full HMAC does not match."};
    const SysConfig3Ptr object = newObject(0x30002);
    const auto payload = payloadData(keyWCh0, {1, 2});
    const auto metadata = metadataString("k", "v");
    const auto expectRefusals = [&](const Lines& reasons) {
        const struct {
            const char* operation;
            bool result;
        } changes[] = {
            {"sysConfig3AddPayloadEntry", sysConfig3AddPayloadEntry(object.get(), payload.get())},
            {"sysConfig3AddMetadataEntry", sysConfig3AddMetadataEntry(object.get(), metadata.get())},
            {"sysConfig3DeletePayloadEntryForKey", sysConfig3DeletePayloadEntryForKey(object.get(), keyMiGB)},
            {"sysConfig3DeleteMetadataEntryForKey", sysConfig3DeleteMetadataEntryForKey(object.get(), "m")},
        };
        Lines expected;
        for (const auto& change : changes) {
            EXPECT_FALSE(change.result) << change.operation;
            expected.insert(expected.end(), reasons.begin(), reasons.end());
            expected.push_back(std::string(change.operation) + ": Failed to validate HMAC.");
        }
        EXPECT_EQ(Recorder::take(), expected);
        EXPECT_EQ(payloadOf(object.get()) + metadataOf(object.get()), "MiGB=data 05m=string v");
    };
    ASSERT_TRUE(_sysConfig3AddPayloadEntry(object.get(), payloadData(keyMiGB, {5}).get()));
    ASSERT_TRUE(_sysConfig3AddMetadataEntry(object.get(), metadataString("m", "v").get()));

    const Recorder recorder;
    expectRefusals(noKey);
    EXPECT_TRUE(sysConfig3SetHMACKey(object.get(), key));
    expectRefusals(noMatch);
    EXPECT_EQ(manifestOf(object.get()), "00 | 00 | 00");
    EXPECT_TRUE(sysConfig3UpdateHMAC(object.get()));
    EXPECT_TRUE(sysConfig3AddPayloadEntry(object.get(), payload.get()));
    EXPECT_TRUE(sysConfig3AddMetadataEntry(object.get(), metadata.get()));
    EXPECT_EQ(Recorder::take(), Lines{});
    EXPECT_TRUE(sysConfig3DeletePayloadEntryForKey(object.get(), keyWCh0));
    EXPECT_TRUE(sysConfig3DeleteMetadataEntryForKey(object.get(), "k"));
    EXPECT_TRUE(sysConfig3SetHMACKey(object.get(), {}));
    expectRefusals(noKey);
    EXPECT_TRUE(sysConfig3SetHMACKey(object.get(), key));
    EXPECT_TRUE(sysConfig3IsValidHMAC(object.get()));
    std::uint8_t otherKey = 1;
    EXPECT_TRUE(sysConfig3SetHMACKey(object.get(), {&otherKey, 1}));
    Recorder::take();
    expectRefusals(noMatch);
}

TEST(HMAC, tellsWhichStoredValueDoesNotMatch) {
    const struct {
        SysConfigData __SysConfig3ManifestEntry::*hmac;
        const char* line;
    } rows[] = {
        {&__SysConfig3ManifestEntry::payloadHMAC, "sysConfig3IsValidHMAC: Payload HMAC does not match."},
        {&__SysConfig3ManifestEntry::metadataHMAC, "sysConfig3IsValidHMAC: Metadata HMAC does not match."},
        {&__SysConfig3ManifestEntry::fullHMAC, "sysConfig3IsValidHMAC: Full HMAC does not match."},
    };
    for (const auto& row : rows) {
        const SysConfig3Ptr object = keyedObject();
        SysConfigData& stored = object->manifest->*row.hmac;
        const Recorder recorder;
        stored.data[31] ^= 1;
        EXPECT_FALSE(sysConfig3IsValidHMAC(object.get()));
        stored.data[31] ^= 1;
        EXPECT_TRUE(sysConfig3IsValidHMAC(object.get()));
        stored.length = 31;
        EXPECT_FALSE(sysConfig3IsValidHMAC(object.get()));
        std::free(stored.data);
        stored = {};
        EXPECT_FALSE(sysConfig3IsValidHMAC(object.get()));
        EXPECT_EQ(Recorder::lines, (Lines{row.line, row.line, row.line}));
    }
}

TEST(HMAC, saysWhatIsMissing) {
    static __SysConfig3* keyless;
    static __SysConfig3* laterVersion;
    const SysConfig3Ptr newOne = newObject(0x30002);
    const SysConfig3Ptr later = newObject(0x30003);
    const SysConfig3Ptr keyed = keyedObject();
    static const __SysConfig3* ready;
    keyless = newOne.get();
    laterVersion = later.get();
    ready = keyed.get();
    static SysConfigData out;
    const struct {
        bool (*fails)();
        Lines formats;
        std::string lastLine;
    } rows[] = {
        {[] { return allocSysConfig3WithHMACKey(bCfg, 0x30003, key) == nullptr; },
         {"%s Requested version (0x%X) does not support HMAC."},
         "allocSysConfig3WithHMACKey: Requested version (0x30003) does not support HMAC."},
        {[] { return allocSysConfig3WithHMACKey(1, 0x30002, key) == nullptr; },
         {"%s invalid magic provided 0x%08X", "%s Failed to allocate sysconfig."},
         "allocSysConfig3WithHMACKey: Failed to allocate sysconfig."},
        {[] {
             return allocSysConfig3WithHMACKey(bCfg, 0x30002, {keyBytes, 0}) == nullptr;
         },
         {"%s Invalid HAMC key. sysconfig->hmacKey.data = %p, sysconfig->hmacKey.length = %u",
          "%s Invalid HAMC key. sysconfig->hmacKey.data = %p, sysconfig->hmacKey.length = %u",
          "%s Invalid HMAC key. sysconfig->hmacKey.data = %p, sysconfig->hmacKey.length = %u",
          "%s Failed to update HMAC."},
         "allocSysConfig3WithHMACKey: Failed to update HMAC."},
        {[] { return !sysConfig3SetHMACKey(nullptr, key); },
         {"%s sysconfig is NULL."},
         "sysConfig3SetHMACKey: sysconfig is NULL."},
        {[] { return !sysConfig3UpdateHMAC(nullptr); },
         {"%s sysconfig is NULL."},
         "sysConfig3UpdateHMAC: sysconfig is NULL."},
        {[] { return !sysConfig3UpdateHMAC(laterVersion); },
         {"%s This SysConfig version (0x%X) does not support HMAC."},
         "sysConfig3UpdateHMAC: This SysConfig version (0x30003) does not support HMAC."},
        {[] { return !sysConfig3IsValidHMAC(nullptr); },
         {"%s sysconfig is NULL."},
         "sysConfig3IsValidHMAC: sysconfig is NULL."},
        {[] { return !sysConfig3IsValidHMAC(keyless); },
         {"Invalid HMAC key. sysconfig->hmacKey.data = %p, sysconfig->hmacKey.length = %d. Did you register HMAC key?"},
         "Invalid HMAC key. sysconfig->hmacKey.data = (nil), sysconfig->hmacKey.length = 0. Did you register HMAC "
         "key?"},
        {[] { return !sysConfig3CreatePayloadHMAC(nullptr, &out); }, {}, ""},
        {[] { return !sysConfig3CreateMetadataHMAC(nullptr, &out); }, {}, ""},
        {[] { return !sysConfig3CreateFullHMAC(nullptr, &out); },
         {"%s sysconfig is NULL."},
         "sysConfig3CreateFullHMAC: sysconfig is NULL."},
        {[] { return !sysConfig3CreatePayloadHMAC(keyless, nullptr); },
         {"%s Invalid HAMC key. sysconfig->hmacKey.data = %p, sysconfig->hmacKey.length = %u"},
         "sysConfig3CreatePayloadHMAC: Invalid HAMC key. sysconfig->hmacKey.data = (nil), sysconfig->hmacKey.length = "
         "0"},
        {[] { return !sysConfig3CreateMetadataHMAC(ready, nullptr); },
         {"%s hmac is NULL"},
         "sysConfig3CreateMetadataHMAC: hmac is NULL"},
        {[] { return !sysConfig3CreateFullHMAC(ready, nullptr); },
         {"%s hmac is NULL"},
         "sysConfig3CreateFullHMAC: hmac is NULL"},
    };
    for (const auto& row : rows) {
        const Recorder recorder;
        EXPECT_TRUE(row.fails()) << row.lastLine;
        EXPECT_EQ(Recorder::formats, row.formats);
        EXPECT_EQ(Recorder::lines.empty() ? "" : Recorder::lines.back(), row.lastLine);
    }
    EXPECT_EQ(out.data, nullptr);
}

} // namespace
