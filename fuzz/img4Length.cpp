// Any octets to the parser of lengths: what it says of a prefix it says of the whole, and of a sound container it says
// the size.
#include "fuzz/Fuzz.h"
#include "img4/Img4.h"

namespace {

void checkPrefixes(const std::uint8_t* data, std::size_t size, std::uint64_t total) {
    std::uint64_t shorter = 0;
    for (std::size_t length = 0; length < size && length < 64; ++length) {
        if (Img4DecodeParseLengthFromBuffer(data, length, &shorter) == DERSuccess)
            FUZZ_REQUIRE(shorter == total);
        else
            FUZZ_REQUIRE(shorter == 0);
    }
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    std::uint64_t total = 1;
    std::uint64_t payloadTotal = 1;
    const DERReturn result = Img4DecodeParseLengthFromBuffer(data, size, &total);
    const DERReturn payload =
        Img4DecodeParseLengthFromBufferWithTag(data, size, Img4FourCC('I', 'M', '4', 'P'), &payloadTotal);
    FUZZ_REQUIRE((result == DERSuccess) == (total != 0) && (payload == DERSuccess) == (payloadTotal != 0));
    FUZZ_REQUIRE(result != DERSuccess || payload == DERUnexpectedTag);
    fuzz::taken = result == DERSuccess;
    if (result == DERSuccess)
        checkPrefixes(data, size, total);
    Img4Record record;
    if (data != nullptr && Img4DecodeInit(data, size, &record) == DERSuccess)
        FUZZ_REQUIRE(result == DERSuccess && total == size);
    return 0;
}
