#include "der/DERDecode.h"
#include "der/DEREncode.h"
#include "der/DEREncodeInternal.h"
#include "der/DERItemSpecs.h"
#include "tests/der/Bytes.h"

#include <algorithm>
#include <cstddef>
#include <string>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>

namespace {

// Headers in strict DER, for the decoder and the encoder.
constexpr struct {
    const char* identifier;
    DERTag tag;
    const char* lengthOctets;
    std::uint64_t length;
} headers[] = {
    {"05", 0x05, "00", 0},
    {"02", DERTagInteger, "01", 1},
    {"30", DERTagSequence, "7F", 127},
    {"04", DERTagOctetString, "81 80", 128},
    {"1F 1F", 31, "81 FF", 255},
    {"31", DERTagSet, "82 01 00", 256},
    {"A0", DERTagContextConstructed(0), "83 01 00 00", 0x10000},
    {"9E", DERTagContextPrimitive(30), "02", 2},
    {"41", (UINT64_C(1) << 62) + 1, "00", 0},
    {"1F 7F", 127, "03", 3},
    {"1F 81 00", 128, "00", 0},
    {"FF 85 9A C1 82 59", DERTagPrivateConstructed(0x53504159), "02", 2},
    {"DF 9F FF FF FF FF FF FF FF 7F", (UINT64_C(3) << 62) + DERTagNumberMask, "81 80", 128},
    {"FF 9F FF FF FF FF FF FF FF 7F", UINT64_MAX, "88 FF FF FF FF FF FF FF FF", UINT64_MAX},
    {"04", DERTagOctetString, "88 7F FF FF FF FF FF FF FF", INT64_MAX},
    {"04", DERTagOctetString, "88 80 00 00 00 00 00 00 00", UINT64_C(1) << 63},
};

// That the decoders agree on what lies in their input is checked on the seeds of fuzz/derItem.cpp.
TEST(DERItem, isCutOffOnlyAsAPart) {
    for (const auto& row : headers) {
        const std::string octets = std::string(row.identifier) + " " + row.lengthOctets;
        SCOPED_TRACE(octets);
        Bytes input = bytes(octets);
        const std::uint64_t headerLength = input.size(), available = std::min<std::uint64_t>(row.length, 0x10000) / 2;
        input.resize(headerLength + available);
        const DERItem der = itemOf(input);
        DERDecodedInfo part, unclipped;
        std::uint64_t declared = 99;
        EXPECT_EQ(DERDecodeItemPartialBufferGetLength(&der, &part, &declared), DERSuccess);
        EXPECT_EQ(declared, row.length);
        EXPECT_EQ(part.tag, row.tag);
        EXPECT_EQ(part.content.data, input.data() + headerLength);
        EXPECT_EQ(part.content.length, available);
        EXPECT_EQ(DERDecodeItemPartialBuffer(&der, &unclipped, true),
                  row.length > INT64_MAX ? DERBufferOverflow : DERSuccess);
        EXPECT_EQ(unclipped.content.length, row.length);
        EXPECT_EQ(DERDecodeItem(&der, &part), available < row.length ? DERDecodeError : DERSuccess);
    }
}

TEST(DERItem, withAHeaderThatIsNotStrictIsRefused) {
    const std::tuple<const char*, Hex, DERFault, std::ptrdiff_t> rows[] = {
        {"nothing", "", DERFaultHeaderCutShort, 0},
        {"no length", "05", DERFaultHeaderCutShort, 1},
        {"high tag without a digit and length", "1F 1F", DERFaultHeaderCutShort, 2},
        {"high tag cut off in its digits", "1F FF FF", DERFaultHeaderCutShort, 3},
        {"high tag without a length", "1F FF 7F", DERFaultHeaderCutShort, 3},
        {"high tag for a low number", "1F 1E 00", DERFaultTagForm, 1},
        {"high tag with a leading zero digit", "1F 80 01 00", DERFaultTagLeadingZero, 1},
        {"tag number 2^61", "1F A0 80 80 80 80 80 80 80 00 00", DERFaultTagNumber, 9},
        {"tag number 2^63", "1F 81 80 80 80 80 80 80 80 80 00 00", DERFaultTagNumber, 10},
        {"tag number that is 5 in its low 64 bits", "1F 82 80 80 80 80 80 80 80 80 80 05 00", DERFaultTagNumber, 10},
        {"indefinite length", "30 80 00 00", DERFaultLengthIndefinite, 1},
        {"reserved length octet", "04 FF 00 00", DERFaultLengthOctets, 1},
        {"length that fits the short form", "02 81 05 00 00 00 00 00", DERFaultLengthForm, 1},
        {"length 127 in the long form", "02 81 7F", DERFaultLengthForm, 1},
        {"length with a leading zero", "04 82 00 90", DERFaultLengthForm, 1},
        {"nine length octets", "04 89 01 00 00 00 00 00 00 00 81", DERFaultLengthOctets, 1},
        {"one length octet missing", "04 82 01", DERFaultHeaderCutShort, 3},
        {"all length octets missing", "04 81", DERFaultHeaderCutShort, 2},
        {"length octets missing after a high tag", "1F 1F 82 01", DERFaultHeaderCutShort, 4},
    };
    for (const auto& [why, der, fault, place] : rows) {
        SCOPED_TRACE(why);
        DERDecodedInfo decoded;
        DERRefusal refusal;
        EXPECT_EQ(DERDecodeItemExplained(&der.item, &decoded, &refusal), DERDecodeError);
        EXPECT_EQ(refusal.fault, fault);
        EXPECT_EQ(refusal.place - der.item.data, place);
        EXPECT_EQ(DERDecodeItemPartialBuffer(&der.item, &decoded, true), DERDecodeError);
    }
}

// The callback says where the walk ends, and how: unless `stop` is set, at its `calls`th item.
struct Script {
    int calls;
    DERReturn result;
    bool stop;
};

DERReturn play(const DERDecodedInfo*, bool* stop, void* context) {
    auto* script = static_cast<Script*>(context);
    EXPECT_FALSE(*stop);
    *stop = --script->calls == 0 && script->stop;
    return script->calls == 0 ? script->result : DERSuccess;
}

TEST(DERSequence, isWalkedWhenItIsAConstructedSequenceOrSet) {
    const struct {
        Hex der;
        DERReturn code;
        DERTag tag;
        Script script = {};
    } rows[] = {
        {"30 02 05 00 FF", DERSuccess, DERTagSequence, {1, DERSuccess, false}},
        {"31 05 05 00 05 00 05", DERSuccess, DERTagSet, {2, DERSuccess, true}},
        {"31 05 05 00 05 00 05", DERSuccess, DERTagSet, {2, DEREndOfSequence, false}},
        {"30 05 05 00 05 00 05", DERIncompleteSequence, DERTagSequence, {1, DERIncompleteSequence, true}},
        {"10 02 05 00", DERUnexpectedTag, 0x10},
        {"32 02 05 00", DERUnexpectedTag, DERTagSequence + 2},
        {"30 03 05 00", DERDecodeError, 0},
    };
    for (const auto& [der, code, tag, played] : rows) {
        SCOPED_TRACE(der.text);
        Script script = played;
        DERTag found = 0;
        DERSequence sequence{};
        const bool isSequence = tag == DERTagSequence || tag == DERTagSet;
        EXPECT_EQ(DERDecodeSeqInit(&der.item, &found, &sequence), isSequence ? DERSuccess : code);
        EXPECT_EQ(found, tag);
        EXPECT_EQ(sequence.next, isSequence ? der.item.data + 2 : nullptr);
        EXPECT_EQ(sequence.end, isSequence ? der.item.data + 2 + der.item.data[1] : nullptr);
        EXPECT_EQ(DERDecodeSequenceWithBlock(&der.item, play, &script), code);
        EXPECT_EQ(script.calls, 0);
    }
}

TEST(DERPrimitive, integersAreNonNegativeMinimalAndFit) {
    constexpr std::uint64_t asItWas = 77;
    const std::tuple<Hex, DERReturn, std::uint64_t> rows[] = {
        {"00", DERSuccess, 0},
        {"00 80", DERSuccess, 0x80},
        {"00 FF FF FF FF", DERSuccess, UINT32_MAX},
        {"01 00 00 00 00", DERSuccess, UINT64_C(1) << 32},
        {"00 FF FF FF FF FF FF FF FF", DERSuccess, UINT64_MAX},
        {"01 00 00 00 00 00 00 00 00", DERBufferOverflow, asItWas},
        {"00 80 00 00 00 00 00 00 00 00", DERBufferOverflow, asItWas},
        {"", DERDecodeError, asItWas},
        {"80", DERDecodeError, asItWas},
        {"00 00", DERDecodeError, asItWas},
        {"00 7F", DERDecodeError, asItWas},
    };
    for (const auto& [content, code, value] : rows) {
        SCOPED_TRACE(content.text);
        std::uint64_t value64 = asItWas;
        EXPECT_EQ(DERParseInteger64(&content.item, &value64), code);
        EXPECT_EQ(value64, value);
        std::uint32_t value32 = asItWas;
        const bool fits = value <= UINT32_MAX;
        EXPECT_EQ(DERParseInteger(&content.item, &value32), fits ? code : DERBufferOverflow);
        EXPECT_EQ(value32, fits ? value : asItWas);
    }
}

TEST(DERPrimitive, booleansAreOneOctetOfAllBitsAlike) {
    for (const bool before : {false, true}) {
        const std::tuple<Hex, DERReturn, bool> rows[] = {
            {"00", DERSuccess, false},         {"FF", DERSuccess, true},     {"01", DERDecodeError, before},
            {"FF FF", DERDecodeError, before}, {"", DERDecodeError, before},
        };
        for (const auto& [content, code, expected] : rows) {
            SCOPED_TRACE(content.text);
            bool value = before, orDefault = before;
            EXPECT_EQ(DERParseBoolean(&content.item, &value), code);
            EXPECT_EQ(value, expected);
            const bool isEmpty = content.item.length == 0;
            EXPECT_EQ(DERParseBooleanWithDefault(&content.item, !before, &orDefault), isEmpty ? DERSuccess : code);
            EXPECT_EQ(orDefault, isEmpty ? !before : expected);
        }
    }
}

TEST(DERPrimitive, bitStringsKeepTheirUnusedBitsZero) {
    const std::tuple<Hex, DERReturn, const char*, int> rows[] = {
        {"00", DERSuccess, "absent", 0},        {"00 FF", DERSuccess, "FF", 0},
        {"03 F8", DERSuccess, "F8", 3},         {"07 FF 80", DERSuccess, "FF 80", 7},
        {"", DERDecodeError, "absent", 0},      {"01", DERDecodeError, "absent", 1},
        {"03 F9", DERDecodeError, "absent", 3}, {"07 FF C0", DERDecodeError, "absent", 7},
        {"08 00", DERDecodeError, "absent", 8}, {"FF 00", DERDecodeError, "absent", 255},
    };
    for (const auto& [content, code, expectedBits, expectedUnused] : rows) {
        SCOPED_TRACE(content.text);
        DERItem bits = content.item;
        std::uint8_t unused = 99;
        EXPECT_EQ(DERParseBitString(&content.item, &bits, &unused), code);
        EXPECT_EQ(hexOf(bits), expectedBits);
        EXPECT_EQ(unused, expectedUnused);
    }
}

TEST(DERPrimitive, objectIdentifiersAreEqualOnlyWhenBothArePresentAndAlike) {
    const Hex same = "60 86 48", copy = "60 86 48", different = "60 86 49";
    const DERItem oid = same.item, shorter = {oid.data, 2}, empty = {oid.data, 0}, absent = {};
    EXPECT_TRUE(DEROidCompare(&oid, &copy.item));
    EXPECT_TRUE(DEROidCompare(&empty, &empty));
    EXPECT_FALSE(DEROidCompare(&oid, &shorter));
    EXPECT_FALSE(DEROidCompare(&oid, &different.item));
    EXPECT_FALSE(DEROidCompare(&absent, &absent));
    EXPECT_FALSE(DEROidCompare(&empty, &absent));
    EXPECT_FALSE(DEROidCompare(nullptr, &oid));
    EXPECT_FALSE(DEROidCompare(&oid, nullptr));
}

// Records filled from item-spec tables

using Table = std::vector<DERItemSpec>;

constexpr std::uint64_t place(std::uint64_t index) {
    return index * sizeof(DERItem);
}

// A record whose items all view one known octet, so that "untouched" can be told from "absent".
struct Record {
    static constexpr std::uint8_t mark = 0x5A;
    DERItem items[3] = {{&mark, 1}, {&mark, 1}, {&mark, 1}};
};

std::string textOf(const Record& record) {
    std::string text;
    for (const DERItem& item : record.items)
        text += (text.empty() ? "" : " | ") + (item.data == &Record::mark ? "untouched" : hexOf(item));
    return text;
}

const Table plain = {
    {place(0), DERTagInteger, 0},
    {place(1), DERTagContextPrimitive(0), DEROptionOptional},
    {place(2), DERTagOctetString, 0},
};
const Table optionalEnd = {
    {place(0), DERTagInteger, 0},
    {place(1), DERTagBoolean, DEROptionOptional},
    {place(2), DERTagOctetString, DEROptionOptional},
};
const Table anyTag = {
    {place(0), DERTagObjectIdentifier, 0},
    {place(1), 0, DEROptionOptional | DEROptionAnyTag | DEROptionSaveDER},
};
const Table skipping = {
    {UINT64_MAX, DERTagInteger, DEROptionSkip},
    {place(1), DERTagSequence, DEROptionSaveDER},
    {UINT64_MAX, 0, DEROptionSkip | DEROptionAnyTag},
};

TEST(DERRecord, isFilledRowByRow) {
    const struct {
        const char* what;
        const Table& table;
        Hex content;
        DERReturn code;
        const char* record;
        DERFault fault = DERFaultNone;
        std::uint16_t refusedRow = 0;
        std::ptrdiff_t place = 0;
    } rows[] = {
        {"every row matched", plain, "02 01 05 80 01 AA 04 00", DERSuccess, "05 | AA | "},
        {"optional row missing", plain, "02 01 05 04 01 BB", DERSuccess, "05 | absent | BB"},
        {"required row missing at the end", plain, "02 01 05", DERIncompleteSequence, "05 | absent | absent",
         DERFaultMissing, 2, 3},
        {"nothing at all", plain, "", DERIncompleteSequence, "absent | absent | absent", DERFaultMissing, 0, 0},
        {"form differs", plain, "02 01 05 A0 00 04 00", DERUnexpectedTag, "05 | absent | absent", DERFaultTag, 2, 3},
        {"item behind the last row", plain, "02 01 05 04 01 BB 05 00", DERDecodeError, "05 | absent | BB",
         DERFaultExcess, 3, 6},
        {"octet behind the last row", plain, "02 01 05 04 01 BB 05", DERDecodeError, "05 | absent | BB",
         DERFaultHeaderCutShort, 0, 7},
        {"bad item", plain, "02 01 05 80 02 AA", DERDecodeError, "05 | absent | absent", DERFaultContentCutShort, 0, 6},
        {"optional rows missing at the end", optionalEnd, "02 01 05", DERSuccess, "05 | absent | absent"},
        {"last of the optional rows", optionalEnd, "02 01 05 04 01 BB", DERSuccess, "05 | absent | BB"},
        {"no row left that matches", optionalEnd, "02 01 05 05 00", DERUnexpectedTag, "05 | absent | absent",
         DERFaultExcess, 3, 3},
        {"any tag, saved whole", anyTag, "06 01 2A FF 1F 81 80", DERDecodeError, "2A | absent | absent",
         DERFaultContentCutShort, 0, 7},
        {"any tag with a long header", anyTag, "06 01 2A FF 85 9A C1 82 59 01 EE", DERSuccess,
         "2A | FF 85 9A C1 82 59 01 EE | absent"},
        {"skipped rows are consumed", skipping, "02 01 05 30 02 05 00 13 00", DERSuccess,
         "absent | 30 02 05 00 | absent"},
        {"no rows but content", {}, "05 00", DERDecodeError, "absent | absent | absent", DERFaultExcess, 0, 0},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.what);
        const auto& [text, input, content] = row.content;
        const auto count = static_cast<std::uint16_t>(row.table.size());
        Record record;
        DERRefusal refusal = {DERFaultNone, 0, input.data(), nullptr, 0, 0};
        EXPECT_EQ(DERParseSequenceContentExplained(&content, count, row.table.data(), &record, sizeof record,
                                                   sizeof record, &refusal),
                  row.code);
        EXPECT_EQ(refusal.fault, row.fault);
        EXPECT_EQ(refusal.row, row.refusedRow);
        EXPECT_EQ(refusal.place - input.data(), row.place);
        EXPECT_EQ(textOf(record), row.record);
    }
}

