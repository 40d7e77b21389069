#include "der/DERDecode.h"

#include <string>

#include <gtest/gtest.h>

#include "tests/der/Bytes.h"

namespace {

constexpr DERTag application = UINT64_C(1) << 62;
constexpr DERTag privatePrimitive = UINT64_C(3) << 62;

TEST(DERItem, isDecodedAlikeByAllThreeDecoders) {
    const struct {
        const char* header;
        std::uint64_t length;
        DERTag tag;
    } rows[] = {
        {"05 00", 0, 0x05},
        {"02 01", 1, DERTagInteger},
        {"30 7F", 127, DERTagSequence},
        {"04 81 80", 128, DERTagOctetString},
        {"04 81 FF", 255, DERTagOctetString},
        {"31 82 01 00", 256, DERTagSet},
        {"04 83 01 00 00", 0x10000, DERTagOctetString},
        {"9E 00", 0, DERTagContextPrimitive(30)},
        {"A0 02", 2, DERTagContextConstructed(0)},
        {"41 00", 0, application + 1},
        {"1F 1F 00", 0, 31},
        {"1F 7F 03", 3, 127},
        {"1F 81 00 00", 0, 128},
        {"FF 85 9A C1 82 59 02", 2, DERTagPrivateConstructed(0x53504159)},
        {"DF 9F FF FF FF FF FF FF FF 7F 81 80", 128, privatePrimitive + DERTagNumberMask},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.header);
        Bytes input = bytes(row.header);
        const std::uint64_t header = input.size();
        const Bytes after(row.length + 3, 0x1F);
        input.insert(input.end(), after.begin(), after.end());
        const DERItem der = itemOf(input);
        const auto expectDecoded = [&](DERReturn result, const DERDecodedInfo& decoded) {
            EXPECT_EQ(result, DERSuccess);
            EXPECT_EQ(decoded.tag, row.tag);
            EXPECT_EQ(decoded.content.data, input.data() + header);
            EXPECT_EQ(decoded.content.length, row.length);
        };
        DERDecodedInfo decoded{};
        std::uint64_t declared = 99;
        expectDecoded(DERDecodeItem(&der, &decoded), decoded);
        decoded = {};
        expectDecoded(DERDecodeItemPartialBufferGetLength(&der, &decoded, nullptr), decoded);
        decoded = {};
        expectDecoded(DERDecodeItemPartialBufferGetLength(&der, &decoded, &declared), decoded);
        EXPECT_EQ(declared, row.length);
        decoded = {};
        expectDecoded(DERDecodeItemPartialBuffer(&der, &decoded, false), decoded);
        decoded = {};
        expectDecoded(DERDecodeItemPartialBuffer(&der, &decoded, true), decoded);
    }
}

TEST(DERItem, withAHeaderThatIsNotStrictIsRefusedByAllThreeDecoders) {
    const struct {
        const char* why;
        const char* der;
    } rows[] = {
        {"nothing", ""},
        {"no length", "05"},
        {"high tag without a digit and length", "1F 1F"},
        {"high tag cut off in its digits", "1F FF FF"},
        {"high tag without a length", "1F FF 7F"},
        {"high tag for a low number", "1F 1E 00"},
        {"high tag with a leading zero digit", "1F 80 01 00"},
        {"tag number 2^61", "1F A0 80 80 80 80 80 80 80 00 00"},
        {"tag number 2^63", "1F 81 80 80 80 80 80 80 80 80 00 00"},
        {"tag number that is 5 in its low 64 bits", "1F 82 80 80 80 80 80 80 80 80 80 05 00"},
        {"indefinite length", "30 80 00 00"},
        {"reserved length octet", "04 FF 00 00"},
        {"length that fits the short form", "02 81 05 00 00 00 00 00"},
        {"length 127 in the long form", "02 81 7F"},
        {"length with a leading zero", "04 82 00 90"},
        {"nine length octets", "04 89 01 00 00 00 00 00 00 00 81"},
        {"one length octet missing", "04 82 01"},
        {"all length octets missing", "04 81"},
        {"length octets missing after a high tag", "1F 1F 82 01"},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.why);
        const Bytes input = bytes(row.der);
        const DERItem der = itemOf(input);
        DERDecodedInfo decoded;
        std::uint64_t declared = 0;
        EXPECT_EQ(DERDecodeItem(&der, &decoded), DERDecodeError);
        EXPECT_EQ(DERDecodeItemPartialBufferGetLength(&der, &decoded, nullptr), DERDecodeError);
        EXPECT_EQ(DERDecodeItemPartialBufferGetLength(&der, &decoded, &declared), DERDecodeError);
        EXPECT_EQ(DERDecodeItemPartialBuffer(&der, &decoded, false), DERDecodeError);
        EXPECT_EQ(DERDecodeItemPartialBuffer(&der, &decoded, true), DERDecodeError);
    }
}

