// Blobs made by hand, decoded, and objects, encoded.
#include <string>
#include <tuple>

#include <gtest/gtest.h>

#include "sysconfig/SysConfig3Internal.h"
#include "tests/sysconfig/Blob.h"
#include "tests/sysconfig/Recorder.h"

namespace {

using sysconfig::SysConfig3Ptr;

const Bytes smallest = bytes("30 30 02 04 67 66 43 62 02 04 03 00 03 00 FF 85 9A C1 82 59 02 31 00 FF 84 EA 95 A8 41 "
                             "02 31 00 FF 84 EA 85 9C 49 0B 30 09 04 01 00 04 01 00 04 01 00");

// A payload entry with key "WCh0" and comment ".", and the items given.
Bytes payloadEntry(const Bytes& value, const char* key = "30 68 43 57", const Bytes& comment = text(".")) {
    return item("30", joined({item("02", bytes(key)), item("16", comment), value}));
}

Bytes metadataEntry(std::string_view key, const Bytes& value) {
    return item("30", joined({item("16", text(key)), value}));
}

const Bytes someData = item("04", bytes("01 02"));
const Bytes someText = item("16", text("text"));
const Bytes miGB = payloadEntry(someData, "42 47 69 4D");

// Blobs that differ in one part from the smallest one.
Bytes withMagic(const char* octets) {
    return BlobParts{.magic = bytes(octets)}.whole();
}

Bytes withPayload(const Bytes& element) {
    return BlobParts{.payload = element}.whole();
}

Bytes withMetadata(const Bytes& element) {
    return BlobParts{.metadata = element}.whole();
}

Bytes withManifest(const Bytes& element) {
    return BlobParts{.manifest = element}.whole();
}

TEST(Decode, readsTheSmallestBlobAndNoPrefixOfIt) {
    const Recorder recorder;
    EXPECT_TRUE(sysConfig3ObjectsAreEqual(decode(smallest).get(), newObject().get()));
    EXPECT_EQ(hexOf(BlobParts().whole()), hexOf(smallest));
    EXPECT_NE(decode(joined({smallest, bytes("FF FF")})), nullptr);
    for (std::size_t length = 0; length < smallest.size(); ++length)
        EXPECT_EQ(decode(Bytes(smallest.begin(), smallest.begin() + static_cast<std::ptrdiff_t>(length))), nullptr);
    EXPECT_EQ(decodeSysConfig3(nullptr, 50), nullptr);
    EXPECT_EQ(Recorder::said, "");
}

TEST(Decode, refusesABlobThatIsNotWellFormed) {
    constexpr auto whole = SysConfig3SubjectBlob, magic = SysConfig3SubjectMagic, version = SysConfig3SubjectVersion,
                   payload = SysConfig3SubjectPayload, payloadItem = SysConfig3SubjectPayloadEntry,
                   metadata = SysConfig3SubjectMetadata, metadataItem = SysConfig3SubjectMetadataEntry,
                   manifest = SysConfig3SubjectManifest;
    const Bytes content(smallest.begin() + 2, smallest.end());
    const auto firstOctets = [&](long count) { return item("30", {content.begin(), content.begin() + count}); };
    const auto payloadOf = [](const Bytes& entries) { return withPayload(item("31", entries)); };
    const std::tuple<Bytes, SysConfig3Subject, std::ptrdiff_t, DERFault, std::string> rows[] = {
        {item("30", joined({content, bytes("05 00")})), whole, 50, DERFaultExcess, ""},
        {item("31", content), whole, 0, DERFaultNoSequence, ""},
        {firstOctets(0), magic, 2, DERFaultMissing, ""},
        {firstOctets(12), payload, 14, DERFaultMissing, ""},
        {firstOctets(21), metadata, 23, DERFaultMissing, ""},
        {firstOctets(30), manifest, 32, DERFaultMissing, ""},
        {item("30", bytes("02 01 00 04 00")), version, 5, DERFaultTag, ""},
        {withMagic("67 66 43 00"), magic, 4, DERFaultNone, "Sysconfig magic 0x436667 is not valid"},
        {withMagic("67 66 43"), magic, 4, DERFaultNone, "Sysconfig magic 0x0 is not valid"},
        {withMagic("67 66 43 62 00"), magic, 4, DERFaultNone, "Sysconfig magic 0x0 is not valid"},
        {BlobParts{.version = bytes("04 00 03 00")}.whole(), version, 10, DERFaultNone,
         "allocSysConfig3: invalid version provided 0x00030004\nUnable to allocate sysconfig3vX object. Likely due to "
         "an unsupported magic: 0x62436667 or version: 0x30004"},
        {withPayload({}), payload, 21, DERFaultHeaderCutShort, "Unable to decode payload with error 3"},
        {withMetadata(bytes("04 00")), metadata, 30, DERFaultTag, "Tag was not the expected metadata tag 4"},
        {withManifest({}), manifest, 39, DERFaultHeaderCutShort, "Unable to decode manifest with error 3"},
        {payloadOf(payloadEntry(joined({someData, item("05", {})}))), payloadItem, 23, DERFaultExcess,
         "Decode sequence error: 2"},
        {payloadOf(payloadEntry(bytes("01 01 01"))), payloadItem, 23, DERFaultNone, "Decode sequence error: 3"},
        {payloadOf(joined({miGB, bytes("30 7F")})), payloadItem, 38, DERFaultContentCutShort,
         "Decode sequence error: 3"},
        {withMetadata(item("31", item("30", someData))), metadataItem, 32, DERFaultTag, "Decode sequence error: 2"},
    };
    for (const auto& [blob, subject, offset, fault, said] : rows) {
        SCOPED_TRACE(hexOf(blob));
        const Recorder recorder;
        SysConfig3Refusal refused;
        EXPECT_EQ(decodeSysConfig3Explained(blob.data(), static_cast<std::uint32_t>(blob.size()), &refused), nullptr);
        EXPECT_EQ(refused.subject, subject);
        EXPECT_EQ(refused.place - blob.data(), offset);
        EXPECT_EQ(refused.encoding.fault, fault);
        EXPECT_EQ(Recorder::said, said);
    }
}

TEST(Decode, takesEachEntryAndManifestOnItsMeritsAndThereAndBack) {
    const auto payload = [](const Bytes& entries) { return withPayload(item("31", joined({entries, miGB}))); };
    const auto metadata = [](const Bytes& entries) { return withMetadata(item("31", entries)); };
    const auto manifest = [](const char* hmacs) { return withManifest(item("30", bytes(hmacs))); };
    const auto noPayload = [](const std::string& reason) {
        return "_allocSysConfig3PayloadEntryInternal: " + reason +
               "\n_sysConfig3AddPayloadEntry: invalid argument. sysconfig and etnry cannot be NULL";
    };
    const auto noMetadata = [](const std::string& reason) {
        return "allocSysConfig3MetadataEntry: " + reason +
               "\n_sysConfig3AddMetadataEntry: invalid argument. sysconfig and entry cannot be NULL";
    };
    Bytes mistagged = payloadEntry(someData);
    mistagged[0] = 0x04;
    const std::string longKey(300, 'k'), cutKey = longKey.substr(0, 256);
    const std::tuple<Bytes, std::string, std::string> rows[] = {
        {payload(payloadEntry(item("16", bytes("61 00 62")))), "WCh0=string a, MiGB=data 01 02", ""},
        {payload(payloadEntry(item("16", {}))), "WCh0=string , MiGB=data 01 02", ""},
        {payload(payloadEntry(bytes("01 01 FF"))), "WCh0=deleted, MiGB=data 01 02", ""},
        {payload(payloadEntry(joined({someData, bytes("01 01 00")}))), "WCh0=data 01 02, MiGB=data 01 02", ""},
        {payload(mistagged), "WCh0=data 01 02, MiGB=data 01 02", ""},
        {payload(payloadEntry(someData, "00 00 00 00")), "MiGB=data 01 02", noPayload("key was invalid")},
        {payload(payloadEntry({})), "MiGB=data 01 02", noPayload("one of data, string, or deleted must be provided")},
        {payload(payloadEntry(item("04", {}))), "MiGB=data 01 02", noPayload("data was 0 length")},
        {payload(payloadEntry(joined({item("04", {}), someText, bytes("01 01 FF")}))), "MiGB=data 01 02",
         noPayload(
             "data, string and deleted are mutually exclusive. Caller provided parameters [ data string deleted ]")},
        // Of the entries with one key the last stays, in its place.
        {payload(joined({payloadEntry(item("04", {1})), miGB, payloadEntry(item("04", {2}))})),
         "WCh0=data 02, MiGB=data 01 02", ""},
        {payload(payloadEntry(someData, "30 68 43 57", {})), "WCh0=data 01 02, MiGB=data 01 02", ""},
        {payload(payloadEntry(someData, "30 68 43 57", text("note"))), "WCh0 (note)=data 01 02, MiGB=data 01 02", ""},
        {payload(payloadEntry(someData, "30 68 43 57", bytes("00 61"))), "WCh0=data 01 02, MiGB=data 01 02", ""},
        // Nobody looks at the version of a deleted flag.
        {BlobParts{.version = bytes("01 00 03 00"), .payload = item("31", payloadEntry(bytes("01 01 FF")))}.whole(),
         "WCh0=deleted", ""},

        {metadata(metadataEntry("k", someData)), "k=data 01 02", ""},
        {metadata(metadataEntry("", someText)), "=string text", ""},
        {metadata(metadataEntry(std::string_view("a\0b", 3), someText)), "a=string text", ""},
        {metadata(joined({metadataEntry(longKey, someText), metadataEntry(cutKey, someData)})), cutKey + "=data 01 02",
         ""},
        {metadata(metadataEntry("k", {})), "", noMetadata("either data or string must be non-null")},
        {metadata(metadataEntry("k", item("04", {}))), "", noMetadata("data cannot be length zero")},
        {metadata(metadataEntry("k", joined({someData, someText}))), "",
         noMetadata("data and string are mutually exclusive")},

        {manifest("04 02 01 02 04 00 04 01 03"), "0102|absent|03", ""},
        {manifest("04 00 04 00 04 00"), "", ""},
        {manifest("04 01 01 04 01 02"), "", "Decode manifest sequence error: 5"},
    };
    for (const auto& [blob, content, said] : rows) {
        SCOPED_TRACE(hexOf(blob));
        const Recorder recorder;
        SysConfig3Ptr object = decode(blob);
        EXPECT_EQ(Recorder::said, said);
        for (int times = 0; times < 2; ++times, object = decode(encode(object.get()))) {
            const std::string hmacs = manifestOf(object);
            EXPECT_EQ(payloadOf(object) + metadataOf(object) + (hmacs == "00|00|00" ? "" : hmacs), content);
        }
    }
}

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

TEST(EncodeOfABrokenRecord, reportsAnEntryWithoutExactlyOneValue) {
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

    const SysConfig3Ptr twoKinds = newObject();
    twoKinds->payload.appendWithoutIndex(
        sysconfig::makeEntry(sysconfig::PayloadContent{keyWCh0, {}, {keyBytes, 1}, {}, true}));
    const Recorder recorder;
    const Bytes blob = encode(twoKinds.get()); // with the data, which comes first
    EXPECT_TRUE(Recorder::said.ends_with(" string: (nil) deleted: 255")) << Recorder::said;
    EXPECT_EQ(payloadOf(decode(blob)), "WCh0=data " + hexOf({keyBytes[0]}));
}

} // namespace
