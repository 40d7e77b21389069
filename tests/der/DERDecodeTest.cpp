#include "der/DERDecode.h"

#include <algorithm>
#include <cstddef>
#include <string>

#include <gtest/gtest.h>

#include "tests/der/Bytes.h"
#include "tests/der/Headers.h"

namespace {

TEST(DERItem, isDecodedAlikeByAllThreeDecodersAndCutOffOnlyAsAPart) {
    for (const auto& row : headers) {
        const std::string octets = std::string(row.identifier) + " " + row.lengthOctets;
        const Bytes header = bytes(octets);
        const std::uint64_t most = std::min<std::uint64_t>(row.length, 0x10000);
        for (const std::uint64_t available : {most / 2, most, most + 3}) {
            SCOPED_TRACE(octets + " and " + std::to_string(available) + " octets");
            Bytes input(header.size() + available, 0x1F);
            std::copy(header.begin(), header.end(), input.begin());
            const DERItem der = itemOf(input);
            const DERReturn whole = available < row.length ? DERDecodeError : DERSuccess;
            DERDecodedInfo decoded{};
            const auto expect = [&](DERReturn result, DERReturn expected, std::uint64_t length) {
                EXPECT_EQ(result, expected);
                if (expected == DERDecodeError)
                    return;
                EXPECT_EQ(decoded.tag, row.tag);
                EXPECT_EQ(decoded.content.data, input.data() + header.size());
                EXPECT_EQ(decoded.content.length, length);
                decoded = {};
            };
            expect(DERDecodeItem(&der, &decoded), whole, row.length);
            expect(DERDecodeItemPartialBufferGetLength(&der, &decoded, nullptr), whole, row.length);
            expect(DERDecodeItemPartialBuffer(&der, &decoded, false), whole, row.length);
            std::uint64_t declared = 99;
            expect(DERDecodeItemPartialBufferGetLength(&der, &decoded, &declared), DERSuccess,
                   std::min(row.length, available));
            EXPECT_EQ(declared, row.length);
            expect(DERDecodeItemPartialBuffer(&der, &decoded, true),
                   row.length > INT64_MAX ? DERBufferOverflow : DERSuccess, row.length);
        }
    }
}

TEST(DERItem, withAHeaderThatIsNotStrictIsRefusedByAllThreeDecoders) {
    const struct {
        const char* why;
        const char* octets;
        DERFault fault;
        std::ptrdiff_t place;
    } rows[] = {
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
    for (const auto& row : rows) {
        SCOPED_TRACE(row.why);
        const Bytes input = bytes(row.octets);
        const DERItem der = itemOf(input);
        DERDecodedInfo decoded;
        DERRefusal refusal;
        std::uint64_t declared = 0;
        EXPECT_EQ(DERDecodeItemExplained(&der, &decoded, &refusal), DERDecodeError);
        EXPECT_EQ(refusal.fault, row.fault);
        EXPECT_EQ(refusal.place - input.data(), row.place);
        EXPECT_EQ(DERDecodeItemPartialBufferGetLength(&der, &decoded, nullptr), DERDecodeError);
        EXPECT_EQ(DERDecodeItemPartialBufferGetLength(&der, &decoded, &declared), DERDecodeError);
        EXPECT_EQ(DERDecodeItemPartialBuffer(&der, &decoded, false), DERDecodeError);
        EXPECT_EQ(DERDecodeItemPartialBuffer(&der, &decoded, true), DERDecodeError);
    }
}

TEST(DERItem, mayBeDecodedOntoTheItemItComesFrom) {
    const Bytes input = bytes("30 04 A0 02 05 00");
    DERDecodedInfo decoded = {0, itemOf(input)};
    EXPECT_EQ(DERDecodeItem(&decoded.content, &decoded), DERSuccess);
    std::uint64_t declared = 0;
    EXPECT_EQ(DERDecodeItemPartialBufferGetLength(&decoded.content, &decoded, &declared), DERSuccess);
    EXPECT_EQ(hexOf(decoded.content), "05 00");
}

DERReturn countItem(const DERDecodedInfo*, bool*, void* context) {
    ++*static_cast<int*>(context);
    return DERSuccess;
}

TEST(DERSequence, isWalkedWhenItIsAConstructedSequenceOrSet) {
    const struct {
        const char* der;
        DERReturn code;
        DERTag tag;
    } rows[] = {
        {"30 02 05 00 FF", DERSuccess, DERTagSequence},
        {"31 02 05 00", DERSuccess, DERTagSet},
        {"10 02 05 00", DERUnexpectedTag, 0x10},
        {"32 02 05 00", DERUnexpectedTag, DERTagSequence + 2},
        {"B0 02 05 00", DERUnexpectedTag, DERTagContextConstructed(0x10)},
        {"30 03 05 00", DERDecodeError, 0},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.der);
        const Bytes input = bytes(row.der);
        const DERItem der = itemOf(input);
        DERTag tag = 0;
        DERSequence sequence{};
        EXPECT_EQ(DERDecodeSeqInit(&der, &tag, &sequence), row.code);
        EXPECT_EQ(tag, row.tag);
        EXPECT_EQ(sequence.next, row.code == DERSuccess ? input.data() + 2 : nullptr);
        EXPECT_EQ(sequence.end, row.code == DERSuccess ? input.data() + 4 : nullptr);
        int calls = 0;
        EXPECT_EQ(DERDecodeSequenceWithBlock(&der, countItem, &calls), row.code);
        EXPECT_EQ(calls, row.code == DERSuccess ? 1 : 0);
    }
}

TEST(DERSequence, walkStopsAtTheEndOrBeforeTheItemThatIsBad) {
    const struct {
        const char* content;
        int items;
        std::uint64_t consumed;
        DERReturn end;
    } rows[] = {
        {"", 0, 0, DEREndOfSequence},
        {"02 01 05 30 03 04 01 FF FF 1F 00", 3, 11, DEREndOfSequence},
        {"02 01 05 04", 1, 3, DERDecodeError},
        {"02 01 05 04 02 AA", 1, 3, DERDecodeError},
        {"05 00 1F 1E 00", 1, 2, DERDecodeError},
        {"04 81 80", 0, 0, DERDecodeError},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.content);
        // The octet behind the content would complete the cut-off item: it must not be looked at.
        Bytes input = bytes(row.content);
        const std::uint64_t length = input.size();
        input.resize(length + 200);
        const DERItem content = {input.data(), length};
        DERSequence sequence{};
        ASSERT_EQ(DERDecodeSeqContentInit(&content, &sequence), DERSuccess);
        DERDecodedInfo decoded;
        int items = 0;
        while (DERDecodeSeqNext(&sequence, &decoded) == DERSuccess)
            ++items;
        EXPECT_EQ(DERDecodeSeqNext(&sequence, &decoded), row.end);
        EXPECT_EQ(items, row.items);
        EXPECT_EQ(sequence.next, input.data() + row.consumed);
        int calls = 0;
        EXPECT_EQ(DERDecodeSequenceContentWithBlock(&content, countItem, &calls),
                  row.end == DEREndOfSequence ? DERSuccess : row.end);
        EXPECT_EQ(calls, row.items);
    }
}