TEST(DERRecord, isNeverWrittenBeyondItsSize) {
    const std::tuple<std::uint64_t, std::uint64_t, Hex, DERReturn> rows[] = {
        {0, 16, "02 01 05", DERSuccess},
        {16, 32, "02 01 05", DERSuccess},
        {17, 32, "02 01 05", DERBufferOverflow},
        {0, 15, "02 01 05", DERBufferOverflow},
        {UINT64_MAX - 7, UINT64_MAX, "02 01 05", DERBufferOverflow},
    };
    for (const auto& [offset, destSize, content, code] : rows) {
        const DERItemSpec spec = {offset, DERTagInteger, DEROptionOptional};
        Record record;
        DERRefusal why = {};
        EXPECT_EQ(DERParseSequenceContentExplained(&content.item, 1, &spec, &record, destSize, 0, &why), code)
            << offset << " in " << destSize;
        EXPECT_EQ(why.fault == DERFaultRecord && why.row == 0 && why.expected == DERTagInteger, code != DERSuccess);
        for (std::uint64_t i = 0; i < 3; ++i)
            EXPECT_EQ(record.items[i].data != &Record::mark, code == DERSuccess && offset == place(i));
    }
}

TEST(DERRecord, isLeftAloneUnlessTheItemIsASequenceAndZeroedAsFarAsAsked) {
    const std::tuple<Hex, std::uint64_t, DERReturn, const char*> rows[] = {
        {"30 03 02 01 05 FF FF", sizeof(Record), DERSuccess, "05 | absent | absent"},
        {"30 03 02 01 05", 0, DERSuccess, "05 | untouched | untouched"},
        {"30 01 02", place(1), DERDecodeError, "absent | untouched | untouched"},
        {"31 03 02 01 05", sizeof(Record), DERUnexpectedTag, "untouched | untouched | untouched"},
        {"30 03 02 01", sizeof(Record), DERDecodeError, "untouched | untouched | untouched"},
    };
    for (const auto& [der, sizeToZero, code, text] : rows) {
        Record record;
        EXPECT_EQ(DERParseSequence(&der.item, 3, optionalEnd.data(), &record, sizeToZero), code) << der.text;
        EXPECT_EQ(textOf(record), text) << der.text;
    }
}

