// Any octets through the four initialisations, each followed by every query. The answers check that no view leaves the
// input; a sound container or manifest must moreover fill it.
#include "fuzz/Fuzz.h"
#include "img4/Img4.h"
#include "tests/support/Img4Answers.h"

namespace {

// What a container holds answers alike when it is handed over bare.
void checkContainer(const Img4Record& record) {
    Img4Record bare;
    FUZZ_REQUIRE(Img4DecodeInitPayload(record.payloadRaw.data, record.payloadRaw.length, &bare) == DERSuccess);
    FUZZ_REQUIRE(bare.payload.data.data == record.payload.data.data);
    if (record.manifestRaw.data == nullptr)
        return;
    const DERReturn result = Img4DecodeInitManifest(record.manifestRaw.data, record.manifestRaw.length, &bare);
    // The container does not look behind the manifest in its [0], which a bare manifest must fill.
    FUZZ_REQUIRE(result == DERSuccess || result == DERBufferOverflow);
    FUZZ_REQUIRE(bare.manifest.body.data == record.manifest.body.data);
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    // The input may be null when it is empty; a buffer must not be.
    const std::uint8_t none = 0;
    const std::uint8_t* buffer = size == 0 ? &none : data;
    img4answers::askAll(buffer, size);
    Img4Record record;
    fuzz::taken = Img4DecodeInit(buffer, size, &record) == DERSuccess;
    if (fuzz::taken)
        checkContainer(record);
    return 0;
}
