// Records filled from item-spec tables.
#include <string>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>

#include "der/DERDecode.h"
#include "tests/der/Bytes.h"

namespace {

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
const Table encoderOptions = {{place(1), DERTagInteger, DEROptionSignedInteger | DEROptionWriteDER}};

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
        {"required row missing though a later one matches", plain, "04 01 BB", DERUnexpectedTag,
         "absent | absent | absent", DERFaultTag, 0, 0},
        {"form differs", plain, "02 01 05 A0 00 04 00", DERUnexpectedTag, "05 | absent | absent", DERFaultTag, 2, 3},
        {"class differs", plain, "82 01 05", DERUnexpectedTag, "absent | absent | absent", DERFaultTag, 0, 0},
        {"item twice", plain, "02 01 05 80 00 80 00", DERUnexpectedTag, "05 |  | absent", DERFaultTag, 2, 5},
        {"item behind the last row", plain, "02 01 05 04 01 BB 05 00", DERDecodeError, "05 | absent | BB",
         DERFaultExcess, 3, 6},
        {"octet behind the last row", plain, "02 01 05 04 01 BB 05", DERDecodeError, "05 | absent | BB",
         DERFaultHeaderCutShort, 0, 7},
        {"bad item", plain, "02 01 05 80 02 AA", DERDecodeError, "05 | absent | absent", DERFaultContentCutShort, 0, 6},
        {"optional rows missing at the end", optionalEnd, "02 01 05", DERSuccess, "05 | absent | absent"},
        {"last of the optional rows", optionalEnd, "02 01 05 04 01 BB", DERSuccess, "05 | absent | BB"},
        {"optional rows out of order", optionalEnd, "02 01 05 04 00 01 00", DERDecodeError, "05 | absent | ",
         DERFaultExcess, 3, 5},
        {"no row left that matches", optionalEnd, "02 01 05 05 00", DERUnexpectedTag, "05 | absent | absent",
         DERFaultExcess, 3, 3},
        {"any tag, saved whole", anyTag, "06 01 2A FF 1F 81 80", DERDecodeError, "2A | absent | absent",
         DERFaultContentCutShort, 0, 7},
        {"any tag with a long header", anyTag, "06 01 2A FF 85 9A C1 82 59 01 EE", DERSuccess,
         "2A | FF 85 9A C1 82 59 01 EE | absent"},
        {"any tag missing", anyTag, "06 01 2A", DERSuccess, "2A | absent | absent"},
        {"skipped rows are consumed", skipping, "02 01 05 30 02 05 00 13 00", DERSuccess,
         "absent | 30 02 05 00 | absent"},
        {"skipped row missing", skipping, "30 00", DERUnexpectedTag, "absent | absent | absent", DERFaultTag, 0, 0},
        {"octets behind a skipped last row", skipping, "02 01 05 30 00 13 00 13 00", DERDecodeError,
         "absent | 30 00 | absent", DERFaultExcess, 3, 7},
        {"options of the encoder", encoderOptions, "02 02 00 80", DERSuccess, "absent | 00 80 | absent"},
        {"no rows, no content", {}, "", DERSuccess, "absent | absent | absent"},
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
        {UINT64_MAX - 15, 48, "02 01 05", DERBufferOverflow},
        {UINT64_MAX - 7, UINT64_MAX, "02 01 05", DERBufferOverflow},
        {UINT64_MAX, 0, "", DERSuccess},
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
        {"30 03 02 01 05", place(2), DERSuccess, "05 | absent | untouched"},
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

} // namespace
