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
// "name" "value", "blob" 07 08
const char* const ofMetadata = "3366491A800376F26A132D1C915300ABF7FBD8E2135305C47231BE5EE4C2C3EB";
// The stream of ofBoth, then that of ofMetadata.
const char* const ofAll = "12DDDEE5C9B199D6893AD8D1ED940968F6B6831E8576173A74A0FAF9734B38D2";
// 30 68 43 57 2E
const char* const ofDeleted = "471FE7DE8F0B79A3BBEE50736025292D6352A7B6B3BAAA3AB628C61BBC48EF17";

SysConfig3Ptr keyedObject() {
    return SysConfig3Ptr(allocSysConfig3WithHMACKey(bCfg, 0x30002, hmacKey));
}

TEST(HMAC, coversTheEntriesInOrder) {
    const Recorder recorder;
    const SysConfig3Ptr object = keyedObject();
    const auto expect = [&](const std::string& payload, const std::string& metadata, const std::string& full) {
        EXPECT_EQ(manifestOf(object), payload + "|" + metadata + "|" + full);
        EXPECT_TRUE(sysConfig3IsValidHMAC(object.get()));
        std::string created;
        for (const auto create :
             {sysConfig3CreatePayloadHMAC, sysConfig3CreateMetadataHMAC, sysConfig3CreateFullHMAC}) {
            SysConfigData out = {};
            ASSERT_TRUE(create(object.get(), &out));
            const sysconfig::BytesPtr owner(out.data);
            created += (created.empty() ? "" : "|") + hexOf(out.data, out.length);
        }
        std::erase(created, ' ');
        EXPECT_EQ(created, manifestOf(object));
    };
    expect(ofNothing, ofNothing, ofNothing);
    EXPECT_TRUE(_sysConfig3AddPayloadEntry(object.get(), payloadDeleted(keyWCh0).get()));
    EXPECT_TRUE(sysConfig3UpdateHMAC(object.get()));
    expect(ofDeleted, ofNothing, ofDeleted);
    EXPECT_TRUE(add(object, payloadData(keyWCh0, {1, 2})));
    expect(ofWCh0, ofNothing, ofWCh0);
    EXPECT_TRUE(add(object, payloadString(keyMiGB, "text", "note")));
    expect(ofBoth, ofNothing, ofBoth);
    EXPECT_TRUE(add(object, metadataString("name", "value")));
    EXPECT_TRUE(add(object, metadataData("blob", {7, 8})));
    expect(ofBoth, ofMetadata, ofAll);
    EXPECT_EQ(Recorder::said, "");
}

TEST(HMACKey, makesAnObjectThatIsNewStaleOrValid) {
    const std::string noMatch = "sysConfig3IsValidHMAC: Payload HMAC does not match.\n"
                                "sysConfig3IsValidHMAC: Metadata HMAC does not match.\n"
                                "sysConfig3IsValidHMAC: Full HMAC does not match.";
    const SysConfig3Ptr object = newObject(0x30002);
    ASSERT_TRUE(_sysConfig3AddPayloadEntry(object.get(), payloadData(keyMiGB, {5}).get()));
    ASSERT_TRUE(_sysConfig3AddMetadataEntry(object.get(), metadataString("m", "v").get()));
    const Recorder recorder;
    const auto expectChanges = [&](const std::string& refusal) {
        const auto expect = [&](bool isDone, const char* operation) {
            EXPECT_EQ(isDone, refusal.empty()) << operation;
            EXPECT_EQ(Recorder::take(),
                      refusal.empty() ? "" : refusal + "\n" + operation + ": Failed to validate HMAC.");
        };
        expect(add(object, payloadData(keyWCh0, {1, 2})), "sysConfig3AddPayloadEntry");
        expect(add(object, metadataString("k", "v")), "sysConfig3AddMetadataEntry");
        expect(sysConfig3DeletePayloadEntryForKey(object.get(), keyWCh0), "sysConfig3DeletePayloadEntryForKey");
        expect(sysConfig3DeleteMetadataEntryForKey(object.get(), "k"), "sysConfig3DeleteMetadataEntryForKey");
        EXPECT_EQ(payloadOf(object) + metadataOf(object), "MiGB=data 05m=string v");
    };
    expectChanges(noKeyRegistered);
    EXPECT_TRUE(sysConfig3SetHMACKey(object.get(), hmacKey));
    expectChanges(noMatch);
    EXPECT_EQ(manifestOf(object), "00|00|00");
    EXPECT_TRUE(sysConfig3UpdateHMAC(object.get()));
    expectChanges("");
    EXPECT_TRUE(sysConfig3SetHMACKey(object.get(), {}));
    expectChanges(noKeyRegistered);
    EXPECT_TRUE(sysConfig3SetHMACKey(object.get(), hmacKey));
    EXPECT_TRUE(sysConfig3IsValidHMAC(object.get()));
    EXPECT_TRUE(sysConfig3SetHMACKey(object.get(), {keyBytes, 1}));
    expectChanges(noMatch);
}

