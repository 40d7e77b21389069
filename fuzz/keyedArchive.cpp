// Bytes that claim to be a keyed archive are refused with the one failure or decoded to a value that comes back equal
// from an archive of its own.
#include <cstdint>
#include <cstdlib>

#include "platform/KeyedArchive.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const std::optional<ArchiveDecoder> decoder = ArchiveDecoder::create({data, data + size}, nullptr);
    if (!decoder)
        return 0;
    Value object;
    try {
        object = decoder->decode("k");
    } catch (const ArchiveFailure&) {
        return 0;
    }
    if (object.isNothing())
        return 0;
    const std::optional<ArchiveDecoder> again = ArchiveDecoder::create(archiveEncode("k", object), nullptr);
    if (!again || again->decode("k") != object)
        std::abort();
    const std::string description = object.description();
    if (!object.text() && (description.size() > 8192 || description.find('\n') != std::string::npos))
        std::abort();
    return 0;
}
