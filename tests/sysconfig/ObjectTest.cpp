// Objects, their entries and manifests.
#include <memory>
#include <string>
#include <tuple>
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

TEST(SysConfig3, saysWhatIsWrongWithItsArguments) {
    const std::uint8_t octet = 0x01;
    const SysConfig3Ptr keyed(allocSysConfig3WithHMACKey(bCfg, 0x30002, hmacKey));
    const Recorder recorder;
    EXPECT_REFUSED(allocSysConfig3(0x62436600, 0x30004), "invalid magic provided 0x62436600");
    EXPECT_REFUSED(allocSysConfig3(bCfg, 0x30004), "invalid version provided 0x00030004");
    EXPECT_FALSE(allocSysConfig3PayloadEntryWithData(0, "c", nullptr, 0));
    EXPECT_EQ(Recorder::take(), "_allocSysConfig3PayloadEntryInternal: key was invalid");
    EXPECT_REFUSED(allocSysConfig3MetadataEntry(nullptr, &octet, 1, "s"), "key must be non-NULL");
    EXPECT_REFUSED(allocSysConfig3Manifest(0x30003, nullptr, nullptr, nullptr),
                   "one of the hmacs were NULL. payload ptr: (nil) metdata ptr: (nil) full ptr: (nil)");
    EXPECT_REFUSED(sysConfig3GetMetadataEntryForKey(nullptr, "k"), "invalid argument. sysconfig cannot be NULL");
    EXPECT_REFUSED(sysConfig3AddPayloadEntry(keyed.get(), payloadDeleted(keyWCh0).get()),
                   "Payloads with the deleted flag are only supported on version 0x00030003 or higher.");
    EXPECT_EQ(payloadOf(keyed), "");
    EXPECT_REFUSED(_sysConfig3SetManifest(keyed.get(), sysConfig3GetManifest(newObject().get())),
                   "sysconfig version (0X00030002) did not match manifest version (0X00030003");
    EXPECT_REFUSED(_sysConfig3SetManifest(nullptr, nullptr),
                   "sysconfig (0x(nil)) or manifest (0x(nil)) argument was null");
    EXPECT_REFUSED(_sysConfig3HMACsAreEqual(0x30004, nullptr, nullptr), "Unsupported sysconfig version: 0x30004");
    EXPECT_REFUSED(_allocAndCopyData(&octet, 0), "data was zero length");
    const SysConfigData empty = {};
    SysConfigData copied = {nullptr, 7};
    EXPECT_REFUSED(_copySysConfigData(&empty, &copied), "sourceData was 0 length");
    EXPECT_EQ(copied.length, 0U);
    EXPECT_EQ(_DERDecodeSysConfig3ParseAndPopulatePayloadSequence(nullptr, nullptr, nullptr), DERParamError);
    EXPECT_EQ(_DERDecodeSysConfig3ParseAndPopulateMetadataSequence(nullptr, nullptr, nullptr), DERParamError);
    EXPECT_EQ(Recorder::take(), "_DERDecodeSysConfig3ParseAndPopulateMetadataSequence: the refcon arg was NULL");
    EXPECT_REFUSED(encodeSysConfig3(nullptr, nullptr), "Invalid arguments. sysconfig = (nil), sData = (nil)");
    EXPECT_FALSE(encodeSysConfig3(keyed.get(), nullptr));
}

TEST(SysConfig3, saysThatAnArgumentIsMissing) {
    const PayloadEntryPtr payloadOwner = payloadString(keyWCh0, "text");
    const MetadataEntryPtr metadataOwner = metadataString("k", "v");
    const SysConfig3Ptr objectOwner = newObject();
    auto* const object = objectOwner.get();
    const auto* const payload = payloadOwner.get();
    const auto* const metadata = metadataOwner.get();
    const auto* const manifest = sysConfig3GetManifest(object);
    SysConfigData out = {};
    const Recorder recorder;
    EXPECT_NEEDS("invalid argument. sysconfig and entry cannot be NULL", sysConfig3AddPayloadEntry, object, payload);
    EXPECT_NEEDS("invalid argument. sysconfig and entry cannot be NULL", sysConfig3AddMetadataEntry, object, metadata);
    EXPECT_NEEDS("invalid argument. sysconfig cannot be NULL", sysConfig3DeletePayloadEntryForKey, object, 1);
    EXPECT_NEEDS("invalid argument. sysconfig cannot be NULL", _sysConfig3DeletePayloadEntryForKey, object, 1);
    EXPECT_NEEDS("invalid argument. sysconfig and key cannot be NULL", _sysConfig3DeleteMetadataEntryForKey, object,
                 "k");
    EXPECT_NEEDS("sourceData or destData was NULL", _copySysConfigData, &out, &out);
    EXPECT_FALSE(_sysConfig3SetManifest(object, nullptr) || _sysConfig3SetManifest(nullptr, manifest));
    Recorder::take();
    EXPECT_NEEDS("invalid argument. sysconfig and key cannot be NULL", sysConfig3DeleteMetadataEntryForKey, object,
                 "k");
    EXPECT_NEEDS("invalid argument. sysconfig cannot be NULL", sysConfig3GetPayloadEntryForKey, object, 1);
    EXPECT_NEEDS("invalid arguments. Either entry or data was NULL", sysConfig3PayloadEntryGetData, payload, &out);
    EXPECT_NEEDS("invalid arguments. entry and data cannot be null", sysConfig3ManifestGetPayloadHMAC, manifest, &out);
}