TEST(DERItem, whoseContentIsCutOffIsOnlyAcceptedAsAPart) {
    const struct {
        const char* der;
        std::uint64_t declared;
        std::uint64_t available;
        DERReturn unclipped;
    } rows[] = {
        {"04 01", 1, 0, DERSuccess},
        {"04 05 AA BB", 5, 2, DERSuccess},
        {"04 81 80 AA", 128, 1, DERSuccess},
        {"1F 1F 03 AA BB", 3, 2, DERSuccess},
        {"04 88 7F FF FF FF FF FF FF FF AA", INT64_MAX, 1, DERSuccess},
        {"04 88 80 00 00 00 00 00 00 00 AA", UINT64_C(1) << 63, 1, DERBufferOverflow},
        {"04 88 FF FF FF FF FF FF FF FF AA", UINT64_MAX, 1, DERBufferOverflow},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.der);
        const Bytes input = bytes(row.der);
        const DERItem der = itemOf(input);
        DERDecodedInfo decoded{};
        EXPECT_EQ(DERDecodeItem(&der, &decoded), DERDecodeError);
        EXPECT_EQ(DERDecodeItemPartialBufferGetLength(&der, &decoded, nullptr), DERDecodeError);
        EXPECT_EQ(DERDecodeItemPartialBuffer(&der, &decoded, false), DERDecodeError);

        std::uint64_t declared = 0;
        ASSERT_EQ(DERDecodeItemPartialBufferGetLength(&der, &decoded, &declared), DERSuccess);
        EXPECT_EQ(declared, row.declared);
        EXPECT_EQ(decoded.content.length, row.available);
        EXPECT_EQ(decoded.content.data, input.data() + input.size() - row.available);

        ASSERT_EQ(DERDecodeItemPartialBuffer(&der, &decoded, true), row.unclipped);
        EXPECT_EQ(decoded.content.length, row.declared);
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
        ASSERT_EQ(DERDecodeSeqInit(&der, &tag, &sequence), row.code);
        EXPECT_EQ(tag, row.tag);
        int calls = 0;
        const auto count = [](const DERDecodedInfo*, bool*, void* context) {
            ++*static_cast<int*>(context);
            return DERSuccess;
        };
        EXPECT_EQ(DERDecodeSequenceWithBlock(&der, count, &calls), row.code);
        EXPECT_EQ(calls, row.code == DERSuccess ? 1 : 0);
        if (row.code != DERSuccess)
            continue;
        EXPECT_EQ(sequence.next, input.data() + 2);
        EXPECT_EQ(sequence.end, input.data() + 4);
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
        DERReturn result = DERDecodeSeqNext(&sequence, &decoded);
        for (; result == DERSuccess; result = DERDecodeSeqNext(&sequence, &decoded))
            ++items;
        EXPECT_EQ(result, row.end);
        EXPECT_EQ(items, row.items);
        EXPECT_EQ(sequence.next, input.data() + row.consumed);
        EXPECT_EQ(DERDecodeSeqNext(&sequence, &decoded), row.end);
    }
}

TEST(DERSequence, callbackDecidesWhenTheWalkEndsAndHow) {
    struct Script {
        int calls;
        int actAt;
        DERReturn result;
        bool stop;
    };
    const struct {
        const char* content;
        Script script;
        DERReturn code;
        int calls;
    } rows[] = {
        {"", {}, DERSuccess, 0},
        {"05 00 02 01 01 05 00", {}, DERSuccess, 3},
        {"05 00 02 01 01 05", {}, DERDecodeError, 2},
        {"05 00 05 00 05 00", {0, 2, DERSuccess, true}, DERSuccess, 2},
        {"05 00 05 00 05 00", {0, 2, DEREndOfSequence, false}, DERSuccess, 2},
        {"05 00 05 00 05 00", {0, 2, DERUnexpectedTag, false}, DERUnexpectedTag, 2},
        {"05 00 05 00 05 00", {0, 1, DERDecodeError, true}, DERDecodeError, 1},
        {"05 00 05", {0, 1, DEREndOfSequence, false}, DERSuccess, 1},
    };
    const auto callback = [](const DERDecodedInfo*, bool* stop, void* context) {
        auto* script = static_cast<Script*>(context);
        EXPECT_FALSE(*stop);
        if (++script->calls != script->actAt)
            return DERSuccess;
        *stop = script->stop;
        return script->result;
    };
    for (const auto& row : rows) {
        const Bytes input = bytes(row.content);
        const DERItem content = itemOf(input);
        Script script = row.script;
        EXPECT_EQ(DERDecodeSequenceContentWithBlock(&content, callback, &script), row.code) << row.content;
        EXPECT_EQ(script.calls, row.calls) << row.content;
    }
}