TEST(DERSequence, callbackDecidesWhenTheWalkEndsAndHow) {
    struct Script {
        int calls;
        DERReturn result;
        bool stop;
    };
    const struct {
        Script script;
        DERReturn code;
    } rows[] = {
        {{2, DERSuccess, true}, DERSuccess},
        {{2, DEREndOfSequence, false}, DERSuccess},
        {{2, DERUnexpectedTag, false}, DERUnexpectedTag},
        {{1, DERDecodeError, true}, DERDecodeError},
    };
    const auto callback = [](const DERDecodedInfo*, bool* stop, void* context) {
        auto* script = static_cast<Script*>(context);
        EXPECT_FALSE(*stop);
        *stop = --script->calls == 0 && script->stop;
        return script->calls == 0 ? script->result : DERSuccess;
    };
    const Bytes input = bytes("05 00 05 00 05");
    const DERItem content = itemOf(input);
    for (const auto& row : rows) {
        Script script = row.script;
        EXPECT_EQ(DERDecodeSequenceContentWithBlock(&content, callback, &script), row.code) << &row - rows;
        EXPECT_EQ(script.calls, 0) << &row - rows;
    }
}

TEST(DERPrimitive, integersAreNonNegativeMinimalAndFit) {
    const struct {
        const char* content;
        DERReturn code;
        std::uint64_t value = 77; // as it was
    } rows[] = {
        {"00", DERSuccess, 0},
        {"7F", DERSuccess, 0x7F},
        {"00 80", DERSuccess, 0x80},
        {"01 02 03", DERSuccess, 0x010203},
        {"00 FF FF FF FF", DERSuccess, UINT32_MAX},
        {"01 00 00 00 00", DERSuccess, UINT64_C(1) << 32},
        {"7F FF FF FF FF FF FF FF", DERSuccess, INT64_MAX},
        {"00 80 00 00 00 00 00 00 00", DERSuccess, UINT64_C(1) << 63},
        {"00 FF FF FF FF FF FF FF FF", DERSuccess, UINT64_MAX},
        {"01 00 00 00 00 00 00 00 00", DERBufferOverflow},
        {"00 80 00 00 00 00 00 00 00 00", DERBufferOverflow},
        {"", DERDecodeError},
        {"80", DERDecodeError},
        {"FF FF FF FF FF FF FF FF FF", DERDecodeError},
        {"00 00", DERDecodeError},
        {"00 7F", DERDecodeError},
        {"00 7F 00 00 00 00 00 00 00 00", DERDecodeError},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.content);
        const Bytes input = bytes(row.content);
        const DERItem content = itemOf(input);
        std::uint64_t value64 = 77;
        EXPECT_EQ(DERParseInteger64(&content, &value64), row.code);
        EXPECT_EQ(value64, row.value);
        std::uint32_t value32 = 77;
        const bool fits = row.value <= UINT32_MAX;
        EXPECT_EQ(DERParseInteger(&content, &value32), fits ? row.code : DERBufferOverflow);
        EXPECT_EQ(value32, fits ? row.value : 77);
    }
}

