#include "img4/Img4Internal.h"

using namespace img4;

namespace {

DERReturn parseLength(const DERItem& buffer, uint32_t magic, uint64_t* total) {
    DERDecodedInfo outer;
    DERDecodedInfo inner;
    uint64_t outerLength = 0;
    uint64_t innerLength = 0;
    if (const DERReturn result = DERDecodeItemPartialBufferGetLength(&buffer, &outer, &outerLength);
        result != DERSuccess)
        return result;
    if (outer.tag != DERTagSequence)
        return DERUnexpectedTag;
    if (outerLength == 0)
        return DERDecodeError;
    if (const DERReturn result = DERDecodeItemPartialBufferGetLength(&outer.content, &inner, &innerLength);
        result != DERSuccess)
        return result;
    if (innerLength == 0)
        return DERDecodeError;
    if (innerLength != inner.content.length || !equalsFourCC(inner.content, magic))
        return DERUnexpectedTag;
    const uint64_t headerLength = static_cast<uint64_t>(outer.content.data - buffer.data);
    if (outerLength > UINT64_MAX - headerLength)
        return DERBufferOverflow;
    *total = headerLength + outerLength;
    return DERSuccess;
}

} // namespace

DERReturn Img4DecodeParseLengthFromBuffer(const uint8_t* buffer, uint64_t length, uint64_t* total) {
    return Img4DecodeParseLengthFromBufferWithTag(buffer, length, containerMagic, total);
}

DERReturn Img4DecodeParseLengthFromBufferWithTag(const uint8_t* buffer, uint64_t length, uint32_t magic,
                                                 uint64_t* total) {
    if (buffer == nullptr || total == nullptr)
        return clearOnFailure(Img4Failure, total);
    return clearOnFailure(parseLength({buffer, length}, magic, total), total);
}