TEST(HMAC, isInvalidWhenOneStoredValueDoesNotMatch) {
    const SysConfig3Ptr object = keyedObject();
    __SysConfig3ManifestEntry& manifest = *object->manifest;
    for (const SysConfigData& stored : {manifest.payloadHMAC, manifest.metadataHMAC, manifest.fullHMAC}) {
        stored.data[31] ^= 1;
        EXPECT_FALSE(sysConfig3IsValidHMAC(object.get()));
        stored.data[31] ^= 1;
        EXPECT_TRUE(sysConfig3IsValidHMAC(object.get()));
    }
}

TEST(HMAC, saysWhatIsMissing) {
    const SysConfig3Ptr keyless = newObject(0x30002), later = newObject(0x30003), ready = keyedObject();
    const std::string noKey = "sysconfig->hmacKey.data = (nil), sysconfig->hmacKey.length = 0";
    SysConfigData out = {};
    const Recorder recorder;
    EXPECT_REFUSED(allocSysConfig3WithHMACKey(bCfg, 0x30003, hmacKey),
                   "Requested version (0x30003) does not support HMAC.");
    EXPECT_REFUSED(sysConfig3SetHMACKey(nullptr, hmacKey), "sysconfig is NULL.");
    EXPECT_REFUSED(sysConfig3UpdateHMAC(nullptr), "sysconfig is NULL.");
    EXPECT_REFUSED(sysConfig3UpdateHMAC(later.get()), "This SysConfig version (0x30003) does not support HMAC.");
    EXPECT_REFUSED(sysConfig3IsValidHMAC(nullptr), "sysconfig is NULL.");
    EXPECT_REFUSED(sysConfig3CreatePayloadHMAC(keyless.get(), nullptr), "Invalid HAMC key. " + noKey);
    EXPECT_REFUSED(sysConfig3CreateFullHMAC(keyless.get(), nullptr), "Invalid HMAC key. " + noKey);
    EXPECT_REFUSED(sysConfig3CreateFullHMAC(nullptr, &out), "sysconfig is NULL.");
    EXPECT_REFUSED(sysConfig3CreateFullHMAC(ready.get(), nullptr), "hmac is NULL");
    EXPECT_FALSE(sysConfig3CreatePayloadHMAC(nullptr, &out) || sysConfig3CreateMetadataHMAC(nullptr, &out));
    EXPECT_EQ(Recorder::take(), "");
    EXPECT_EQ(allocSysConfig3WithHMACKey(1, 0x30002, hmacKey), nullptr);
    EXPECT_EQ(Recorder::take(), "allocSysConfig3: invalid magic provided 0x00000001\n"
                                "allocSysConfig3WithHMACKey: Failed to allocate sysconfig.");
    EXPECT_EQ(allocSysConfig3WithHMACKey(bCfg, 0x30002, {keyBytes, 0}), nullptr);
    EXPECT_TRUE(Recorder::take().ends_with("\nallocSysConfig3WithHMACKey: Failed to update HMAC."));
}

} // namespace
