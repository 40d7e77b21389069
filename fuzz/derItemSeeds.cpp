#include "der/DEREncode.h"
#include "fuzz/Seeds.h"

namespace {

using Bytes = std::vector<std::uint8_t>;

Bytes item(DERTag tag, const Bytes& content) {
    Bytes encoded(DERLengthOfItem(tag, content.size()));
    std::uint64_t size = encoded.size();
    DEREncodeItem(tag, content.size(), content.data(), encoded.data(), &size);
    return encoded;
}

Bytes joined(const std::vector<Bytes>& parts) {
    Bytes all;
    for (const Bytes& part : parts)
        all.insert(all.end(), part.begin(), part.end());
    return all;
}

} // namespace

int main(int argc, char** argv) {
    const Bytes integer = item(DERTagInteger, {0x00, 0xFF, 0xFE, 0xFD, 0xFC, 0xFB, 0xFA, 0xF9, 0xF8});
    const Bytes primitives = joined({integer, item(DERTagBoolean, {0xFF}), item(DERTagBitString, {0x03, 0xF8}),
                                     item(DERTagIA5String, {'k', 'e', 'y'})});
    const Bytes nested = item(
        DERTagSequence, joined({item(DERTagSet, primitives), item(DERTagPrivateConstructed(0x53504159), integer)}));
    const Bytes longContent = item(DERTagOctetString, Bytes(300, 0x5A));
    Bytes cutOff = longContent;
    cutOff.resize(20);
    return writeSeeds(argc, argv, {integer, primitives, nested, longContent, cutOff, item(DERTagNumberMask, {})});
}
