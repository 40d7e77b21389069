// A record filled by a table, both made from the input, and written again. The input is one octet with the number of
// rows of a table, one with the number of DERItems in the record, two for each row (tag, options), and then the content
// to parse.
#include <algorithm>
#include <array>
#include <memory>
#include <vector>

#include "der/DERDecode.h"
#include "der/DEREncode.h"
#include "fuzz/Fuzz.h"

namespace {

using fuzz::isInside;

constexpr std::uint8_t mostRows = 8;

// A row's tag octet, modulo the size of the list, is an index into it.
constexpr std::array<DERTag, 8> tags = {
    DERTagBoolean,  DERTagInteger,   DERTagOctetString,           DERTagObjectIdentifier,
    DERTagSequence, DERTagBitString, DERTagContextConstructed(0), DERTagPrivateConstructed(0x53504159),
};

// A row's options octet.
constexpr std::uint8_t decoderOptions = 0x0F; // as in DERItemSpec
constexpr std::uint8_t signedInteger = 0x10;  // DEROptionSignedInteger
constexpr std::uint8_t writeDER = 0x20;       // DEROptionWriteDER
constexpr std::uint8_t farAway = 0x40;        // the row's place lies beyond every record

struct Case {
    std::vector<DERItemSpec> specs;
    std::uint64_t recordItems = 0;
    DERItem content = {};

    std::uint16_t count() const { return static_cast<std::uint16_t>(specs.size()); }
};

bool readCase(fuzz::Input input, Case* out) {
    const std::uint64_t rows = input.octet() % (mostRows + 1U);
    out->recordItems = input.octet() % (mostRows + 1U);
    if (input.left.size() < 2 * rows)
        return false;
    for (std::uint64_t row = 0; row < rows; ++row) {
        const DERTag tag = tags[input.octet() % tags.size()];
        const std::uint8_t octet = input.octet();
        unsigned options = octet & decoderOptions;
        options |= (octet & signedInteger) != 0 ? unsigned{DEROptionSignedInteger} : 0U;
        options |= (octet & writeDER) != 0 ? unsigned{DEROptionWriteDER} : 0U;
        const std::uint64_t offset = (octet & farAway) != 0 ? UINT64_MAX - row : row * sizeof(DERItem);
        out->specs.push_back({offset, tag, static_cast<std::uint16_t>(options)});
    }
    out->content = fuzz::viewOf(input.left.data(), input.left.size());
    return true;
}

void checkStored(const Case& input, const std::vector<DERItem>& record) {
    for (std::uint64_t i = 0; i < record.size(); ++i) {
        const DERItem& item = record[i];
        if (item.data == nullptr) {
            FUZZ_REQUIRE(item.length == 0);
            continue;
        }
        FUZZ_REQUIRE(i < input.specs.size() && isInside(item, input.content));
        const unsigned options = input.specs[i].options;
        FUZZ_REQUIRE((options & DEROptionSkip) == 0);
        if ((options & DEROptionSaveDER) == 0)
            continue;
        DERDecodedInfo decoded;
        FUZZ_REQUIRE(DERDecodeItem(&item, &decoded) == DERSuccess);
        FUZZ_REQUIRE(decoded.content.data + decoded.content.length == item.data + item.length);
        FUZZ_REQUIRE((options & DEROptionAnyTag) != 0 || decoded.tag == input.specs[i].tag);
    }
}

// Writes the record into a buffer of exactly the measured size, and fails to with an octet less.
std::vector<std::uint8_t> encode(const std::vector<DERItem>& record, const std::vector<DERItemSpec>& specs) {
    const auto count = static_cast<std::uint16_t>(specs.size());
    const std::uint64_t recordSize = record.size() * sizeof(DERItem);
    std::uint64_t measured = 0;
    const DERReturn result =
        DERLengthOfEncodedSequenceFromObject(DERTagSequence, record.data(), recordSize, count, specs.data(), &measured);
    std::uint64_t written = 0;
    const auto write = [&](std::uint8_t* out, std::uint64_t capacity) {
        return DEREncodeSequenceFromObject(DERTagSequence, record.data(), recordSize, count, specs.data(), out,
                                           capacity, &written);
    };
    if (result != DERSuccess) {
        std::uint8_t scratch[4];
        FUZZ_REQUIRE(result == DERBufferOverflow && write(scratch, sizeof scratch) == DERBufferOverflow);
        return {};
    }
    std::vector<std::uint8_t> encoded(measured);
    FUZZ_REQUIRE(write(encoded.data(), measured) == DERSuccess && written == measured);
    const auto shorter = std::make_unique<std::uint8_t[]>(measured - 1);
    FUZZ_REQUIRE(write(shorter.get(), measured - 1) == DERBufferOverflow);
    return encoded;
}

// True when a filled record holds all that its content held.
bool keepsEverything(const Case& input, const std::vector<DERItem>& record) {
    for (std::uint64_t i = 0; i < input.specs.size(); ++i) {
        const unsigned options = input.specs[i].options;
        const bool saved = (options & DEROptionSaveDER) != 0;
        const bool emptyButThere = i < record.size() && record[i].data != nullptr && record[i].length == 0;
        if ((options & DEROptionSkip) != 0 || ((options & DEROptionAnyTag) != 0 && !saved) ||
            ((options & DEROptionOptional) != 0 && emptyButThere))
            return false;
    }
    return true;
}

// What was parsed, written by the same table, is the content that it came from.
void checkWrittenBack(const Case& input, const std::vector<DERItem>& record) {
    std::vector<DERItemSpec> specs = input.specs;
    for (DERItemSpec& spec : specs) {
        const unsigned write = (spec.options & DEROptionSaveDER) != 0 ? DEROptionWriteDER : 0;
        spec.options = static_cast<std::uint16_t>((spec.options & DEROptionOptional) | write);
        // A row that matched nothing may lie anywhere; one with a place must have it for the writer.
        if (spec.offset > record.size() * sizeof(DERItem) - sizeof(DERItem) || record.empty())
            return;
    }
    const std::vector<std::uint8_t> encoded = encode(record, specs);
    const DERItem der = {encoded.data(), encoded.size()};
    DERDecodedInfo decoded;
    FUZZ_REQUIRE(DERDecodeItem(&der, &decoded) == DERSuccess && decoded.tag == DERTagSequence);
    FUZZ_REQUIRE(std::equal(decoded.content.data, decoded.content.data + decoded.content.length, input.content.data,
                            input.content.data + input.content.length));
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    Case input;
    if (!readCase({{data, size}}, &input))
        return 0;
    // The record has no spare capacity, so that the address sanitizer sees a write beyond it.
    std::vector<DERItem> record(input.recordItems, DERItem{input.content.data, size + 1});
    const std::uint64_t recordSize = record.size() * sizeof(DERItem);
    const DERReturn result = DERParseSequenceContentToObject(&input.content, input.count(), input.specs.data(),
                                                             record.data(), recordSize, recordSize);
    FUZZ_REQUIRE(result == DERSuccess || result == DERUnexpectedTag || result == DERDecodeError ||
                 result == DERIncompleteSequence || result == DERBufferOverflow);
    fuzz::taken = result == DERSuccess;
    checkStored(input, record);
    encode(record, input.specs);
    if (result == DERSuccess && keepsEverything(input, record))
        checkWrittenBack(input, record);
    return 0;
}
