// Blobs made by hand, decoded.
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "sysconfig/SysConfig3Internal.h"
#include "tests/sysconfig/Blob.h"
#include "tests/sysconfig/Recorder.h"

namespace {

using sysconfig::SysConfig3Ptr;
using Lines = std::vector<std::string>;

const Bytes smallest = bytes("30 30 02 04 67 66 43 62 02 04 03 00 03 00 FF 85 9A C1 82 59 02 31 00 FF 84 EA 95 A8 41 "
                             "02 31 00 FF 84 EA 85 9C 49 0B 30 09 04 01 00 04 01 00 04 01 00");

// A payload entry with key "WCh0" and comment ".", and the items given.
Bytes payloadEntry(const Bytes& value, const char* key = "30 68 43 57") {
    return item("30", joined({item("02", bytes(key)), item("16", text(".")), value}));
}

Bytes metadataEntry(const char* key, const Bytes& value) {
    return item("30", joined({item("16", text(key)), value}));
}

Bytes setOf(std::initializer_list<Bytes> entries) {
    return item("31", joined(entries));
}

const Bytes someData = item("04", bytes("01 02"));

BlobParts withPayload(const Bytes& payload) {
    BlobParts parts;
    parts.payload = payload;
    return parts;
}

BlobParts withMetadata(const Bytes& metadata) {
    BlobParts parts;
    parts.metadata = metadata;
    return parts;
}

BlobParts withManifest(const Bytes& manifest) {
    BlobParts parts;
    parts.manifest = manifest;
    return parts;
}

BlobParts withMagic(const char* magic) {
    BlobParts parts;
    parts.magic = bytes(magic);
    return parts;
}

BlobParts withVersion(const char* version) {
    BlobParts parts;
    parts.version = bytes(version);
    return parts;
}

TEST(Decode, readsTheSmallestBlob) {
    const Recorder recorder;
    const SysConfig3Ptr object = decode(smallest);
    ASSERT_NE(object, nullptr);
    EXPECT_EQ(sysConfig3GetMagic(object.get()), bCfg);
    EXPECT_EQ(sysConfig3GetVersion(object.get()), 0x30003U);
    EXPECT_EQ(payloadOf(object.get()) + metadataOf(object.get()), "");
    EXPECT_EQ(manifestOf(object.get()), "00 | 00 | 00");
    EXPECT_TRUE(sysConfig3ObjectsAreEqual(object.get(), newObject().get()));
    EXPECT_EQ(Recorder::lines, Lines{});
    EXPECT_EQ(hexOf(BlobParts().whole()), hexOf(smallest));
}

TEST(Decode, refusesEveryPrefixAndTakesOctetsBehind) {
    for (std::size_t length = 0; length < smallest.size(); ++length)
        EXPECT_EQ(decode(Bytes(smallest.begin(), smallest.begin() + static_cast<std::ptrdiff_t>(length))), nullptr);
    EXPECT_NE(decode(joined({smallest, bytes("FF FF")})), nullptr);
    EXPECT_EQ(decodeSysConfig3(nullptr, 50), nullptr);
}

TEST(Decode, refusesABlobThatIsNotWellFormed) {
    BlobParts fourItemEntry = withPayload(setOf({payloadEntry(joined({someData, item("05", {})}))}));
    Bytes sixElements = smallest;
    sixElements[1] += 2;
    sixElements.insert(sixElements.end(), {0x05, 0x00});
    Bytes set = smallest;
    set[0] = 0x31;
    const struct {
        const char* what;
        Bytes blob;
        Lines lines;
    } rows[] = {
        {"a sixth element", sixElements, {}},
        {"a SET around", set, {}},
        {"another magic", withMagic("67 66 43 00").whole(), {"Sysconfig magic 0x436667 is not valid"}},
        {"three octets of magic", withMagic("67 66 43").whole(), {"Sysconfig magic 0x0 is not valid"}},
        {"five octets of magic", withMagic("67 66 43 62 00").whole(), {"Sysconfig magic 0x0 is not valid"}},
        {"a later version",
         withVersion("04 00 03 00").whole(),
         {"allocSysConfig3: invalid version provided 0x00030004",
          "Unable to allocate sysconfig3vX object. Likely due to an unsupported magic: 0x62436667 or version: "
          "0x30004"}},
        {"no version",
         withVersion("").whole(),
         {"allocSysConfig3: invalid version provided 0x00000000",
          "Unable to allocate sysconfig3vX object. Likely due to an unsupported magic: 0x62436667 or version: 0x0"}},
        {"no payload", withPayload({}).whole(), {"Unable to decode payload with error 3"}},
        {"a SEQUENCE as payload",
         withPayload(bytes("30 00")).whole(),
         {"Tag was not the expected Payload tag 2000000000000010"}},
        {"a cut-off payload", withPayload(bytes("31 05 00")).whole(), {"Unable to decode payload with error 3"}},
        {"no metadata", withMetadata({}).whole(), {"Unable to decode metadata with error 3"}},
        {"an OCTET STRING as metadata",
         withMetadata(bytes("04 00")).whole(),
         {"Tag was not the expected metadata tag 4"}},
        {"no manifest", withManifest({}).whole(), {"Unable to decode manifest with error 3"}},
        {"a SET as manifest",
         withManifest(bytes("31 09 04 01 00 04 01 00 04 01 00")).whole(),
         {"Tag was not the expected manifest tag 2000000000000011"}},
        {"a fourth item in an entry", fourItemEntry.whole(), {"Decode sequence error: 2"}},
        {"an empty entry", withPayload(setOf({bytes("30 00")})).whole(), {"Decode sequence error: 5"}},
        {"an entry without a comment",
         withPayload(setOf({item("30", item("02", bytes("30 68 43 57")))})).whole(),
         {"Decode sequence error: 5"}},
        {"a deleted flag of 1",
         withPayload(setOf({payloadEntry(bytes("01 01 01"))})).whole(),
         {"Decode sequence error: 3"}},
        {"an entry that is cut off, after a good one",
         withPayload(setOf({payloadEntry(someData), bytes("30 7F")})).whole(),
         {"Decode sequence error: 3"}},
        {"a metadata entry without a key",
         withMetadata(setOf({item("30", someData)})).whole(),
         {"Decode sequence error: 2"}},
        {"values in the wrong order",
         withMetadata(setOf({metadataEntry("k", joined({item("16", text("s")), someData}))})).whole(),
         {"Decode sequence error: 3"}},
    };
    for (const auto& row : rows) {
        const Recorder recorder;
        EXPECT_EQ(decode(row.blob), nullptr) << row.what;
        EXPECT_EQ(Recorder::lines, row.lines) << row.what;
        for (const int level : Recorder::levels)
            EXPECT_EQ(level, 2);
    }
}

TEST(Decode, handsItsFormatsToTheHookUnformatted) {
    const struct {
        Bytes blob;
        const char* format;
    } rows[] = {
        {withMagic("00 00 00 00").whole(), "Sysconfig magic 0x%X is not valid"},
        {withVersion("00 00 00 00").whole(),
         "Unable to allocate sysconfig3vX object. Likely due to an unsupported magic: 0x%X or version: 0x%X"},
        {withPayload({}).whole(), "Unable to decode payload with error %d"},
        {withPayload(bytes("30 00")).whole(), "Tag was not the expected Payload tag %llX"},
        {withPayload(setOf({bytes("30 00")})).whole(), "Decode sequence error: %d"},
        {withMetadata({}).whole(), "Unable to decode metadata with error %d"},
        {withMetadata(bytes("30 00")).whole(), "Tag was not the expected metadata tag %llX"},
        {withMetadata(setOf({bytes("30 00")})).whole(), "Decode sequence error: %d"},
        {withManifest({}).whole(), "Unable to decode manifest with error %d"},
        {withManifest(bytes("31 00")).whole(), "Tag was not the expected manifest tag %llX"},
        {withManifest(bytes("30 00")).whole(), "Decode manifest sequence error: %d"},
    };
    for (const auto& row : rows) {
        const Recorder recorder;
        decode(row.blob);
        ASSERT_FALSE(Recorder::formats.empty()) << row.format;
        EXPECT_EQ(Recorder::formats.back(), row.format);
    }
}

TEST(Decode, takesEachEntryOnItsMerits) {
    const char* const addFailure = "_sysConfig3AddPayloadEntry: invalid argument. sysconfig and etnry cannot be NULL";
    const Bytes string = item("16", text("text"));
    const Bytes good = payloadEntry(someData, "42 47 69 4D");
    Bytes mistagged = payloadEntry(someData);
    mistagged[0] = 0x04;
    const struct {
        const char* what;
        Bytes entry;
        const char* list;
        const char* reason;
    } rows[] = {
        {"data", payloadEntry(someData), "WCh0=data 01 02, MiGB=data 01 02", nullptr},
        {"a string up to its NUL", payloadEntry(item("16", bytes("61 00 62"))), "WCh0=string a, MiGB=data 01 02",
         nullptr},
        {"an empty string", payloadEntry(item("16", {})), "WCh0=string , MiGB=data 01 02", nullptr},
        {"the deleted flag", payloadEntry(bytes("01 01 FF")), "WCh0=deleted, MiGB=data 01 02", nullptr},
        {"data and a false flag", payloadEntry(joined({someData, bytes("01 01 00")})),
         "WCh0=data 01 02, MiGB=data 01 02", nullptr},
        {"data and an empty flag", payloadEntry(joined({someData, bytes("01 00")})), "WCh0=data 01 02, MiGB=data 01 02",
         nullptr},
        {"any tag for the entry itself", mistagged, "WCh0=data 01 02, MiGB=data 01 02", nullptr},
        {"a key of two octets", payloadEntry(someData, "30 68"), "MiGB=data 01 02", "key was invalid"},
        {"a key of zeros", payloadEntry(someData, "00 00 00 00"), "MiGB=data 01 02", "key was invalid"},
        {"no value", payloadEntry({}), "MiGB=data 01 02", "one of data, string, or deleted must be provided"},
        {"a false flag alone", payloadEntry(bytes("01 01 00")), "MiGB=data 01 02",
         "one of data, string, or deleted must be provided"},
        {"empty data", payloadEntry(item("04", {})), "MiGB=data 01 02", "data was 0 length"},
        {"data and a string", payloadEntry(joined({someData, string})), "MiGB=data 01 02",
         "data, string and deleted are mutually exclusive. Caller provided parameters [ data string ]"},
        {"all three", payloadEntry(joined({item("04", {}), string, bytes("01 01 FF")})), "MiGB=data 01 02",
         "data, string and deleted are mutually exclusive. Caller provided parameters [ data string deleted ]"},
    };
    for (const auto& row : rows) {
        const Recorder recorder;
        const SysConfig3Ptr object = decode(withPayload(setOf({row.entry, good})).whole());
        ASSERT_NE(object, nullptr) << row.what;
        EXPECT_EQ(payloadOf(object.get()), row.list) << row.what;
        Lines expected;
        if (row.reason != nullptr)
            expected = {std::string("_allocSysConfig3PayloadEntryInternal: ") + row.reason, addFailure};
        EXPECT_EQ(Recorder::lines, expected) << row.what;
    }
}

TEST(Decode, takesEachMetadataEntryOnItsMerits) {
    const char* const addFailure = "_sysConfig3AddMetadataEntry: invalid argument. sysconfig and entry cannot be NULL";
    const Bytes string = item("16", text("text"));
    const std::string longKey(300, 'k');
    const std::string cutKey = longKey.substr(0, 256);
    const struct {
        const char* what;
        Bytes entries;
        std::string list;
        const char* reason;
    } rows[] = {
        {"data", metadataEntry("k", someData), "k=data 01 02", nullptr},
        {"a string", metadataEntry("k", string), "k=string text", nullptr},
        {"an empty key", metadataEntry("", string), "=string text", nullptr},
        {"a key up to its NUL", item("30", joined({item("16", bytes("61 00 62")), string})), "a=string text", nullptr},
        {"a long key, twice", joined({metadataEntry(longKey.c_str(), string), metadataEntry(cutKey.c_str(), someData)}),
         cutKey + "=data 01 02", nullptr},
        {"no value", metadataEntry("k", {}), "", "either data or string must be non-null"},
        {"empty data", metadataEntry("k", item("04", {})), "", "data cannot be length zero"},
        {"both", metadataEntry("k", joined({someData, string})), "", "data and string are mutually exclusive"},
    };
    for (const auto& row : rows) {
        const Recorder recorder;
        const SysConfig3Ptr object = decode(withMetadata(item("31", row.entries)).whole());
        ASSERT_NE(object, nullptr) << row.what;
        EXPECT_EQ(metadataOf(object.get()), row.list) << row.what;
        Lines expected;
        if (row.reason != nullptr)
            expected = {std::string("allocSysConfig3MetadataEntry: ") + row.reason, addFailure};
        EXPECT_EQ(Recorder::lines, expected) << row.what;
    }
}

TEST(Decode, keepsTheLastOfSeveralEntriesWithOneKey) {
    const Bytes other = payloadEntry(someData, "42 47 69 4D");
    const SysConfig3Ptr object = decode(withPayload(setOf({payloadEntry(item("04", {1})), payloadEntry(item("04", {2})),
                                                           other, payloadEntry(item("04", {3}))}))
                                            .whole());
    EXPECT_EQ(payloadOf(object.get()), "MiGB=data 01 02, WCh0=data 03");
    EXPECT_EQ(sysConfig3GetPayloadEntryCount(object.get()), 2U);
    // The index knows the survivor.
    EXPECT_TRUE(sysConfig3DeletePayloadEntryForKey(object.get(), keyWCh0));
    EXPECT_EQ(payloadOf(object.get()), "MiGB=data 01 02");
}

TEST(Decode, replacesAnEmptyCommentAndKeepsOthers) {
    const auto entry = [](const Bytes& comment) {
        return item("30", joined({item("02", bytes("30 68 43 57")), item("16", comment), someData}));
    };
    const struct {
        Bytes comment;
        const char* stored;
    } rows[] = {{{}, "."}, {text("note"), "note"}, {bytes("00 61"), "."}, {bytes("61 00 62"), "a"}};
    for (const auto& row : rows) {
        const SysConfig3Ptr object = decode(withPayload(setOf({entry(row.comment)})).whole());
        EXPECT_STREQ(sysConfig3PayloadEntryGetComment(sysConfig3GetHeadPayloadEntry(object.get())), row.stored);
    }
}

TEST(Decode, takesAManifestOfThreeHMACsOnly) {
    const struct {
        const char* content;
        const char* manifest;
        Lines lines;
    } rows[] = {
        {"04 02 01 02 04 00 04 01 03", "01 02 | absent | 03", {}},
        {"04 00 04 00 04 00", "00 | 00 | 00", {}},
        {"", "00 | 00 | 00", {"Decode manifest sequence error: 5"}},
        {"04 01 01 04 01 02", "00 | 00 | 00", {"Decode manifest sequence error: 5"}},
        {"04 01 01 04 01 02 04 01 03 04 01 04", "00 | 00 | 00", {"Decode manifest sequence error: 3"}},
        {"04 01 01 02 01 02 04 01 03", "00 | 00 | 00", {"Decode manifest sequence error: 2"}},
    };
    for (const auto& row : rows) {
        const Recorder recorder;
        const SysConfig3Ptr object = decode(withManifest(item("30", bytes(row.content))).whole());
        ASSERT_NE(object, nullptr) << row.content;
        EXPECT_EQ(manifestOf(object.get()), row.manifest) << row.content;
        EXPECT_EQ(Recorder::lines, row.lines) << row.content;
    }
}

TEST(Decode, doesNotLookAtHMACsOrAtTheVersionOfADeletedFlag) {
    BlobParts parts = withVersion("02 00 03 00");
    parts.payload = setOf({payloadEntry(bytes("01 01 FF"))});
    const Recorder recorder;
    const SysConfig3Ptr object = decode(parts.whole());
    EXPECT_EQ(payloadOf(object.get()), "WCh0=deleted");
    EXPECT_EQ(Recorder::lines, Lines{});
}

TEST(DecodeCallbacks, needAnObject) {
    const Recorder recorder;
    const DERDecodedInfo entry = {DERTagSequence, {nullptr, 0}};
    bool stop = false;
    EXPECT_EQ(_DERDecodeSysConfig3ParseAndPopulatePayloadSequence(&entry, &stop, nullptr), DERParamError);
    EXPECT_EQ(_DERDecodeSysConfig3ParseAndPopulateMetadataSequence(&entry, &stop, nullptr), DERParamError);
    EXPECT_EQ(Recorder::lines, Lines{"_DERDecodeSysConfig3ParseAndPopulateMetadataSequence: the refcon arg was NULL"});
}

} // namespace