// What is written

// Runs `encode(buffer, &length)` on buffers of every size up to one more than that of `expected`: one that is too small
// leaves the length as it was.
template <typename Encode>
void expectEncoding(const std::string& expected, const Encode& encode) {
    const std::uint64_t size = bytes(expected).size();
    for (std::uint64_t i = 0; i <= size + 1; ++i) {
        Bytes buffer(i);
        std::uint64_t length = i;
        ASSERT_EQ(encode(buffer.data(), &length), i < size ? DERBufferOverflow : DERSuccess) << "buffer of " << i;
        ASSERT_EQ(length, i < size ? i : size);
        EXPECT_TRUE(i < size || hexOf(buffer.data(), size) == expected) << hexOf(buffer);
    }
}

TEST(DEREncode, headersAreAsShortAsCanBe) {
    for (const auto& row : headers) {
        SCOPED_TRACE(row.identifier);
        expectEncoding(row.identifier, [&](std::uint8_t* buffer, std::uint64_t* length) {
            return DEREncodeTag(row.tag, buffer, length);
        });
        EXPECT_EQ(DERLengthOfLength(row.length), bytes(row.lengthOctets).size());
        expectEncoding(row.lengthOctets, [&](std::uint8_t* buffer, std::uint64_t* length) {
            return DEREncodeLength(row.length, buffer, length);
        });
        const std::string header = std::string(row.identifier) + " " + row.lengthOctets;
        expectEncoding(header, [&](std::uint8_t* buffer, std::uint64_t* length) {
            return DEREncodeHeaderSized(row.tag, row.length, buffer, *length, length);
        });
        if (row.length > 256)
            continue;
        const Bytes content(row.length, 0x5A);
        const std::string item = header + (content.empty() ? "" : " ") + hexOf(content);
        EXPECT_EQ(DERLengthOfItem(row.tag, row.length), bytes(item).size());
        expectEncoding(item, [&](std::uint8_t* buffer, std::uint64_t* length) {
            return DEREncodeItem(row.tag, row.length, content.data(), buffer, length);
        });
    }
}

