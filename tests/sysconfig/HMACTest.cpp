// Keys and HMACs. The expected values were made with an independent tool:
//     printf '<message>' | openssl mac -digest SHA256 -macopt hexkey:6B6579 HMAC
#include <string>

#include <gtest/gtest.h>

#include "sysconfig/SysConfig3Internal.h"
#include "tests/sysconfig/Blob.h"
#include "tests/sysconfig/Recorder.h"

namespace {

using sysconfig::SysConfig3Ptr;

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

// The manifest, "<payload>|<metadata>|<full>".
std::string hmacsOf(const SysConfig3Ptr& object) {
    std::string text = manifestOf(object);
    std::erase(text, ' ');
    return text;
}

std::string hmacs(const char* payload, const char* metadata, const char* full) {
    return std::string(payload) + "|" + metadata + "|" + full;
}

SysConfig3Ptr keyedObject() {
    return SysConfig3Ptr(allocSysConfig3WithHMACKey(bCfg, 0x30002, hmacKey));
}

TEST(HMAC, coversTheEntriesInOrder) {
    const Recorder recorder;
    const SysConfig3Ptr object = keyedObject();
    const auto expect = [&](const char* payload, const char* metadata, const char* full) {
        EXPECT_EQ(hmacsOf(object), hmacs(payload, metadata, full));
        EXPECT_TRUE(sysConfig3IsValidHMAC(object.get()));
    };
    expect(ofNothing, ofNothing, ofNothing);
    EXPECT_TRUE(add(object, payloadData(keyWCh0, {1, 2})));
    expect(ofWCh0, ofNothing, ofWCh0);
    EXPECT_TRUE(add(object, payloadString(keyMiGB, "text", "note")));
    expect(ofBoth, ofNothing, ofBoth);
    EXPECT_TRUE(add(object, metadataString("name", "value")));
    EXPECT_TRUE(add(object, metadataData("blob", {7, 8})));
    expect(ofBoth, ofMetadata, ofAll);

    EXPECT_TRUE(sysConfig3DeleteMetadataEntryForKey(object.get(), "name"));
    EXPECT_TRUE(sysConfig3DeleteMetadataEntryForKey(object.get(), "blob"));
    EXPECT_TRUE(add(object, payloadData(keyWCh0, {1, 2})));
    expect(ofBothReversed, ofNothing, ofBothReversed);
    EXPECT_TRUE(sysConfig3DeletePayloadEntryForKey(object.get(), keyMiGB));
    expect(ofWCh0, ofNothing, ofWCh0);
    EXPECT_EQ(Recorder::lines, Lines{});
}

TEST(HMAC, coversKeyAndCommentOfADeletedEntry) {
    const SysConfig3Ptr object = decodeParts(
        {.version = bytes("02 00 03 00"), .payload = bytes("31 0E 30 0C 02 04 30 68 43 57 16 01 2E 01 01 FF")});
    EXPECT_TRUE(sysConfig3SetHMACKey(object.get(), hmacKey));
    EXPECT_TRUE(sysConfig3UpdateHMAC(object.get()));
    EXPECT_EQ(hmacsOf(object), hmacs(ofDeleted, ofNothing, ofDeleted));
}

TEST(HMAC, isMadeInABufferOfTheCaller) {
    const SysConfig3Ptr object = keyedObject();
    add(object, payloadData(keyWCh0, {1, 2}));
    add(object, metadataString("name", "value"));
    std::string created;
    for (const auto create : {sysConfig3CreatePayloadHMAC, sysConfig3CreateMetadataHMAC, sysConfig3CreateFullHMAC}) {
        SysConfigData out = {};
        ASSERT_TRUE(create(object.get(), &out));
        const sysconfig::BytesPtr owner(out.data);
        created += (created.empty() ? "" : " | ") + hexOf(out.data, out.length);
    }
    EXPECT_EQ(created, manifestOf(object));
}

TEST(HMACKey, makesAnObjectThatIsNewStaleOrValid) {
    const Lines noKey = {"Invalid HMAC key. sysconfig->hmacKey.data = %p<(nil)>, sysconfig->hmacKey.length = %d<0>. "
                         "Did you register HMAC key?"};
    const Lines noMatch = {"sysConfig3IsValidHMAC: Payload HMAC does not match.",
                           "sysConfig3IsValidHMAC: Metadata HMAC does not match.",
                           "sysConfig3IsValidHMAC: Full HMAC does not match."};
    const SysConfig3Ptr object = newObject(0x30002);
    ASSERT_TRUE(_sysConfig3AddPayloadEntry(object.get(), payloadData(keyMiGB, {5}).get()));
    ASSERT_TRUE(_sysConfig3AddMetadataEntry(object.get(), metadataString("m", "v").get()));
    const auto expectChanges = [&](bool allowed) {
        for (const bool changed : {add(object, payloadData(keyWCh0, {1, 2})), add(object, metadataString("k", "v")),
                                   sysConfig3DeletePayloadEntryForKey(object.get(), keyWCh0),
                                   sysConfig3DeleteMetadataEntryForKey(object.get(), "k")})
            EXPECT_EQ(changed, allowed);
    };
    const auto expectRefusals = [&](const Lines& reasons) {
        Recorder::take();
        expectChanges(false);
        Lines expected;
        for (const char* operation : {"sysConfig3AddPayloadEntry", "sysConfig3AddMetadataEntry",
                                      "sysConfig3DeletePayloadEntryForKey", "sysConfig3DeleteMetadataEntryForKey"}) {
            expected.insert(expected.end(), reasons.begin(), reasons.end());
            expected.push_back(operation + std::string(": Failed to validate HMAC."));
        }
        EXPECT_EQ(Recorder::take(), expected);
        EXPECT_EQ(payloadOf(object) + metadataOf(object), "MiGB=data 05m=string v");
    };
    const Recorder recorder;
    expectRefusals(noKey);
    EXPECT_TRUE(sysConfig3SetHMACKey(object.get(), hmacKey));
    expectRefusals(noMatch);
    EXPECT_EQ(manifestOf(object), "00 | 00 | 00");
    EXPECT_TRUE(sysConfig3UpdateHMAC(object.get()));
    expectChanges(true);
    EXPECT_EQ(Recorder::take(), Lines{});
    EXPECT_TRUE(sysConfig3SetHMACKey(object.get(), {}));
    expectRefusals(noKey);
    EXPECT_TRUE(sysConfig3SetHMACKey(object.get(), hmacKey));
    EXPECT_TRUE(sysConfig3IsValidHMAC(object.get()));
    EXPECT_TRUE(sysConfig3SetHMACKey(object.get(), {keyBytes, 1}));
    expectRefusals(noMatch);
}

TEST(HMAC, tellsWhichStoredValueDoesNotMatch) {
    const std::pair<SysConfigData __SysConfig3ManifestEntry::*, const char*> rows[] = {
        {&__SysConfig3ManifestEntry::payloadHMAC, "sysConfig3IsValidHMAC: Payload HMAC does not match."},
        {&__SysConfig3ManifestEntry::metadataHMAC, "sysConfig3IsValidHMAC: Metadata HMAC does not match."},
        {&__SysConfig3ManifestEntry::fullHMAC, "sysConfig3IsValidHMAC: Full HMAC does not match."},
    };
    for (const auto& [hmac, line] : rows) {
        const SysConfig3Ptr object = keyedObject();
        SysConfigData& stored = object->manifest->*hmac;
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
        EXPECT_EQ(Recorder::lines, (Lines{line, line, line}));
    }
}

TEST(HMAC, saysWhatIsMissing) {
    const SysConfig3Ptr keyless = newObject(0x30002), later = newObject(0x30003), ready = keyedObject();
    SysConfigData out = {};
    const Recorder recorder;
    const Refusal refusals[] = {
        REFUSAL(allocSysConfig3WithHMACKey(bCfg, 0x30003, hmacKey),
                "Requested version (0x%X<30003>) does not support HMAC."),
        REFUSAL(sysConfig3SetHMACKey(nullptr, hmacKey), "sysconfig is NULL."),
        REFUSAL(sysConfig3UpdateHMAC(nullptr), "sysconfig is NULL."),
        REFUSAL(sysConfig3UpdateHMAC(later.get()), "This SysConfig version (0x%X<30003>) does not support HMAC."),
        REFUSAL(sysConfig3IsValidHMAC(nullptr), "sysconfig is NULL."),
        {!sysConfig3IsValidHMAC(keyless.get()), "Invalid HMAC key. sysconfig->hmacKey.data = %p<(nil)>, "
                                                "sysconfig->hmacKey.length = %d<0>. Did you register HMAC key?"},
        REFUSAL(sysConfig3CreateFullHMAC(nullptr, &out), "sysconfig is NULL."),
        REFUSAL(sysConfig3CreatePayloadHMAC(keyless.get(), nullptr),
                "Invalid HAMC key. sysconfig->hmacKey.data = %p<(nil)>, sysconfig->hmacKey.length = %u<0>"),
        REFUSAL(sysConfig3CreateMetadataHMAC(ready.get(), nullptr), "hmac is NULL"),
        REFUSAL(sysConfig3CreateFullHMAC(ready.get(), nullptr), "hmac is NULL"),
    };
    Recorder::expect(refusals);

    Recorder::take();
    EXPECT_FALSE(sysConfig3CreatePayloadHMAC(nullptr, &out));
    EXPECT_FALSE(sysConfig3CreateMetadataHMAC(nullptr, &out));
    EXPECT_EQ(Recorder::lines, Lines{});
    EXPECT_EQ(allocSysConfig3WithHMACKey(1, 0x30002, hmacKey), nullptr);
    EXPECT_EQ(allocSysConfig3WithHMACKey(bCfg, 0x30002, {keyBytes, 0}), nullptr);
    const std::string noKey = "sysconfig->hmacKey.data = %p<(nil)>, sysconfig->hmacKey.length = %u<0>";
    const Lines expected = {"allocSysConfig3: invalid magic provided 0x%08X<00000001>",
                            "allocSysConfig3WithHMACKey: Failed to allocate sysconfig.",
                            "sysConfig3CreatePayloadHMAC: Invalid HAMC key. " + noKey,
                            "sysConfig3CreateMetadataHMAC: Invalid HAMC key. " + noKey,
                            "sysConfig3CreateFullHMAC: Invalid HMAC key. " + noKey,
                            "allocSysConfig3WithHMACKey: Failed to update HMAC."};
    EXPECT_EQ(Recorder::lines, expected);
    EXPECT_EQ(out.data, nullptr);
}

} // namespace
