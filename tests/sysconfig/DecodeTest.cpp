// Blobs made by hand, decoded.
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

Bytes setOf(std::initializer_list<Bytes> entries) {
    return item("31", joined(entries));
}

const Bytes someData = item("04", bytes("01 02"));
const Bytes someText = item("16", text("text"));
const Bytes miGB = payloadEntry(someData, "42 47 69 4D");

TEST(Decode, readsTheSmallestBlobAndNoPrefixOfIt) {
    const Recorder recorder;
    EXPECT_TRUE(sysConfig3ObjectsAreEqual(decode(smallest).get(), newObject().get()));
    EXPECT_EQ(hexOf(BlobParts().whole()), hexOf(smallest));
    EXPECT_NE(decode(joined({smallest, bytes("FF FF")})), nullptr);
    for (std::size_t length = 0; length < smallest.size(); ++length)
        EXPECT_EQ(decode(Bytes(smallest.begin(), smallest.begin() + static_cast<std::ptrdiff_t>(length))), nullptr);
    EXPECT_EQ(decodeSysConfig3(nullptr, 50), nullptr);
    EXPECT_EQ(Recorder::lines, Lines{});
}

std::string joinedLines() {
    std::string joined;
    for (const std::string& line : Recorder::lines)
        joined += (joined.empty() ? "" : "\n") + line;
    return joined;
}

TEST(Decode, refusesABlobThatIsNotWellFormed) {
    Bytes sixElements = smallest;
    sixElements[1] += 2;
    sixElements.insert(sixElements.end(), {0x05, 0x00});
    Bytes set = smallest;
    set[0] = 0x31;
    const auto firstOctets = [](long count) {
        return item("30", {smallest.begin() + 2, smallest.begin() + 2 + count});
    };
    const auto magic = [](const char* octets) { return BlobParts{.magic = bytes(octets)}.whole(); };
    const auto version = [](const char* octets) { return BlobParts{.version = bytes(octets)}.whole(); };
    const auto payload = [](const Bytes& content) { return BlobParts{.payload = content}.whole(); };
    const auto metadata = [](const Bytes& content) { return BlobParts{.metadata = content}.whole(); };
    const auto manifest = [](const Bytes& content) { return BlobParts{.manifest = content}.whole(); };
    const std::tuple<const char*, Bytes, SysConfig3Subject, std::ptrdiff_t, DERFault, std::string> rows[] = {
        {"a sixth element", sixElements, SysConfig3SubjectBlob, 50, DERFaultExcess, ""},
        {"a SET around", set, SysConfig3SubjectBlob, 0, DERFaultNoSequence, ""},
        {"no element", item("30", {}), SysConfig3SubjectMagic, 2, DERFaultMissing, ""},
        {"no payload element", firstOctets(12), SysConfig3SubjectPayload, 14, DERFaultMissing, ""},
        {"no metadata element", firstOctets(21), SysConfig3SubjectMetadata, 23, DERFaultMissing, ""},
        {"no manifest element", firstOctets(30), SysConfig3SubjectManifest, 32, DERFaultMissing, ""},
        {"another version element", item("30", bytes("02 01 00 04 00")), SysConfig3SubjectVersion, 5, DERFaultTag, ""},
        {"another magic", magic("67 66 43 00"), SysConfig3SubjectMagic, 4, DERFaultNone,
         "Sysconfig magic 0x%X<436667> is not valid"},
        {"three octets of magic", magic("67 66 43"), SysConfig3SubjectMagic, 4, DERFaultNone,
         "Sysconfig magic 0x%X<0> is not valid"},
        {"five octets of magic", magic("67 66 43 62 00"), SysConfig3SubjectMagic, 4, DERFaultNone,
         "Sysconfig magic 0x%X<0> is not valid"},
        {"a later version", version("04 00 03 00"), SysConfig3SubjectVersion, 10, DERFaultNone,
         "allocSysConfig3: invalid version provided 0x%08X<00030004>\n"
         "Unable to allocate sysconfig3vX object. Likely due to an unsupported magic: 0x%X<62436667> or "
         "version: 0x%X<30004>"},
        {"no payload", payload({}), SysConfig3SubjectPayload, 21, DERFaultHeaderCutShort,
         "Unable to decode payload with error %d<3>"},
        {"a SEQUENCE as payload", payload(bytes("30 00")), SysConfig3SubjectPayload, 21, DERFaultTag,
         "Tag was not the expected Payload tag %llX<2000000000000010>"},
        {"a cut-off payload", payload(bytes("31 05 00")), SysConfig3SubjectPayload, 21, DERFaultContentCutShort,
         "Unable to decode payload with error %d<3>"},
        {"no metadata", metadata({}), SysConfig3SubjectMetadata, 30, DERFaultHeaderCutShort,
         "Unable to decode metadata with error %d<3>"},
        {"an OCTET STRING as metadata", metadata(bytes("04 00")), SysConfig3SubjectMetadata, 30, DERFaultTag,
         "Tag was not the expected metadata tag %llX<4>"},
        {"no manifest", manifest({}), SysConfig3SubjectManifest, 39, DERFaultHeaderCutShort,
         "Unable to decode manifest with error %d<3>"},
        {"a SET as manifest", manifest(bytes("31 09 04 01 00 04 01 00 04 01 00")), SysConfig3SubjectManifest, 39,
         DERFaultTag, "Tag was not the expected manifest tag %llX<2000000000000011>"},
        {"a fourth item in an entry", payload(setOf({payloadEntry(joined({someData, item("05", {})}))})),
         SysConfig3SubjectPayloadEntry, 23, DERFaultExcess, "Decode sequence error: %d<2>"},
        {"an empty entry", payload(setOf({bytes("30 00")})), SysConfig3SubjectPayloadEntry, 23, DERFaultMissing,
         "Decode sequence error: %d<5>"},
        {"a deleted flag of 1", payload(setOf({payloadEntry(bytes("01 01 01"))})), SysConfig3SubjectPayloadEntry, 23,
         DERFaultNone, "Decode sequence error: %d<3>"},
        {"a cut-off entry after a good one", payload(setOf({miGB, bytes("30 7F")})), SysConfig3SubjectPayloadEntry, 38,
         DERFaultContentCutShort, "Decode sequence error: %d<3>"},
        {"a metadata entry without a key", metadata(setOf({item("30", someData)})), SysConfig3SubjectMetadataEntry, 32,
         DERFaultTag, "Decode sequence error: %d<2>"},
        {"values in the wrong order", metadata(setOf({metadataEntry("k", joined({someText, someData}))})),
         SysConfig3SubjectMetadataEntry, 32, DERFaultExcess, "Decode sequence error: %d<3>"},
    };
    for (const auto& [what, blob, subject, offset, fault, lines] : rows) {
        SCOPED_TRACE(what);
        const Recorder recorder;
        SysConfig3Refusal refused;
        EXPECT_EQ(decodeSysConfig3Explained(blob.data(), static_cast<std::uint32_t>(blob.size()), &refused), nullptr);
        EXPECT_EQ(refused.subject, subject);
        EXPECT_EQ(refused.place - blob.data(), offset);
        EXPECT_EQ(refused.encoding.fault, fault);
        EXPECT_EQ(joinedLines(), lines);
    }
}