TEST(DERPrimitive, integersAreNonNegativeMinimalAndFit) {
    const struct {
        const char* content;
        DERReturn code64;
        std::uint64_t value;
        DERReturn code32;
    } rows[] = {
        {"00", DERSuccess, 0, DERSuccess},
        {"7F", DERSuccess, 0x7F, DERSuccess},
        {"00 80", DERSuccess, 0x80, DERSuccess},
        {"01 02 03", DERSuccess, 0x010203, DERSuccess},
        {"00 FF FF FF FF", DERSuccess, UINT32_MAX, DERSuccess},
        {"01 00 00 00 00", DERSuccess, UINT64_C(1) << 32, DERBufferOverflow},
        {"7F FF FF FF FF FF FF FF", DERSuccess, INT64_MAX, DERBufferOverflow},
        {"00 80 00 00 00 00 00 00 00", DERSuccess, UINT64_C(1) << 63, DERBufferOverflow},
        {"00 FF FF FF FF FF FF FF FF", DERSuccess, UINT64_MAX, DERBufferOverflow},
        {"01 00 00 00 00 00 00 00 00", DERBufferOverflow, 0, DERBufferOverflow},
        {"00 80 00 00 00 00 00 00 00 00", DERBufferOverflow, 0, DERBufferOverflow},
        {"", DERDecodeError, 0, DERDecodeError},
        {"80", DERDecodeError, 0, DERDecodeError},
        {"FF FF FF FF FF FF FF FF FF", DERDecodeError, 0, DERDecodeError},
        {"00 00", DERDecodeError, 0, DERDecodeError},
        {"00 7F", DERDecodeError, 0, DERDecodeError},
        {"00 7F 00 00 00 00 00 00 00 00", DERDecodeError, 0, DERDecodeError},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.content);
        const Bytes input = bytes(row.content);
        const DERItem content = itemOf(input);
        std::uint64_t value64 = 77;
        EXPECT_EQ(DERParseInteger64(&content, &value64), row.code64);
        EXPECT_EQ(value64, row.code64 == DERSuccess ? row.value : 77);
        std::uint32_t value32 = 77;
        EXPECT_EQ(DERParseInteger(&content, &value32), row.code32);
        EXPECT_EQ(value32, row.code32 == DERSuccess ? row.value : 77);
    }
}

TEST(DERPrimitive, booleansAreOneOctetOfAllBitsAlike) {
    const struct {
        const char* content;
        DERReturn code;
        bool value;
        DERReturn codeWithDefault;
    } rows[] = {
        {"00", DERSuccess, false, DERSuccess},         {"FF", DERSuccess, true, DERSuccess},
        {"01", DERDecodeError, false, DERDecodeError}, {"FF FF", DERDecodeError, false, DERDecodeError},
        {"", DERDecodeError, false, DERSuccess},
    };
    for (const auto& row : rows)
        for (const bool fallback : {false, true}) {
            SCOPED_TRACE(row.content);
            const Bytes input = bytes(row.content);
            const DERItem content = itemOf(input);
            bool value = !row.value;
            EXPECT_EQ(DERParseBoolean(&content, &value), row.code);
            EXPECT_EQ(value, row.code == DERSuccess ? row.value : !row.value);
            value = !fallback;
            EXPECT_EQ(DERParseBooleanWithDefault(&content, fallback, &value), row.codeWithDefault);
            if (row.codeWithDefault == DERSuccess) {
                EXPECT_EQ(value, input.empty() ? fallback : row.value);
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
    const Bytes sha256 = bytes("60 86 48 01 65 03 04 02 01");
    const Bytes copy = bytes("60 86 48 01 65 03 04 02 01");
    const DERItem whole = itemOf(sha256);
    const DERItem same = itemOf(copy);
    const DERItem shorter = {sha256.data(), sha256.size() - 1};
    const Bytes other = bytes("60 86 48 01 65 03 04 02 02");
    const DERItem different = itemOf(other);
    const DERItem absent = {};
    const DERItem empty = {sha256.data(), 0};
    EXPECT_TRUE(DEROidCompare(&whole, &same));
    EXPECT_TRUE(DEROidCompare(&empty, &empty));
    EXPECT_FALSE(DEROidCompare(&whole, &shorter));
    EXPECT_FALSE(DEROidCompare(&whole, &different));
    EXPECT_FALSE(DEROidCompare(&absent, &absent));
    EXPECT_FALSE(DEROidCompare(&empty, &absent));
    EXPECT_FALSE(DEROidCompare(nullptr, &whole));
    EXPECT_FALSE(DEROidCompare(&whole, nullptr));
}

} // namespace