struct Row {
    DERTag tag;
    unsigned options;
    const char* content;
};

// A record and its table, made from rows of a test table.
struct Object {
    explicit Object(const std::vector<Row>& rows) {
        for (const Row& row : rows) {
            contents.push_back(bytes(row.content));
            items.push_back(row.content == absent ? DERItem{} : itemOf(contents.back()));
            specs.push_back({(items.size() - 1) * sizeof(DERItem), row.tag, static_cast<std::uint16_t>(row.options)});
        }
    }
    std::uint16_t count() const { return static_cast<std::uint16_t>(specs.size()); }

    static constexpr const char* absent = "";
    std::vector<Bytes> contents;
    std::vector<DERItem> items;
    std::vector<DERItemSpec> specs;
};

TEST(DEREncode, sequencesFollowTheirTable) {
    const struct {
        std::string octets;
        std::vector<Row> rows;
        DERTag tag = DERTagSequence;
    } rows[] = {
        {"31 00", {}, DERTagSet},
        {"30 04 02 02 00 80", {{DERTagInteger, DEROptionSignedInteger, "80"}}},
        {"30 03 02 01 7F", {{DERTagInteger, DEROptionSignedInteger, "7F"}}},
        {"30 02 02 00", {{DERTagInteger, DEROptionSignedInteger, Object::absent}}},
        {"30 03 02 01 80", {{DERTagInteger, 0, "80"}}},
        {"30 03 01 01 FF",
         {{DERTagOctetString, DEROptionOptional, Object::absent}, {DERTagBoolean, DEROptionOptional, "FF"}}},
        {"30 02 04 00", {{DERTagOctetString, 0, Object::absent}}},
        {"30 06 30 03 02 01 05 80",
         {{DERTagBoolean, DEROptionWriteDER, "30 03 02 01 05"},
          {DERTagBoolean, DEROptionWriteDER, Object::absent},
          {DERTagInteger, DEROptionWriteDER | DEROptionSignedInteger, "80"}}},
        // The decoder's options mean nothing here.
        {"30 03 13 01 41", {{0x13, DEROptionAnyTag | DEROptionSkip | DEROptionSaveDER, "41"}}},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.octets);
        const Object object(row.rows);
        EXPECT_EQ(DERLengthOfEncodedSequence(row.tag, object.items.data(), object.count(), object.specs.data()),
                  bytes(row.octets).size());
        expectEncoding(row.octets, [&](std::uint8_t* buffer, std::uint64_t* length) {
            return DEREncodeSequence(row.tag, object.items.data(), object.count(), object.specs.data(), buffer, length);
        });
    }
}