// The lines about an entry that is left out, none without a reason.
Lines refusal(const char* allocation, const char* reason, const char* addition) {
    return reason == nullptr ? Lines{} : Lines{std::string(allocation) + reason, addition};
}

TEST(Decode, takesEachPayloadEntryOnItsMerits) {
    constexpr char noValue[] = "one of data, string, or deleted must be provided";
    Bytes mistagged = payloadEntry(someData);
    mistagged[0] = 0x04;
    // With the list ahead of the good entry that follows, and the reason why there is none.
    const std::tuple<const char*, Bytes, std::string, const char*> rows[] = {
        {"data", payloadEntry(someData), "WCh0=data 01 02, ", nullptr},
        {"a string up to its NUL", payloadEntry(item("16", bytes("61 00 62"))), "WCh0=string a, ", nullptr},
        {"an empty string", payloadEntry(item("16", {})), "WCh0=string , ", nullptr},
        {"the deleted flag", payloadEntry(bytes("01 01 FF")), "WCh0=deleted, ", nullptr},
        {"data and a false flag", payloadEntry(joined({someData, bytes("01 01 00")})), "WCh0=data 01 02, ", nullptr},
        {"data and an empty flag", payloadEntry(joined({someData, bytes("01 00")})), "WCh0=data 01 02, ", nullptr},
        {"any tag for the entry itself", mistagged, "WCh0=data 01 02, ", nullptr},
        {"a key of two octets", payloadEntry(someData, "30 68"), "", "key was invalid"},
        {"a key of zeros", payloadEntry(someData, "00 00 00 00"), "", "key was invalid"},
        {"no value", payloadEntry({}), "", noValue},
        {"a false flag alone", payloadEntry(bytes("01 01 00")), "", noValue},
        {"empty data", payloadEntry(item("04", {})), "", "data was 0 length"},
        {"data and a string", payloadEntry(joined({someData, someText})), "",
         "data, string and deleted are mutually exclusive. Caller provided parameters [%s< data>%s< string>%s<> ]"},
        {"all three", payloadEntry(joined({item("04", {}), someText, bytes("01 01 FF")})), "",
         "data, string and deleted are mutually exclusive. Caller provided parameters [%s< data>%s< string>%s< "
         "deleted> ]"},
    };
    for (const auto& [what, entry, list, reason] : rows) {
        const Recorder recorder;
        EXPECT_EQ(payloadOf(decodeParts({.payload = setOf({entry, miGB})})), list + "MiGB=data 01 02") << what;
        EXPECT_EQ(Recorder::lines,
                  refusal("_allocSysConfig3PayloadEntryInternal: ", reason,
                          "_sysConfig3AddPayloadEntry: invalid argument. sysconfig and etnry cannot be NULL"))
            << what;
    }
}

