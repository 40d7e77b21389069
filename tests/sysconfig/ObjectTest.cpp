// Objects, their entries and manifests.
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "sysconfig/SysConfig3Internal.h"
#include "tests/sysconfig/Blob.h"
#include "tests/sysconfig/Recorder.h"

namespace {

using sysconfig::ManifestPtr;
using sysconfig::MetadataEntryPtr;
using sysconfig::PayloadEntryPtr;
using sysconfig::SysConfig3Ptr;
using Lines = std::vector<std::string>;

const std::uint8_t oneByte[] = {0x01};

TEST(SysConfig3, saysWhatIsWrongWithItsArguments) {
    SysConfigData hmac = {};
    const ManifestPtr manifest(allocSysConfig3Manifest(0x30001, &hmac, &hmac, &hmac));
    const SysConfig3Ptr object = newObject();
    static const __SysConfig3ManifestEntry* otherVersion;
    static __SysConfig3* present;
    otherVersion = manifest.get();
    present = object.get();
    const struct {
        // True when the operation gives none or false.
        bool (*fails)();
        const char* format;
        const char* line;
    } rows[] = {
        {[] { return allocSysConfig3(0x62436600, 0x30004) == nullptr; }, "%s invalid magic provided 0x%08X",
         "allocSysConfig3: invalid magic provided 0x62436600"},
        {[] { return allocSysConfig3(bCfg, 0x30004) == nullptr; }, "%s invalid version provided 0x%08X",
         "allocSysConfig3: invalid version provided 0x00030004"},
        {[] { return allocSysConfig3PayloadEntryWithData(0, "c", nullptr, 0) == nullptr; }, "%s key was invalid",
         "_allocSysConfig3PayloadEntryInternal: key was invalid"},
        {[] { return allocSysConfig3PayloadEntryWithString(1, "c", nullptr) == nullptr; },
         "%s one of data, string, or deleted must be provided",
         "_allocSysConfig3PayloadEntryInternal: one of data, string, or deleted must be provided"},
        {[] { return _allocSysConfig3PayloadEntryInternal(1, nullptr, oneByte, 1, nullptr, true) == nullptr; },
         "%s data, string and deleted are mutually exclusive. Caller provided parameters [%s%s%s ]",
         "_allocSysConfig3PayloadEntryInternal: data, string and deleted are mutually exclusive. Caller provided "
         "parameters [ data deleted ]"},
        {[] { return _allocSysConfig3PayloadEntryInternal(1, nullptr, oneByte, 0, "s", false) == nullptr; },
         "%s data, string and deleted are mutually exclusive. Caller provided parameters [%s%s%s ]",
         "_allocSysConfig3PayloadEntryInternal: data, string and deleted are mutually exclusive. Caller provided "
         "parameters [ data string ]"},
        {[] { return allocSysConfig3PayloadEntryWithData(1, "c", oneByte, 0) == nullptr; }, "%s data was 0 length",
         "_allocSysConfig3PayloadEntryInternal: data was 0 length"},
        {[] { return allocSysConfig3MetadataEntry(nullptr, oneByte, 1, "s") == nullptr; }, "%s key must be non-NULL",
         "allocSysConfig3MetadataEntry: key must be non-NULL"},
        {[] { return allocSysConfig3MetadataEntry("k", oneByte, 1, "s") == nullptr; },
         "%s data and string are mutually exclusive",
         "allocSysConfig3MetadataEntry: data and string are mutually exclusive"},
        {[] { return allocSysConfig3MetadataEntry("k", nullptr, 1, nullptr) == nullptr; },
         "%s either data or string must be non-null",
         "allocSysConfig3MetadataEntry: either data or string must be non-null"},
        {[] { return allocSysConfig3MetadataEntry("k", oneByte, 0, nullptr) == nullptr; },
         "%s data cannot be length zero", "allocSysConfig3MetadataEntry: data cannot be length zero"},
        {[] { return allocSysConfig3Manifest(0x30003, nullptr, nullptr, nullptr) == nullptr; },
         "%s one of the hmacs were NULL. payload ptr: %p metdata ptr: %p full ptr: %p",
         "allocSysConfig3Manifest: one of the hmacs were NULL. payload ptr: (nil) metdata ptr: (nil) full ptr: (nil)"},
        {[] { return !_copySysConfigData(nullptr, nullptr); }, "%s sourceData or destData was NULL",
         "_copySysConfigData: sourceData or destData was NULL"},
        {[] { return _allocAndCopyData(oneByte, 0) == nullptr; }, "%s data was zero length",
         "_allocAndCopyData: data was zero length"},
        {[] { return !_sysConfig3SetManifest(nullptr, nullptr); },
         "%s sysconfig (0x%p) or manifest (0x%p) argument was null",
         "_sysConfig3SetManifest: sysconfig (0x(nil)) or manifest (0x(nil)) argument was null"},
        {[] { return !_sysConfig3SetManifest(present, otherVersion); },
         "%s sysconfig version (0X%08X) did not match manifest version (0X%08X",
         "_sysConfig3SetManifest: sysconfig version (0X00030003) did not match manifest version (0X00030001"},
        {[] { return !_sysConfig3HMACsAreEqual(0x30004, nullptr, nullptr); }, "%s Unsupported sysconfig version: 0x%X",
         "_sysConfig3HMACsAreEqual: Unsupported sysconfig version: 0x30004"},
        {[] { return !_sysConfig3AddPayloadEntry(present, nullptr); },
         "%s invalid argument. sysconfig and etnry cannot be NULL",
         "_sysConfig3AddPayloadEntry: invalid argument. sysconfig and etnry cannot be NULL"},
        {[] { return !_sysConfig3AddMetadataEntry(present, nullptr); },
         "%s invalid argument. sysconfig and entry cannot be NULL",
         "_sysConfig3AddMetadataEntry: invalid argument. sysconfig and entry cannot be NULL"},
        {[] { return !_sysConfig3DeletePayloadEntryForKey(nullptr, 1); },
         "%s invalid argument. sysconfig cannot be NULL",
         "_sysConfig3DeletePayloadEntryForKey: invalid argument. sysconfig cannot be NULL"},
        {[] { return !_sysConfig3DeleteMetadataEntryForKey(present, nullptr); },
         "%s invalid argument. sysconfig and key cannot be NULL",
         "_sysConfig3DeleteMetadataEntryForKey: invalid argument. sysconfig and key cannot be NULL"},
        {[] { return !sysConfig3AddPayloadEntry(present, nullptr); },
         "%s invalid argument. sysconfig and entry cannot be NULL",
         "sysConfig3AddPayloadEntry: invalid argument. sysconfig and entry cannot be NULL"},
        {[] { return !sysConfig3AddMetadataEntry(nullptr, nullptr); },
         "%s invalid argument. sysconfig and entry cannot be NULL",
         "sysConfig3AddMetadataEntry: invalid argument. sysconfig and entry cannot be NULL"},
        {[] { return !sysConfig3DeletePayloadEntryForKey(nullptr, 1); },
         "%s invalid argument. sysconfig cannot be NULL",
         "sysConfig3DeletePayloadEntryForKey: invalid argument. sysconfig cannot be NULL"},
        {[] { return !sysConfig3DeleteMetadataEntryForKey(present, nullptr); },
         "%s invalid argument. sysconfig and key cannot be NULL",
         "sysConfig3DeleteMetadataEntryForKey: invalid argument. sysconfig and key cannot be NULL"},
        {[] { return sysConfig3GetPayloadEntryForKey(nullptr, 1) == nullptr; },
         "%s invalid argument. sysconfig cannot be NULL",
         "sysConfig3GetPayloadEntryForKey: invalid argument. sysconfig cannot be NULL"},
        {[] { return sysConfig3GetMetadataEntryForKey(nullptr, "k") == nullptr; },
         "%s invalid argument. sysconfig cannot be NULL",
         "sysConfig3GetMetadataEntryForKey: invalid argument. sysconfig cannot be NULL"},
        {[] { return !sysConfig3PayloadEntryGetData(nullptr, nullptr); },
         "%s invalid arguments. Either entry or data was NULL",
         "sysConfig3PayloadEntryGetData: invalid arguments. Either entry or data was NULL"},
        {[] { return !sysConfig3ManifestGetPayloadHMAC(nullptr, nullptr); },
         "%s invalid arguments. entry and data cannot be null",
         "sysConfig3ManifestGetPayloadHMAC: invalid arguments. entry and data cannot be null"},
        {[] { return !sysConfig3ManifestGetMetadataHMAC(otherVersion, nullptr); },
         "%s invalid arguments. entry and data cannot be null",
         "sysConfig3ManifestGetMetadataHMAC: invalid arguments. entry and data cannot be null"},
        {[] { return !sysConfig3ManifestGetFullHMAC(otherVersion, nullptr); },
         "%s invalid arguments. entry and data cannot be null",
         "sysConfig3ManifestGetFullHMAC: invalid arguments. entry and data cannot be null"},
    };
    for (const auto& row : rows) {
        const Recorder recorder;
        EXPECT_TRUE(row.fails()) << row.line;
        EXPECT_EQ(Recorder::formats, Lines{row.format});
        EXPECT_EQ(Recorder::lines, Lines{row.line});
        EXPECT_EQ(Recorder::levels, std::vector<int>{2}) << row.line;
        setSysConfig3LogHandler(nullptr);
        EXPECT_TRUE(row.fails()) << row.line << ", without a hook";
    }
    EXPECT_EQ(payloadOf(present) + metadataOf(present), "");
}

TEST(SysConfig3, namesTheReportingOperationByItsPrototype) {
    const Recorder recorder;
    EXPECT_NE(getSysConfig3LogHandler(), nullptr);
    allocSysConfig3(0, 0);
    sysConfig3DeletePayloadEntryForKey(nullptr, 1);
    EXPECT_EQ(Recorder::prototypes,
              (Lines{"struct __SysConfig3 *__singleallocSysConfig3(SysConfig3Magic, SysConfig3Version)",
                     "bool sysConfig3DeletePayloadEntryForKey(struct __SysConfig3 *__single, uint32_t)"}));
}

TEST(SysConfig3, toleratesAbsentRecordsWithoutAMessage) {
    const Recorder recorder;
    SysConfigData out = {};
    EXPECT_EQ(sysConfig3GetMagic(nullptr) + sysConfig3GetVersion(nullptr), 0U);
    EXPECT_EQ(sysConfig3GetPayloadEntryCount(nullptr) + sysConfig3GetMetadataEntryCount(nullptr), 0U);
    EXPECT_EQ(sysConfig3GetHeadPayloadEntry(nullptr), nullptr);
    EXPECT_EQ(sysConfig3GetHeadMetadataEntry(nullptr), nullptr);
    EXPECT_EQ(sysConfig3GetManifest(nullptr), nullptr);
    EXPECT_EQ(sysConfig3PayloadEntryGetKey(nullptr), 0U);
    EXPECT_EQ(sysConfig3PayloadEntryGetComment(nullptr), nullptr);
    EXPECT_EQ(sysConfig3PayloadEntryGetString(nullptr), nullptr);
    EXPECT_FALSE(sysConfig3PayloadEntryGetDeleted(nullptr));
    EXPECT_EQ(sysConfig3PayloadEntryGetNextEntry(nullptr), nullptr);
    EXPECT_EQ(sysConfig3MetadataEntryGetKey(nullptr), nullptr);
    EXPECT_EQ(sysConfig3MetadataEntryGetString(nullptr), nullptr);
    EXPECT_FALSE(sysConfig3MetadataEntryGetData(nullptr, &out));
    EXPECT_EQ(sysConfig3MetadataEntryGetNextEntry(nullptr), nullptr);
    EXPECT_EQ(sysConfig3ManifestGetVersion(nullptr), 0U);
    EXPECT_EQ(copySysConfig3PayloadEntry(nullptr), nullptr);
    EXPECT_EQ(copySysConfig3MetadataEntry(nullptr), nullptr);
    EXPECT_EQ(copySysConfig3Manifest(nullptr), nullptr);
    EXPECT_EQ(sysConfig3GetMetadataEntryForKey(newObject().get(), nullptr), nullptr);
    deallocSysConfig3(nullptr);
    deallocSysConfig3PayloadEntry(nullptr);
    deallocSysConfig3MetadataEntry(nullptr);
    deallocSysConfig3Manifest(nullptr);
    EXPECT_EQ(Recorder::lines, Lines{});
}

TEST(SysConfig3, supportsNineMagicsAndThreeVersions) {
    std::string magics;
    for (const char* name : {"0Cfg", "appv", "bCfg", "dCfg", "eCfg", "fCfg", "mCfg", "seal", "tCfg", "aCfg", "gCfb"}) {
        SysConfig3Magic magic = 0;
        for (const char* character = name; *character != '\0'; ++character)
            magic = magic << 8 | static_cast<unsigned char>(*character);
        magics += isSupportedSysConfig3Magic(magic) ? 'y' : 'n';
    }
    EXPECT_EQ(magics, "yyyyyyyyynn");
    std::string versions;
    for (const SysConfig3Version version : {0x30000U, 0x30001U, 0x30002U, 0x30003U, 0x30004U})
        versions += isSupportedSysConfig3Version(version) ? 'y' : 'n';
    EXPECT_EQ(versions, "nyyyn");
}

TEST(SysConfig3, startsWithPlaceholderHMACs) {
    const SysConfig3Ptr object = newObject(0x30001);
    EXPECT_EQ(manifestOf(object.get()), "00 | 00 | 00");
    EXPECT_EQ(sysConfig3ManifestGetVersion(sysConfig3GetManifest(object.get())), 0x30001U);
    EXPECT_EQ(sysConfig3GetMagic(object.get()), bCfg);
    EXPECT_TRUE(sysConfig3ObjectsAreEqual(object.get(), newObject(0x30001).get()));
    EXPECT_FALSE(sysConfig3ObjectsAreEqual(object.get(), newObject(0x30003).get()));
    EXPECT_FALSE(sysConfig3ObjectsAreEqual(nullptr, nullptr));
}

TEST(PayloadEntry, hasACommentAndOneValue) {
    const Bytes data = bytes("01 02");
    EXPECT_STREQ(sysConfig3PayloadEntryGetComment(payloadData(keyWCh0, data, "").get()), ".");
    EXPECT_STREQ(sysConfig3PayloadEntryGetComment(payloadData(keyWCh0, data, nullptr).get()), ".");
    EXPECT_STREQ(sysConfig3PayloadEntryGetComment(payloadData(keyWCh0, data, "note").get()), "note");

    const PayloadEntryPtr string = payloadString(keyMiGB, "");
    SysConfigData out = {};
    EXPECT_STREQ(sysConfig3PayloadEntryGetString(string.get()), "");
    EXPECT_FALSE(sysConfig3PayloadEntryGetData(string.get(), &out));
    EXPECT_EQ(out.data, nullptr);
    const PayloadEntryPtr deleted = payloadDeleted(keyMiGB);
    EXPECT_TRUE(sysConfig3PayloadEntryGetDeleted(deleted.get()));
    EXPECT_EQ(sysConfig3PayloadEntryGetString(deleted.get()), nullptr);
}

TEST(PayloadEntry, cutsStringsAtSixteenMebi) {
    const std::string tooLong = std::string().append(0x1000001, 'x');
    const PayloadEntryPtr entry = payloadString(keyWCh0, tooLong.c_str(), tooLong.c_str());
    EXPECT_EQ(std::strlen(sysConfig3PayloadEntryGetComment(entry.get())), 0x1000000U);
    EXPECT_EQ(std::strlen(sysConfig3PayloadEntryGetString(entry.get())), 0x1000000U);
    const MetadataEntryPtr metadata = metadataString(tooLong.c_str(), tooLong.c_str());
    EXPECT_EQ(std::strlen(sysConfig3MetadataEntryGetKey(metadata.get())), 256U);
    EXPECT_EQ(std::strlen(sysConfig3MetadataEntryGetString(metadata.get())), 0x1000000U);
}

TEST(PayloadEntry, isEqualByAllItsParts) {
    const Bytes data = bytes("01 02");
    const PayloadEntryPtr entries[] = {
        payloadData(keyWCh0, data),      payloadData(keyMiGB, data),       payloadData(keyWCh0, data, "other"),
        payloadData(keyWCh0, {1}),       payloadData(keyWCh0, {1, 3}),     payloadString(keyWCh0, "a"),
        payloadString(keyWCh0, ""),      payloadString(keyWCh0, "b"),      payloadDeleted(keyWCh0),
        payloadString(keyWCh0, "", "a"), payloadString(keyWCh0, "a", "b"),
    };
    for (const PayloadEntryPtr& a : entries) {
        for (const PayloadEntryPtr& b : entries)
            EXPECT_EQ(sysConfig3PayloadEntriesAreEqual(a.get(), b.get()), &a == &b);
        const PayloadEntryPtr copy(copySysConfig3PayloadEntry(a.get()));
        EXPECT_TRUE(sysConfig3PayloadEntriesAreEqual(a.get(), copy.get()));
        EXPECT_FALSE(sysConfig3PayloadEntriesAreEqual(a.get(), nullptr));
    }
    EXPECT_TRUE(sysConfig3PayloadEntriesAreEqual(nullptr, nullptr));
}

TEST(MetadataEntry, isEqualByAllItsParts) {
    const MetadataEntryPtr entries[] = {
        metadataData("k", {1, 2}), metadataData("k", {1}),    metadataData("l", {1, 2}), metadataString("k", ""),
        metadataString("k", "kk"), metadataString("kk", "k"), metadataString("", "kk"),
    };
    for (const MetadataEntryPtr& a : entries) {
        for (const MetadataEntryPtr& b : entries)
            EXPECT_EQ(sysConfig3MetadataEntriesAreEqual(a.get(), b.get()), &a == &b);
        const MetadataEntryPtr copy(copySysConfig3MetadataEntry(a.get()));
        EXPECT_TRUE(sysConfig3MetadataEntriesAreEqual(a.get(), copy.get()));
        EXPECT_FALSE(sysConfig3MetadataEntriesAreEqual(nullptr, a.get()));
    }
    EXPECT_TRUE(sysConfig3MetadataEntriesAreEqual(nullptr, nullptr));
}

TEST(Entry, ignoresALengthThatComesWithoutData) {
    const PayloadEntryPtr payload(_allocSysConfig3PayloadEntryInternal(1, nullptr, nullptr, 7, "text", false));
    EXPECT_TRUE(sysConfig3PayloadEntriesAreEqual(payload.get(), payloadString(1, "text").get()));
    const MetadataEntryPtr metadata(allocSysConfig3MetadataEntry("k", nullptr, 7, "text"));
    EXPECT_TRUE(sysConfig3MetadataEntriesAreEqual(metadata.get(), metadataString("k", "text").get()));
}

TEST(PayloadList, keepsTheOrderOfInsertion) {
    const SysConfig3Ptr object = newObject();
    EXPECT_TRUE(sysConfig3AddPayloadEntry(object.get(), payloadData(keyWCh0, {1}).get()));
    EXPECT_TRUE(sysConfig3AddPayloadEntry(object.get(), payloadString(keyMiGB, "text").get()));
    EXPECT_TRUE(sysConfig3AddPayloadEntry(object.get(), payloadDeleted(0x41424344).get()));
    EXPECT_EQ(payloadOf(object.get()), "WCh0=data 01, MiGB=string text, ABCD=deleted");

    EXPECT_TRUE(sysConfig3AddPayloadEntry(object.get(), payloadData(keyWCh0, {2}).get()));
    EXPECT_EQ(payloadOf(object.get()), "MiGB=string text, ABCD=deleted, WCh0=data 02");
    EXPECT_TRUE(sysConfig3DeletePayloadEntryForKey(object.get(), 0x41424344));
    EXPECT_EQ(payloadOf(object.get()), "MiGB=string text, WCh0=data 02");
    EXPECT_EQ(sysConfig3GetPayloadEntryForKey(object.get(), 0x41424344), nullptr);
    EXPECT_TRUE(sysConfig3DeletePayloadEntryForKey(object.get(), 0x41424344));
    EXPECT_TRUE(sysConfig3DeletePayloadEntryForKey(object.get(), keyWCh0));
    EXPECT_TRUE(sysConfig3DeletePayloadEntryForKey(object.get(), keyMiGB));
    EXPECT_EQ(payloadOf(object.get()), "");
    EXPECT_TRUE(sysConfig3AddPayloadEntry(object.get(), payloadData(keyWCh0, {3}).get()));
    EXPECT_EQ(payloadOf(object.get()), "WCh0=data 03");
    EXPECT_EQ(sysConfig3GetPayloadEntryCount(object.get()), 1U);
}

TEST(PayloadList, staysInOrderWhileItsIndexGrows) {
    const SysConfig3Ptr object = newObject();
    constexpr std::uint32_t count = 1000;
    for (std::uint32_t key = 1; key <= count; ++key)
        ASSERT_TRUE(sysConfig3AddPayloadEntry(object.get(), payloadData(key, {static_cast<std::uint8_t>(key)}).get()));
    for (std::uint32_t key = 2; key <= count; key += 2)
        ASSERT_TRUE(sysConfig3DeletePayloadEntryForKey(object.get(), key));
    std::uint32_t expected = 1;
    for (const auto* entry = sysConfig3GetHeadPayloadEntry(object.get()); entry != nullptr;
         entry = sysConfig3PayloadEntryGetNextEntry(entry), expected += 2) {
        ASSERT_EQ(sysConfig3PayloadEntryGetKey(entry), expected);
        ASSERT_EQ(sysConfig3GetPayloadEntryForKey(object.get(), expected), entry);
        ASSERT_EQ(sysConfig3GetPayloadEntryForKey(object.get(), expected + 1), nullptr);
    }
    EXPECT_EQ(sysConfig3GetPayloadEntryCount(object.get()), count / 2);
}

TEST(PayloadList, takesItsOwnEntriesBack) {
    const SysConfig3Ptr object = newObject();
    sysConfig3AddPayloadEntry(object.get(), payloadData(keyWCh0, {1}).get());
    sysConfig3AddPayloadEntry(object.get(), payloadData(keyMiGB, {2}).get());
    EXPECT_TRUE(sysConfig3AddPayloadEntry(object.get(), sysConfig3GetHeadPayloadEntry(object.get())));
    EXPECT_EQ(payloadOf(object.get()), "MiGB=data 02, WCh0=data 01");

    sysConfig3AddMetadataEntry(object.get(), metadataString("k", "text").get());
    EXPECT_TRUE(sysConfig3AddMetadataEntry(object.get(), sysConfig3GetHeadMetadataEntry(object.get())));
    EXPECT_EQ(metadataOf(object.get()), "k=string text");
    const char* ownKey = sysConfig3MetadataEntryGetKey(sysConfig3GetHeadMetadataEntry(object.get()));
    EXPECT_TRUE(sysConfig3DeleteMetadataEntryForKey(object.get(), ownKey));
    EXPECT_EQ(metadataOf(object.get()), "");
}

TEST(PayloadList, removesEveryEntryWithTheKey) {
    const SysConfig3Ptr object = newObject();
    sysconfig::PayloadList& list = object->payload;
    for (const std::uint8_t value : bytes("01 02 03"))
        list.appendWithoutIndex(payloadData(value == 2 ? keyMiGB : keyWCh0, {value}).release());
    // Indexed one by one, the two entries with one key both stay.
    list.buckets = static_cast<__SysConfig3PayloadEntry**>(std::calloc(8, sizeof(void*)));
    list.bucketBits = 3;
    for (auto* entry = list.first; entry != nullptr; entry = entry->next) {
        auto** bucket = list.bucket(entry->indexHash(object->seed));
        entry->bucketNext = *bucket;
        *bucket = entry;
    }
    EXPECT_TRUE(sysConfig3DeletePayloadEntryForKey(object.get(), keyWCh0));
    EXPECT_EQ(payloadOf(object.get()), "MiGB=data 02");
}

TEST(PayloadList, takesTheDeletedFlagFromVersion30003On) {
    for (const SysConfig3Version version : {0x30001U, 0x30002U, 0x30003U}) {
        std::uint8_t keyByte = 0x4B;
        const SysConfig3Ptr object = newObject(version);
        sysConfig3SetHMACKey(object.get(), {&keyByte, 1});
        sysConfig3UpdateHMAC(object.get());
        const Recorder recorder;
        const bool allowed = version >= 0x30003;
        EXPECT_EQ(sysConfig3AddPayloadEntry(object.get(), payloadDeleted(keyWCh0).get()), allowed);
        EXPECT_EQ(payloadOf(object.get()), allowed ? "WCh0=deleted" : "");
        EXPECT_EQ(Recorder::lines, allowed ? Lines{}
                                           : Lines{"sysConfig3AddPayloadEntry: Payloads with the deleted flag are only "
                                                   "supported on version 0x00030003 or higher."});
    }
}

TEST(MetadataList, knowsKeysByTheirFirst256Characters) {
    const std::string longKey(300, 'k');
    const std::string sameStart = longKey.substr(0, 256) + "something else";
    const SysConfig3Ptr object = newObject();
    EXPECT_TRUE(sysConfig3AddMetadataEntry(object.get(), metadataString(longKey.c_str(), "first").get()));
    EXPECT_TRUE(sysConfig3AddMetadataEntry(object.get(), metadataData("", {1}).get()));
    const auto* found = sysConfig3GetMetadataEntryForKey(object.get(), sameStart.c_str());
    ASSERT_NE(found, nullptr);
    EXPECT_EQ(sysConfig3MetadataEntryGetKey(found), longKey.substr(0, 256));
    EXPECT_EQ(sysConfig3GetMetadataEntryForKey(object.get(), longKey.substr(0, 255).c_str()), nullptr);

    EXPECT_TRUE(sysConfig3AddMetadataEntry(object.get(), metadataString(sameStart.c_str(), "second").get()));
    EXPECT_EQ(metadataOf(object.get()), "=data 01, " + longKey.substr(0, 256) + "=string second");
    EXPECT_TRUE(sysConfig3DeleteMetadataEntryForKey(object.get(), longKey.c_str()));
    EXPECT_EQ(metadataOf(object.get()), "=data 01");
    EXPECT_EQ(sysConfig3GetMetadataEntryCount(object.get()), 1U);
}

TEST(Object, isEqualByBothListsInOrderAndTheManifest) {
    const auto object = [](std::initializer_list<std::uint32_t> keys, std::initializer_list<const char*> texts,
                           SysConfig3Magic magic = bCfg) {
        SysConfig3Ptr made(allocSysConfig3(magic, 0x30003));
        for (const std::uint32_t key : keys)
            sysConfig3AddPayloadEntry(made.get(), payloadData(key, {1}).get());
        for (const char* key : texts)
            sysConfig3AddMetadataEntry(made.get(), metadataString(key, "v").get());
        return made;
    };
    SysConfig3Ptr differentManifest = object({1, 2}, {"a", "b"});
    std::uint8_t octet = 0x01;
    const SysConfigData hmac = {&octet, 1};
    const ManifestPtr manifest(allocSysConfig3Manifest(0x30003, &hmac, &hmac, &hmac));
    ASSERT_TRUE(_sysConfig3SetManifest(differentManifest.get(), manifest.get()));
    const SysConfig3Ptr objects[] = {
        object({1, 2}, {"a", "b"}), object({2, 1}, {"a", "b"}),   object({1, 2}, {"b", "a"}),
        object({1}, {"a", "b"}),    object({1, 2}, {"a"}),        object({}, {}),
        object({}, {}, 0x6D436667), std::move(differentManifest),
    };
    for (const SysConfig3Ptr& a : objects)
        for (const SysConfig3Ptr& b : objects)
            EXPECT_EQ(sysConfig3ObjectsAreEqual(a.get(), b.get()), &a == &b);
    EXPECT_TRUE(sysConfig3ObjectsAreEqual(objects[0].get(), object({1, 2}, {"a", "b"}).get()));
}

TEST(Manifest, comparesAbsentHMACsByVersion) {
    std::uint8_t one[] = {1, 2};
    std::uint8_t other[] = {1, 3};
    const SysConfigData absent = {};
    const SysConfigData present = {one, 2};
    const struct {
        SysConfig3Version version;
        const SysConfigData* a;
        const SysConfigData* b;
        bool equal;
    } rows[] = {
        {0x30001, &absent, &absent, true},   {0x30001, &absent, &present, false}, {0x30001, &present, &absent, false},
        {0x30001, &present, &present, true}, {0x30002, &absent, &absent, false},  {0x30003, &absent, &absent, false},
        {0x30002, &present, &absent, false}, {0x30003, &present, &present, true}, {0x30003, &present, nullptr, false},
    };
    for (const auto& row : rows)
        EXPECT_EQ(_sysConfig3HMACsAreEqual(row.version, row.a, row.b), row.equal) << &row - rows;
    const SysConfigData shorter = {one, 1};
    const SysConfigData different = {other, 2};
    EXPECT_FALSE(_sysConfig3HMACsAreEqual(0x30003, &present, &shorter));
    EXPECT_FALSE(_sysConfig3HMACsAreEqual(0x30003, &present, &different));
}

TEST(Manifest, copiesItsHMACs) {
    std::uint8_t octets[] = {1, 2};
    const SysConfigData present = {octets, 2};
    const SysConfigData empty = {octets, 0};
    const ManifestPtr manifest(allocSysConfig3Manifest(7, &present, &empty, &present));
    const ManifestPtr copy(copySysConfig3Manifest(manifest.get()));
    octets[0] = 9;
    SysConfigData view = {octets, 2};
    EXPECT_EQ(sysConfig3ManifestGetVersion(copy.get()), 7U);
    EXPECT_TRUE(sysConfig3ManifestGetMetadataHMAC(copy.get(), &view));
    EXPECT_EQ(view.data, nullptr);
    EXPECT_TRUE(sysConfig3ManifestGetFullHMAC(copy.get(), &view));
    EXPECT_EQ(hexOf(view.data, view.length), "01 02");
    EXPECT_FALSE(sysConfig3ManifestsAreEqual(nullptr, nullptr));
    EXPECT_FALSE(sysConfig3ManifestsAreEqual(manifest.get(), nullptr));
}

TEST(Object, withAnUnsupportedMagicIsNotReleased) {
    SysConfig3Ptr object = newObject();
    sysConfig3AddPayloadEntry(object.get(), payloadData(keyWCh0, {1}).get());
    object->magic = 0x12345678;
    deallocSysConfig3(object.get());
    EXPECT_EQ(payloadOf(object.get()), "WCh0=data 01");
    object->magic = bCfg;
}

TEST(CopyOfData, clearsTheDestinationForAnEmptySource) {
    const Recorder recorder;
    std::uint8_t octet = 1;
    const SysConfigData empty = {&octet, 0};
    SysConfigData destination = {&octet, 1};
    EXPECT_FALSE(_copySysConfigData(&empty, &destination));
    EXPECT_EQ(destination.data, nullptr);
    EXPECT_EQ(destination.length, 0U);
    EXPECT_EQ(Recorder::lines, Lines{"_copySysConfigData: sourceData was 0 length"});
}

} // namespace
