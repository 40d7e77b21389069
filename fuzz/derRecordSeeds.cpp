#include "der/DERDecode.h"
#include "der/DEREncode.h"
#include "fuzz/Seeds.h"
#include "fuzz/derRecordInput.h"

namespace {

using namespace recordInput;
using Bytes = std::vector<std::uint8_t>;

struct SeedRow {
    std::uint8_t tagIndex;
    std::uint8_t options;
    Bytes content; // empty: the item is left out when the row is optional
};

// A table and, as the content to parse, what the encoder makes of its rows.
Bytes seed(const std::vector<SeedRow>& rows) {
    const auto count = static_cast<std::uint8_t>(rows.size());
    Bytes input = {count, count};
    std::vector<DERItem> record;
    std::vector<DERItemSpec> specs;
    for (const SeedRow& row : rows) {
        input.push_back(row.tagIndex);
        input.push_back(row.options);
        specs.push_back({record.size() * sizeof(DERItem), tags[row.tagIndex],
                         static_cast<std::uint16_t>(row.options & DEROptionOptional)});
        record.push_back({row.content.data(), row.content.size()});
    }
    Bytes encoded(DERLengthOfEncodedSequence(DERTagSequence, record.data(), count, specs.data()));
    std::uint64_t size = encoded.size();
    DEREncodeSequence(DERTagSequence, record.data(), count, specs.data(), encoded.data(), &size);
    const DERItem der = {encoded.data(), size};
    DERDecodedInfo decoded;
    DERDecodeItem(&der, &decoded);
    input.insert(input.end(), decoded.content.data, decoded.content.data + decoded.content.length);
    return input;
}

} // namespace

int main(int argc, char** argv) {
    const Bytes two = {0x12, 0x34};
    return writeSeeds(argc, argv,
                      {seed({{1, 0, two}, {2, 0, two}, {4, 0, {0x05, 0x00}}}),
                       seed({{6, DEROptionOptional, {}},
                             {1, 0, two},
                             {0, DEROptionOptional, {0xFF}},
                             {7, DEROptionOptional | DEROptionSaveDER, {0x05, 0x00}}}),
                       seed({{3, 0, {0x2A}}, {2, DEROptionOptional | DEROptionAnyTag | DEROptionSaveDER, two}}),
                       seed({{1, DEROptionSkip | farAway, two}, {5, DEROptionSaveDER, {0x03, 0xF8}}}),
                       seed({{1, signedInteger, {0x80}}, {4, writeDER | DEROptionSaveDER, {0x02, 0x01, 0x05}}})});
}
