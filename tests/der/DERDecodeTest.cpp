#include "der/DERDecode.h"

#include <algorithm>
#include <cstddef>
#include <string>
#include <tuple>
#include <utility>

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
        std::uint64_t declared = 0;
        EXPECT_EQ(DERDecodeItemExplained(&der.item, &decoded, &refusal), DERDecodeError);
        EXPECT_EQ(refusal.fault, fault);
        EXPECT_EQ(refusal.place - der.item.data, place);
        EXPECT_EQ(DERDecodeItemPartialBufferGetLength(&der.item, &decoded, nullptr), DERDecodeError);
        EXPECT_EQ(DERDecodeItemPartialBufferGetLength(&der.item, &decoded, &declared), DERDecodeError);
        EXPECT_EQ(DERDecodeItemPartialBuffer(&der.item, &decoded, false), DERDecodeError);
        EXPECT_EQ(DERDecodeItemPartialBuffer(&der.item, &decoded, true), DERDecodeError);
    }
}

TEST(DERItem, mayBeDecodedOntoTheItemItComesFrom) {
    const Hex input = "30 04 A0 02 05 00";
    DERDecodedInfo decoded = {0, input.item};
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
    const std::tuple<Hex, DERReturn, DERTag> rows[] = {
        {"30 02 05 00 FF", DERSuccess, DERTagSequence},
        {"31 02 05 00", DERSuccess, DERTagSet},
        {"10 02 05 00", DERUnexpectedTag, 0x10},
        {"32 02 05 00", DERUnexpectedTag, DERTagSequence + 2},
        {"B0 02 05 00", DERUnexpectedTag, DERTagContextConstructed(0x10)},
        {"30 03 05 00", DERDecodeError, 0},
    };
    for (const auto& [der, code, tag] : rows) {
        SCOPED_TRACE(der.text);
        DERTag found = 0;
        DERSequence sequence{};
        EXPECT_EQ(DERDecodeSeqInit(&der.item, &found, &sequence), code);
        EXPECT_EQ(found, tag);
        EXPECT_EQ(sequence.next, code == DERSuccess ? der.item.data + 2 : nullptr);
        EXPECT_EQ(sequence.end, code == DERSuccess ? der.item.data + 4 : nullptr);
        int calls = 0;
        EXPECT_EQ(DERDecodeSequenceWithBlock(&der.item, countItem, &calls), code);
        EXPECT_EQ(calls, code == DERSuccess ? 1 : 0);
    }
}

TEST(DERSequence, walkStopsAtTheEndOrBeforeTheItemThatIsBad) {
    const std::tuple<const char*, int, std::uint64_t, DERReturn> rows[] = {
        {"", 0, 0, DEREndOfSequence},
        {"02 01 05 30 03 04 01 FF FF 1F 00", 3, 11, DEREndOfSequence},
        {"02 01 05 04", 1, 3, DERDecodeError},
        {"02 01 05 04 02 AA", 1, 3, DERDecodeError},
        {"05 00 1F 1E 00", 1, 2, DERDecodeError},
        {"04 81 80", 0, 0, DERDecodeError},
    };
    for (const auto& [octets, expectedItems, consumed, end] : rows) {
        SCOPED_TRACE(octets);
        // The octet behind the content would complete the cut-off item: it must not be looked at.
        Bytes input = bytes(octets);
        const std::uint64_t length = input.size();
        input.resize(length + 200);
        const DERItem content = {input.data(), length};
        DERSequence sequence{};
        ASSERT_EQ(DERDecodeSeqContentInit(&content, &sequence), DERSuccess);
        DERDecodedInfo decoded;
        int items = 0;
        while (DERDecodeSeqNext(&sequence, &decoded) == DERSuccess)
            ++items;
        EXPECT_EQ(DERDecodeSeqNext(&sequence, &decoded), end);
        EXPECT_EQ(items, expectedItems);
        EXPECT_EQ(sequence.next, input.data() + consumed);
        int calls = 0;
        EXPECT_EQ(DERDecodeSequenceContentWithBlock(&content, countItem, &calls),
                  end == DEREndOfSequence ? DERSuccess : end);
        EXPECT_EQ(calls, expectedItems);
    }
}