TEST(DEREncode, rowsOutsideTheRecordAreRefused) {
    const DERItem items[5] = {};
    const std::tuple<std::uint64_t, std::uint64_t, DERReturn> rows[] = {
        {0x40, 0x50, DERSuccess},
        {0x40, 0x48, DERBufferOverflow},
        {0, 8, DERBufferOverflow},
        {UINT64_MAX - 15, 0x50, DERBufferOverflow},
        {UINT64_MAX - 7, UINT64_MAX, DERBufferOverflow},
    };
    for (const auto& [offset, objectSize, code] : rows) {
        SCOPED_TRACE(offset);
        const DERItemSpec specs[] = {{0, DERTagOctetString, 0}, {offset, DERTagOctetString, 0}};
        const bool good = code == DERSuccess;
        std::uint64_t size = 7;
        EXPECT_EQ(DERLengthOfSequenceContent(items, objectSize, 2, specs, &size), code);
        EXPECT_EQ(size, good ? 4 : 0);
        std::uint8_t buffer[64];
        std::uint64_t written = 7;
        EXPECT_EQ(DEREncodeSequenceFromObject(DERTagSet, items, objectSize, 2, specs, buffer, sizeof buffer, &written),
                  code);
        EXPECT_EQ(written, good ? 6 : 7);
    }
}