TEST(Decode, takesEachMetadataEntryOnItsMerits) {
    const std::string longKey(300, 'k');
    const std::string cutKey = longKey.substr(0, 256);
    const std::tuple<const char*, Bytes, std::string, const char*> rows[] = {
        {"data", metadataEntry("k", someData), "k=data 01 02", nullptr},
        {"a string", metadataEntry("k", someText), "k=string text", nullptr},
        {"an empty key", metadataEntry("", someText), "=string text", nullptr},
        {"a key up to its NUL", metadataEntry(std::string_view("a\0b", 3), someText), "a=string text", nullptr},
        {"a long key, twice", joined({metadataEntry(longKey, someText), metadataEntry(cutKey, someData)}),
         cutKey + "=data 01 02", nullptr},
        {"no value", metadataEntry("k", {}), "", "either data or string must be non-null"},
        {"empty data", metadataEntry("k", item("04", {})), "", "data cannot be length zero"},
        {"both", metadataEntry("k", joined({someData, someText})), "", "data and string are mutually exclusive"},
    };
    for (const auto& [what, entries, list, reason] : rows) {
        const Recorder recorder;
        EXPECT_EQ(metadataOf(decodeParts({.metadata = item("31", entries)})), list) << what;
        EXPECT_EQ(Recorder::lines,
                  refusal("allocSysConfig3MetadataEntry: ", reason,
                          "_sysConfig3AddMetadataEntry: invalid argument. sysconfig and entry cannot be NULL"))
            << what;
    }
}

TEST(Decode, keepsTheLastOfSeveralEntriesWithOneKey) {
    const SysConfig3Ptr object =
        decodeParts({.payload = setOf({payloadEntry(item("04", {1})), payloadEntry(item("04", {2})), miGB,
                                       payloadEntry(item("04", {3}))})});
    EXPECT_EQ(payloadOf(object), "MiGB=data 01 02, WCh0=data 03");
    EXPECT_EQ(sysConfig3GetPayloadEntryCount(object.get()), 2U);
    // The index knows the survivor.
    EXPECT_TRUE(sysConfig3DeletePayloadEntryForKey(object.get(), keyWCh0));
    EXPECT_EQ(payloadOf(object), "MiGB=data 01 02");
}

TEST(Decode, replacesAnEmptyCommentAndKeepsOthers) {
    const std::pair<const char*, const char*> rows[] = {
        {"", "."}, {"6E 6F 74 65", "note"}, {"00 61", "."}, {"61 00 62", "a"}};
    for (const auto& [comment, stored] : rows) {
        const SysConfig3Ptr object =
            decodeParts({.payload = setOf({payloadEntry(someData, "30 68 43 57", bytes(comment))})});
        EXPECT_STREQ(sysConfig3PayloadEntryGetComment(sysConfig3GetHeadPayloadEntry(object.get())), stored);
    }
}

TEST(Decode, takesAManifestOfThreeHMACsOnly) {
    const std::tuple<const char*, const char*, const char*> rows[] = {
        {"04 02 01 02 04 00 04 01 03", "01 02 | absent | 03", nullptr},
        {"04 00 04 00 04 00", "00 | 00 | 00", nullptr},
        {"", "00 | 00 | 00", "%d<5>"},
        {"04 01 01 04 01 02", "00 | 00 | 00", "%d<5>"},
        {"04 01 01 04 01 02 04 01 03 04 01 04", "00 | 00 | 00", "%d<3>"},
        {"04 01 01 02 01 02 04 01 03", "00 | 00 | 00", "%d<2>"},
    };
    for (const auto& [content, manifest, error] : rows) {
        const Recorder recorder;
        EXPECT_EQ(manifestOf(decodeParts({.manifest = item("30", bytes(content))})), manifest) << content;
        EXPECT_EQ(Recorder::lines, error ? Lines{"Decode manifest sequence error: " + std::string(error)} : Lines{})
            << content;
    }
}

TEST(Decode, doesNotLookAtHMACsOrAtTheVersionOfADeletedFlag) {
    const Recorder recorder;
    EXPECT_EQ(
        payloadOf(decodeParts({.version = bytes("02 00 03 00"), .payload = setOf({payloadEntry(bytes("01 01 FF"))})})),
        "WCh0=deleted");
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