TEST(DERSequence, callbackDecidesWhenTheWalkEndsAndHow) {
    struct Script {
        int calls;
        DERReturn result;
        bool stop;
    };
    const std::pair<Script, DERReturn> rows[] = {
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
    const Hex content = "05 00 05 00 05";
    for (auto [script, code] : rows) {
        EXPECT_EQ(DERDecodeSequenceContentWithBlock(&content.item, callback, &script), code);
        EXPECT_EQ(script.calls, 0);
    }
}

TEST(DERPrimitive, integersAreNonNegativeMinimalAndFit) {
    constexpr std::uint64_t asItWas = 77;
    const std::tuple<Hex, DERReturn, std::uint64_t> rows[] = {
        {"00", DERSuccess, 0},
        {"7F", DERSuccess, 0x7F},
        {"00 80", DERSuccess, 0x80},
        {"01 02 03", DERSuccess, 0x010203},
        {"00 FF FF FF FF", DERSuccess, UINT32_MAX},
        {"01 00 00 00 00", DERSuccess, UINT64_C(1) << 32},
        {"7F FF FF FF FF FF FF FF", DERSuccess, INT64_MAX},
        {"00 80 00 00 00 00 00 00 00", DERSuccess, UINT64_C(1) << 63},
        {"00 FF FF FF FF FF FF FF FF", DERSuccess, UINT64_MAX},
        {"01 00 00 00 00 00 00 00 00", DERBufferOverflow, asItWas},
        {"00 80 00 00 00 00 00 00 00 00", DERBufferOverflow, asItWas},
        {"", DERDecodeError, asItWas},
        {"80", DERDecodeError, asItWas},
        {"FF FF FF FF FF FF FF FF FF", DERDecodeError, asItWas},
        {"00 00", DERDecodeError, asItWas},
        {"00 7F", DERDecodeError, asItWas},
        {"00 7F 00 00 00 00 00 00 00 00", DERDecodeError, asItWas},
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
    const std::tuple<Hex, DERReturn, bool> rows[] = {
        {"00", DERSuccess, false},        {"FF", DERSuccess, true},    {"01", DERDecodeError, false},
        {"FF FF", DERDecodeError, false}, {"", DERDecodeError, false},
    };
    for (const auto& [content, code, expected] : rows) {
        SCOPED_TRACE(content.text);
        bool value = !expected;
        EXPECT_EQ(DERParseBoolean(&content.item, &value), code);
        EXPECT_EQ(value, code == DERSuccess ? expected : !expected);
        for (const bool fallback : {false, true}) {
            const bool usesFallback = content.item.length == 0;
            value = !fallback;
            EXPECT_EQ(DERParseBooleanWithDefault(&content.item, fallback, &value), usesFallback ? DERSuccess : code);
            if (usesFallback || code == DERSuccess) {
                EXPECT_EQ(value, usesFallback ? fallback : expected);
            }
        }
    }
}

TEST(DERPrimitive, bitStringsKeepTheirUnusedBitsZero) {
    const std::tuple<Hex, DERReturn, const char*, int> rows[] = {
        {"00", DERSuccess, "absent", 0},         {"00 FF", DERSuccess, "FF", 0},
        {"03 F8", DERSuccess, "F8", 3},          {"07 FF 80", DERSuccess, "FF 80", 7},
        {"", DERDecodeError, "absent", 0},       {"01", DERDecodeError, "absent", -1},
        {"03 F9", DERDecodeError, "absent", -1}, {"07 FF C0", DERDecodeError, "absent", -1},
        {"08 00", DERDecodeError, "absent", -1}, {"FF 00", DERDecodeError, "absent", -1},
    };
    for (const auto& [content, code, expectedBits, expectedUnused] : rows) {
        SCOPED_TRACE(content.text);
        DERItem bits = content.item;
        std::uint8_t unused = 99;
        EXPECT_EQ(DERParseBitString(&content.item, &bits, &unused), code);
        EXPECT_EQ(hexOf(bits), expectedBits);
        if (expectedUnused >= 0) {
            EXPECT_EQ(unused, expectedUnused);
        }
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

} // namespace