TEST(DEREncode, whatExceeds64BitsHasNoSize) {
    EXPECT_EQ(DERLengthOfItem(DERTagInteger, UINT64_MAX - 10), UINT64_MAX);
    EXPECT_EQ(DERLengthOfItem(DERTagInteger, UINT64_MAX - 9), 0U);
    const std::uint8_t octet = 0x80;
    const struct {
        DERItem items[2];
        unsigned options;
    } rows[] = {
        {{{&octet, UINT64_C(1) << 63}, {&octet, UINT64_C(1) << 63}}, DEROptionWriteDER},
        {{{&octet, 1}, {&octet, UINT64_MAX}}, 0},
        {{{&octet, 1}, {&octet, UINT64_MAX}}, DEROptionSignedInteger},
        {{{&octet, 1}, {&octet, UINT64_MAX - 5}}, DEROptionWriteDER},
    };
    for (const auto& row : rows) {
        const auto options = static_cast<std::uint16_t>(row.options);
        const DERItemSpec specs[] = {{0, DERTagInteger, options}, {sizeof(DERItem), DERTagInteger, options}};
        EXPECT_EQ(DERLengthOfEncodedSequence(DERTagSequence, row.items, 2, specs), 0U);
        std::uint8_t buffer[64];
        std::uint64_t length = sizeof buffer;
        EXPECT_EQ(DEREncodeSequence(DERTagSequence, row.items, 2, specs, buffer, &length), DERBufferOverflow);
        EXPECT_EQ(length, sizeof buffer);
    }
}

// A number whose highest bit is set gets its zero octet again.
TEST(DERItemSpecs, writeAKeyAsItWasRead) {
    const Hex modulus = "80", exponent = "83";
    const DERRSAPubKeyPKCS1 key = {modulus.item, exponent.item};
    expectEncoding("30 08 02 02 00 80 02 02 00 83", [&](std::uint8_t* buffer, std::uint64_t* length) {
        return DEREncodeSequence(DERTagSequence, &key, DERNumRSAPubKeyPKCS1ItemSpecs, DERRSAPubKeyPKCS1ItemSpecs,
                                 buffer, length);
    });
}

} // namespace