TEST(SysConfig3, namesTheReportingOperationByItsPrototypeToAHookThatMayBeAbsent) {
    EXPECT_EQ(allocSysConfig3(0, 0), nullptr);
    const Recorder recorder;
    EXPECT_TRUE(getSysConfig3LogHandler() && getSysConfig3ExceptionHandler());
    EXPECT_EQ(allocSysConfig3(0, 0), nullptr);
    EXPECT_EQ(Recorder::prototype, "struct __SysConfig3 *__singleallocSysConfig3(SysConfig3Magic, SysConfig3Version)");
}

TEST(SysConfig3, toleratesAbsentRecordsWithoutAMessage) {
    const Recorder recorder;
    const auto expectNothingOf = [](auto... operations) { EXPECT_FALSE((operations(nullptr) || ...)); };
    expectNothingOf(sysConfig3GetHeadPayloadEntry, sysConfig3GetHeadMetadataEntry, sysConfig3GetManifest,
                    sysConfig3GetMagic, sysConfig3GetVersion, sysConfig3GetPayloadEntryCount,
                    sysConfig3GetMetadataEntryCount, sysConfig3PayloadEntryGetKey, sysConfig3PayloadEntryGetComment,
                    sysConfig3PayloadEntryGetString, sysConfig3PayloadEntryGetDeleted,
                    sysConfig3PayloadEntryGetNextEntry, copySysConfig3PayloadEntry, sysConfig3MetadataEntryGetKey,
                    sysConfig3MetadataEntryGetString, sysConfig3MetadataEntryGetNextEntry, copySysConfig3MetadataEntry,
                    sysConfig3ManifestGetVersion, copySysConfig3Manifest);
    SysConfigData out = {};
    EXPECT_FALSE(sysConfig3MetadataEntryGetData(nullptr, &out));
    EXPECT_FALSE(sysConfig3GetMetadataEntryForKey(newObject().get(), nullptr));
    deallocSysConfig3(nullptr);
    deallocSysConfig3Manifest(nullptr);
    EXPECT_EQ(Recorder::said, "");
}

TEST(SysConfig3, supportsNineMagicsAndThreeVersions) {
    std::string supported;
    for (const std::string_view name :
         {"0Cfg", "appv", "bCfg", "dCfg", "eCfg", "fCfg", "mCfg", "seal", "tCfg", "aCfg", "gCfb"}) {
        SysConfig3Magic magic = 0;
        for (const char character : name)
            magic = magic << 8 | static_cast<unsigned char>(character);
        supported += isSupportedSysConfig3Magic(magic) ? 'y' : 'n';
    }
    for (const SysConfig3Version version : {0x30000U, 0x30001U, 0x30002U, 0x30003U, 0x30004U})
        supported += isSupportedSysConfig3Version(version) ? 'y' : 'n';
    EXPECT_EQ(supported, "yyyyyyyyynn"
                         "nyyyn");
}

TEST(Entry, cutsStringsAtSixteenMebiAndKeysAt256) {
    const std::string tooLong = std::string().append(0x1000001, 'x');
    const PayloadEntryPtr entry = payloadString(keyWCh0, tooLong.c_str(), tooLong.c_str());
    EXPECT_EQ(std::strlen(sysConfig3PayloadEntryGetComment(entry.get())), 0x1000000U);
    EXPECT_EQ(std::strlen(sysConfig3PayloadEntryGetString(entry.get())), 0x1000000U);
    const MetadataEntryPtr metadata = metadataString(tooLong.c_str(), tooLong.c_str());
    EXPECT_EQ(std::strlen(sysConfig3MetadataEntryGetKey(metadata.get())), 256U);
    EXPECT_EQ(std::strlen(sysConfig3MetadataEntryGetString(metadata.get())), 0x1000000U);
}