TEST(DERPrimitive, booleansAreOneOctetOfAllBitsAlike) {
    const struct {
        const char* content;
        DERReturn code;
        bool value;
    } rows[] = {
        {"00", DERSuccess, false},        {"FF", DERSuccess, true},    {"01", DERDecodeError, false},
        {"FF FF", DERDecodeError, false}, {"", DERDecodeError, false},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.content);
        const Bytes input = bytes(row.content);
        const DERItem content = itemOf(input);
        bool value = !row.value;
        EXPECT_EQ(DERParseBoolean(&content, &value), row.code);
        EXPECT_EQ(value, row.code == DERSuccess ? row.value : !row.value);
        for (const bool fallback : {false, true}) {
            const bool usesFallback = input.empty();
            value = !fallback;
            EXPECT_EQ(DERParseBooleanWithDefault(&content, fallback, &value), usesFallback ? DERSuccess : row.code);
            if (usesFallback || row.code == DERSuccess) {
                EXPECT_EQ(value, usesFallback ? fallback : row.value);
            }
        }
    }
}

TEST(DERPrimitive, bitStringsKeepTheirUnusedBitsZero) {
    const struct {
        const char* content;
        DERReturn code;
        const char* bits;
        int unused;
    } rows[] = {
        {"00", DERSuccess, "absent", 0},         {"00 FF", DERSuccess, "FF", 0},
        {"03 F8", DERSuccess, "F8", 3},          {"07 FF 80", DERSuccess, "FF 80", 7},
        {"", DERDecodeError, "absent", 0},       {"01", DERDecodeError, "absent", -1},
        {"03 F9", DERDecodeError, "absent", -1}, {"07 FF C0", DERDecodeError, "absent", -1},
        {"08 00", DERDecodeError, "absent", -1}, {"FF 00", DERDecodeError, "absent", -1},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.content);
        const Bytes input = bytes(row.content);
        const DERItem content = itemOf(input);
        DERItem bits = content;
        std::uint8_t unused = 99;
        EXPECT_EQ(DERParseBitString(&content, &bits, &unused), row.code);
        EXPECT_EQ(hexOf(bits), row.bits);
        if (row.unused >= 0) {
            EXPECT_EQ(unused, row.unused);
        }
    }
}

TEST(DERPrimitive, objectIdentifiersAreEqualOnlyWhenBothArePresentAndAlike) {
    const Bytes octets = bytes("60 86 48 01 65 03 04 02 01");
    const Bytes copy = bytes("60 86 48 01 65 03 04 02 01");
    const Bytes otherOctets = bytes("60 86 48 01 65 03 04 02 02");
    const DERItem oid = itemOf(octets), same = itemOf(copy), different = itemOf(otherOctets);
    const DERItem shorter = {octets.data(), octets.size() - 1}, empty = {octets.data(), 0}, absent = {};
    EXPECT_TRUE(DEROidCompare(&oid, &same));
    EXPECT_TRUE(DEROidCompare(&empty, &empty));
    EXPECT_FALSE(DEROidCompare(&oid, &shorter));
    EXPECT_FALSE(DEROidCompare(&oid, &different));
    EXPECT_FALSE(DEROidCompare(&absent, &absent));
    EXPECT_FALSE(DEROidCompare(&empty, &absent));
    EXPECT_FALSE(DEROidCompare(nullptr, &oid));
    EXPECT_FALSE(DEROidCompare(&oid, nullptr));
}

} // namespace
