// Any octets as an item, as a sequence of items, and as the content of each primitive.
#include <algorithm>

#include "der/DERDecode.h"
#include "der/DEREncode.h"
#include "fuzz/Fuzz.h"

namespace {

using fuzz::isInside;

bool isSame(const DERDecodedInfo& a, const DERDecodedInfo& b) {
    return a.tag == b.tag && a.content.data == b.content.data && a.content.length == b.content.length;
}

// Strict DER has one encoding: the header of a decoded item, written again, is the header that was read.
void checkHeader(const DERItem& der, const DERDecodedInfo& decoded, std::uint64_t declared) {
    std::uint8_t header[20];
    const auto headerSize = static_cast<std::uint64_t>(decoded.content.data - der.data);
    FUZZ_REQUIRE(headerSize <= sizeof header);
    const std::uint64_t itemSize = DERLengthOfItem(decoded.tag, declared);
    FUZZ_REQUIRE(itemSize == (declared > UINT64_MAX - headerSize ? 0 : headerSize + declared));
    std::uint64_t written = 0;
    FUZZ_REQUIRE(DEREncodeHeaderSized(decoded.tag, declared, header, sizeof header, &written) == DERSuccess);
    FUZZ_REQUIRE(written == headerSize && std::equal(header, header + headerSize, der.data));
}

void checkDecodersAgree(const DERItem& der) {
    DERDecodedInfo whole = {};
    DERDecodedInfo other = {};
    const DERReturn result = DERDecodeItem(&der, &whole);
    FUZZ_REQUIRE(result == DERSuccess || result == DERDecodeError);
    DERDecodedInfo onto = {0, der}; // an item may be decoded onto the one it comes from
    FUZZ_REQUIRE(DERDecodeItem(&onto.content, &onto) == result && (result != DERSuccess || isSame(whole, onto)));
    FUZZ_REQUIRE(DERDecodeItemPartialBufferGetLength(&der, &other, nullptr) == result);
    FUZZ_REQUIRE(result != DERSuccess || isSame(whole, other));
    FUZZ_REQUIRE((DERDecodeItemPartialBuffer(&der, &other, false) == DERSuccess) == (result == DERSuccess));
    FUZZ_REQUIRE(result != DERSuccess || isSame(whole, other));

    std::uint64_t declared = 0;
    DERDecodedInfo clipped = {};
    const DERReturn partial = DERDecodeItemPartialBufferGetLength(&der, &clipped, &declared);
    const DERReturn unclipped = DERDecodeItemPartialBuffer(&der, &other, true);
    if (partial != DERSuccess) {
        FUZZ_REQUIRE(result == DERDecodeError && partial == DERDecodeError && unclipped == DERDecodeError);
        return;
    }
    FUZZ_REQUIRE(isInside(clipped.content, der));
    FUZZ_REQUIRE((declared == clipped.content.length) == (result == DERSuccess));
    FUZZ_REQUIRE(unclipped == (declared > INT64_MAX ? DERBufferOverflow : DERSuccess));
    FUZZ_REQUIRE(other.content.data == clipped.content.data && other.content.length == declared);
    FUZZ_REQUIRE(result != DERSuccess || isSame(whole, clipped));
    checkHeader(der, clipped, declared);
}

void checkInteger(const DERItem& content) {
    std::uint64_t value = 0;
    std::uint32_t small = 0;
    const DERReturn result = DERParseInteger64(&content, &value);
    const DERReturn smallResult = DERParseInteger(&content, &small);
    if (result != DERSuccess) {
        FUZZ_REQUIRE(smallResult == result);
        return;
    }
    FUZZ_REQUIRE(smallResult == (value > UINT32_MAX ? DERBufferOverflow : DERSuccess));
    FUZZ_REQUIRE(smallResult != DERSuccess || small == value);
    FUZZ_REQUIRE(content.length >= 1 && content.length <= 9);
    // The shortest form of the value, from its last octet to its first.
    std::uint64_t rest = value;
    for (std::uint64_t i = content.length; i-- > 0; rest >>= 8)
        FUZZ_REQUIRE(content.data[i] == (rest & 0xFF));
    FUZZ_REQUIRE(rest == 0 && (content.length == 1 || value >> (8 * (content.length - 1) - 1) != 0));
}

void checkPrimitives(const DERItem& content) {
    checkInteger(content);
    bool value = false;
    if (DERParseBoolean(&content, &value) == DERSuccess)
        FUZZ_REQUIRE(content.length == 1 && content.data[0] == (value ? 0xFF : 0x00));
    DERItem bits;
    std::uint8_t unused = 0;
    const DERReturn result = DERParseBitString(&content, &bits, &unused);
    FUZZ_REQUIRE(bits.data == nullptr ? bits.length == 0 : result == DERSuccess && isInside(bits, content));
    FUZZ_REQUIRE(result != DERSuccess || unused <= 7);
}

DERReturn countItem(const DERDecodedInfo*, bool*, void* context) {
    ++*static_cast<std::uint64_t*>(context);
    return DERSuccess;
}

// Walks `content` and the items inside constructed items, to a depth that bounds the work.
void checkWalk(const DERItem& content, int depth) {
    constexpr DERTag constructed = UINT64_C(1) << 61;
    constexpr int deepest = 16;
    DERSequence sequence;
    DERDecodeSeqContentInit(&content, &sequence);
    DERDecodedInfo item;
    std::uint64_t items = 0;
    const std::uint8_t* previous = sequence.next;
    DERReturn result = DERDecodeSeqNext(&sequence, &item);
    for (; result == DERSuccess; result = DERDecodeSeqNext(&sequence, &item)) {
        ++items;
        FUZZ_REQUIRE(isInside(item.content, content) && item.content.data > previous);
        FUZZ_REQUIRE(sequence.next == item.content.data + item.content.length);
        previous = sequence.next;
        checkPrimitives(item.content);
        if ((item.tag & constructed) != 0 && depth < deepest)
            checkWalk(item.content, depth + 1);
    }
    FUZZ_REQUIRE(sequence.next == previous);
    FUZZ_REQUIRE((result == DEREndOfSequence) == (previous == content.data + content.length));
    std::uint64_t counted = 0;
    const DERReturn walked = DERDecodeSequenceContentWithBlock(&content, countItem, &counted);
    FUZZ_REQUIRE(counted == items && walked == (result == DEREndOfSequence ? DERSuccess : result));
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const DERItem input = {data, size};
    checkDecodersAgree(input);
    DERDecodedInfo item;
    fuzz::taken = DERDecodeItem(&input, &item) == DERSuccess;
    checkPrimitives(input);
    checkWalk(input, 0);
    return 0;
}