// Expects that each of the records is equal to itself and to its copy only.
template <typename Pointer, std::size_t count, typename Equal, typename Copy>
void expectDistinct(const Pointer (&records)[count], Equal areEqual, Copy copy) {
    for (const Pointer& a : records) {
        for (const Pointer& b : records)
            EXPECT_EQ(areEqual(a.get(), b.get()), &a == &b) << &a - records << ", " << &b - records;
        EXPECT_TRUE(areEqual(a.get(), Pointer(copy(a.get())).get()));
        EXPECT_FALSE(areEqual(a.get(), nullptr));
        EXPECT_FALSE(areEqual(nullptr, a.get()));
    }
}

TEST(Entry, isEqualByAllItsParts) {
    const Bytes data = bytes("01 02");
    const PayloadEntryPtr payload[] = {
        payloadData(keyWCh0, data),      payloadData(keyMiGB, data),       payloadData(keyWCh0, data, "other"),
        payloadData(keyWCh0, {1}),       payloadData(keyWCh0, {1, 3}),     payloadString(keyWCh0, "a"),
        payloadString(keyWCh0, ""),      payloadString(keyWCh0, "b"),      payloadDeleted(keyWCh0),
        payloadString(keyWCh0, "", "a"), payloadString(keyWCh0, "a", "b"),
    };
    const MetadataEntryPtr metadata[] = {
        metadataData("k", {1, 2}), metadataData("k", {1}),    metadataData("l", {1, 2}), metadataString("k", ""),
        metadataString("k", "kk"), metadataString("kk", "k"), metadataString("", "kk"),
    };
    expectDistinct(payload, sysConfig3PayloadEntriesAreEqual, copySysConfig3PayloadEntry);
    expectDistinct(metadata, sysConfig3MetadataEntriesAreEqual, copySysConfig3MetadataEntry);
    EXPECT_TRUE(sysConfig3PayloadEntriesAreEqual(nullptr, nullptr));
    EXPECT_TRUE(sysConfig3MetadataEntriesAreEqual(nullptr, nullptr));
}

TEST(Entry, ignoresALengthThatComesWithoutData) {
    const MetadataEntryPtr metadata(allocSysConfig3MetadataEntry("k", nullptr, 7, "text"));
    EXPECT_TRUE(sysConfig3MetadataEntriesAreEqual(metadata.get(), metadataString("k", "text").get()));
}

TEST(List, takesItsOwnEntriesAndKeysBack) {
    const SysConfig3Ptr object = newObject();
    add(object, payloadData(keyWCh0, {1}));
    add(object, payloadData(keyMiGB, {2}));
    EXPECT_TRUE(sysConfig3AddPayloadEntry(object.get(), sysConfig3GetHeadPayloadEntry(object.get())));
    EXPECT_EQ(payloadOf(object), "MiGB=data 02, WCh0=data 01");

    add(object, metadataString("k", "text"));
    const char* ownKey = sysConfig3MetadataEntryGetKey(sysConfig3GetHeadMetadataEntry(object.get()));
    EXPECT_TRUE(sysConfig3DeleteMetadataEntryForKey(object.get(), ownKey));
    EXPECT_EQ(metadataOf(object), "");
}

TEST(Object, isEqualByBothListsInOrderAndTheManifest) {
    const auto object = [](std::initializer_list<std::uint32_t> keys, std::initializer_list<const char*> texts,
                           SysConfig3Magic magic = bCfg, SysConfig3Version version = 0x30003) {
        SysConfig3Ptr made(allocSysConfig3(magic, version));
        for (const std::uint32_t key : keys)
            add(made, payloadData(key, {1}));
        for (const char* key : texts)
            add(made, metadataString(key, "v"));
        return made;
    };
    const SysConfig3Ptr objects[] = {
        object({1, 2}, {"a", "b"}),
        object({2, 1}, {"a", "b"}),
        object({1, 2}, {"b", "a"}),
        object({1}, {"a", "b"}),
        object({1, 2}, {"a"}),
        object({}, {}),
        object({}, {}, 0x6D436667),
        object({}, {}, bCfg, 0x30001),
        decode(BlobParts{.manifest = bytes("30 09 04 01 00 04 01 01 04 01 00")}.whole()),
    };
    expectDistinct(objects, sysConfig3ObjectsAreEqual,
                   [](const __SysConfig3* original) { return decode(encode(original)).release(); });
    EXPECT_FALSE(sysConfig3ObjectsAreEqual(nullptr, nullptr));
}

TEST(Manifest, isEqualByItsVersionAndEachHMAC) {
    std::uint8_t octets[] = {1, 2}, otherOctets[] = {1, 3};
    const SysConfigData same = {octets, 2}, other = {otherOctets, 2}, shorter = {octets, 1}, absent = {};
    const auto make = [&](SysConfig3Version version, const SysConfigData& payload, const SysConfigData& metadata,
                          const SysConfigData& full) {
        return ManifestPtr(allocSysConfig3Manifest(version, &payload, &metadata, &full));
    };
    const ManifestPtr manifests[] = {
        make(0x30003, same, same, same),   make(0x30001, same, same, same),  make(0x30003, other, same, same),
        make(0x30003, same, other, same),  make(0x30003, same, same, other), make(0x30003, shorter, same, same),
        make(0x30001, absent, same, same),
    };
    expectDistinct(manifests, sysConfig3ManifestsAreEqual, copySysConfig3Manifest);
    EXPECT_EQ(sysConfig3ManifestGetVersion(manifests[1].get()), 0x30001U);
    const SysConfig3Ptr object = newObject();
    EXPECT_TRUE(_sysConfig3SetManifest(object.get(), manifests[2].get()));
    EXPECT_TRUE(sysConfig3ManifestsAreEqual(sysConfig3GetManifest(object.get()), manifests[2].get()));
    // An absent HMAC is equal to an absent one in the first version only.
    const ManifestPtr lacking = make(0x30003, same, absent, same);
    EXPECT_FALSE(sysConfig3ManifestsAreEqual(lacking.get(), lacking.get()));
    EXPECT_FALSE(sysConfig3ManifestsAreEqual(nullptr, nullptr));
}

// The index of the lists: what keys of an adversary do to it.

// Whether looking up every key once would pass less than two entries a key: an entry costs 1, and chance collisions add
// a half to that.
template <typename List>
bool isSpread(const List& list) {
    std::uint64_t cost = 0;
    for (std::uint64_t bucket = 0; bucket < list.bucketCount(); ++bucket) {
        std::uint64_t length = 0;
        for (const auto* entry = list.buckets[bucket]; entry != nullptr; entry = entry->bucketNext)
            cost += ++length;
    }
    return cost >= list.count && cost < std::uint64_t{2} * list.count;
}

Bytes withPayloadKeys(std::uint32_t count, std::uint32_t (*keyOf)(std::uint32_t)) {
    Bytes entries;
    for (std::uint32_t i = 0; i < count; ++i) {
        const std::uint32_t key = keyOf(i);
        entries.insert(entries.end(), {0x30, 0x0B, 0x02, 0x04, static_cast<std::uint8_t>(key),
                                       static_cast<std::uint8_t>(key >> 8), static_cast<std::uint8_t>(key >> 16),
                                       static_cast<std::uint8_t>(key >> 24), 0x16, 0x00, 0x01, 0x01, 0xFF});
    }
    return BlobParts{.payload = item("31", entries)}.whole();
}

TEST(Index, standsAMillionKeysOfAnAdversary) {
    constexpr std::uint32_t million = 1000000;
    const std::tuple<const char*, std::uint32_t (*)(std::uint32_t), std::uint32_t> rows[] = {
        {"consecutive", [](std::uint32_t i) { return i + 1; }, million},
        {"equal in the low bits", [](std::uint32_t i) { return (i + 1) << 12; }, million},
        {"evenly spaced", [](std::uint32_t i) { return (i + 1) * 4095; }, million},
        {"equal in the middle", [](std::uint32_t i) { return (i & 0xFFF) | (i >> 12 | 0x100) << 22; }, million},
        {"all equal", [](std::uint32_t) { return keyWCh0; }, 1},
    };
    for (const auto& [what, keyOf, count] : rows) {
        const SysConfig3Ptr object = decode(withPayloadKeys(million, keyOf));
        ASSERT_EQ(sysConfig3GetPayloadEntryCount(object.get()), count) << what;
        EXPECT_TRUE(isSpread(object->payload)) << what;
    }
}

TEST(Index, spreadsMetadataKeysToo) {
    constexpr std::uint32_t count = 30000;
    const SysConfig3Ptr object = newObject();
    for (std::uint32_t i = 0; i < count; ++i)
        ASSERT_TRUE(add(object, metadataString(std::to_string(i << 8).c_str(), "")));
    EXPECT_EQ(sysConfig3GetMetadataEntryCount(object.get()), count);
    EXPECT_TRUE(isSpread(object->metadata));
}

TEST(Index, hasASecretOfTheObjectsOwn) {
    const SysConfig3Ptr a = newObject();
    const SysConfig3Ptr b = newObject();
    EXPECT_NE(sysconfig::hashOf(a->secret, keyWCh0), sysconfig::hashOf(b->secret, keyWCh0));
}

} // namespace
