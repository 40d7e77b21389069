#include "der/DEREncode.h"

#include <bit>
#include <cstring>

#include "der/DEREncodeInternal.h"

namespace {

constexpr uint64_t unbounded = UINT64_MAX;
constexpr unsigned classAndFormShift = 56;
constexpr uint8_t highTagNumber = 0x1F;

// Adds `amount` to *sum, or says that the result exceeds 64 bits.
bool addSize(uint64_t* sum, uint64_t amount) {
    return !__builtin_add_overflow(*sum, amount, sum);
}

uint64_t lengthOfTag(DERTag tag) {
    const uint64_t number = tag & DERTagNumberMask;
    if (number < highTagNumber)
        return 1;
    return 1 + static_cast<uint64_t>(std::bit_width(number) + 6) / 7;
}

// The size of a whole item, or false when it exceeds 64 bits.
bool lengthOfItem(DERTag tag, uint64_t contentLength, uint64_t* total) {
    *total = lengthOfTag(tag) + DERLengthOfLength(contentLength);
    return addSize(total, contentLength);
}

bool hasOption(const DERItemSpec& row, unsigned option) {
    return (row.options & option) != 0;
}

// One row's item and how it is to be written.
struct RowItem {
    DERItem item;
    // The item is a complete encoding, or nothing at all: it gets no header.
    bool bare;
    // A 0x00 octet goes before the content.
    bool leadingZero;
};

bool loadRow(const void* object, uint64_t objectSize, const DERItemSpec& row, RowItem* out) {
    DERItem item;
    if (objectSize < sizeof item || row.offset > objectSize - sizeof item)
        return false;
    // Records are packed by the caller's will, not ours: nothing promises that the place is aligned.
    std::memcpy(&item, static_cast<const uint8_t*>(object) + row.offset, sizeof item);
    const bool leftOut = item.length == 0 && hasOption(row, DEROptionOptional);
    out->item = item;
    out->bare = leftOut || hasOption(row, DEROptionWriteDER);
    out->leadingZero = item.length != 0 && hasOption(row, DEROptionSignedInteger) && (item.data[0] & 0x80) != 0;
    return true;
}

uint8_t* writeBytes(uint8_t* out, const uint8_t* bytes, uint64_t length) {
    if (length != 0)
        std::memcpy(out, bytes, static_cast<size_t>(length));
    return out + length;
}

// The writers below are called with room for all that they write.

uint8_t* writeTag(uint8_t* out, DERTag tag) {
    const uint64_t number = tag & DERTagNumberMask;
    const auto classAndForm = static_cast<uint8_t>((tag & ~DERTagNumberMask) >> classAndFormShift);
    const uint64_t size = lengthOfTag(tag);
    if (size == 1) {
        *out++ = static_cast<uint8_t>(classAndForm | number);
        return out;
    }
    *out++ = classAndForm | highTagNumber;
    for (uint64_t digit = size - 1; digit-- > 0;) {
        const unsigned more = digit != 0 ? 0x80 : 0;
        *out++ = static_cast<uint8_t>(more | (number >> (7 * digit) & 0x7F));
    }
    return out;
}

uint8_t* writeLength(uint8_t* out, uint64_t length) {
    const uint64_t octets = DERLengthOfLength(length) - 1;
    if (octets == 0) {
        *out++ = static_cast<uint8_t>(length);
        return out;
    }
    *out++ = static_cast<uint8_t>(0x80 | octets);
    for (uint64_t octet = octets; octet-- > 0;)
        *out++ = static_cast<uint8_t>(length >> (8 * octet));
    return out;
}

uint8_t* writeRow(uint8_t* out, DERTag tag, const RowItem& row) {
    if (!row.bare) {
        out = writeTag(out, tag);
        out = writeLength(out, row.item.length + (row.leadingZero ? 1 : 0));
        if (row.leadingZero)
            *out++ = 0x00;
    }
    return writeBytes(out, row.item.data, row.item.length);
}

} // namespace

uint64_t DERLengthOfLength(uint64_t length) {
    if (length < 0x80)
        return 1;
    return 1 + static_cast<uint64_t>(std::bit_width(length) + 7) / 8;
}

DERReturn DEREncodeLengthSized(uint64_t length, uint8_t* buffer, uint64_t bufferSize, uint64_t* written) {
    const uint64_t size = DERLengthOfLength(length);
    if (size > bufferSize)
        return DERBufferOverflow;
    writeLength(buffer, length);
    *written = size;
    return DERSuccess;
}

DERReturn DEREncodeLength(uint64_t length, uint8_t* buffer, uint64_t* inOutLength) {
    return DEREncodeLengthSized(length, buffer, *inOutLength, inOutLength);
}

DERReturn DEREncodeTag(DERTag tag, uint8_t* buffer, uint64_t* inOutLength) {
    const uint64_t size = lengthOfTag(tag);
    if (size > *inOutLength)
        return DERBufferOverflow;
    writeTag(buffer, tag);
    *inOutLength = size;
    return DERSuccess;
}

uint64_t DERLengthOfItem(DERTag tag, uint64_t length) {
    uint64_t total = 0;
    return lengthOfItem(tag, length, &total) ? total : 0;
}

DERReturn DEREncodeHeaderSized(DERTag tag, uint64_t length, uint8_t* buffer, uint64_t bufferSize, uint64_t* written) {
    const uint64_t size = lengthOfTag(tag) + DERLengthOfLength(length);
    if (size > bufferSize)
        return DERBufferOverflow;
    writeLength(writeTag(buffer, tag), length);
    *written = size;
    return DERSuccess;
}

DERReturn DEREncodeItemSized(DERTag tag, uint64_t length, const uint8_t* content, uint8_t* buffer, uint64_t bufferSize,
                             uint64_t* written) {
    uint64_t total = 0;
    if (!lengthOfItem(tag, length, &total) || total > bufferSize)
        return DERBufferOverflow;
    *written = total;
    writeBytes(writeLength(writeTag(buffer, tag), length), content, length);
    return DERSuccess;
}

DERReturn DEREncodeItem(DERTag tag, uint64_t length, const uint8_t* content, uint8_t* buffer, uint64_t* inOutLength) {
    return DEREncodeItemSized(tag, length, content, buffer, *inOutLength, inOutLength);
}

DERReturn DERLengthOfSequenceContent(const void* object, uint64_t objectSize, uint16_t numItems,
                                     const DERItemSpec* itemSpecs, uint64_t* contentLength) {
    *contentLength = 0;
    uint64_t sum = 0;
    for (uint16_t i = 0; i < numItems; ++i) {
        RowItem row;
        if (!loadRow(object, objectSize, itemSpecs[i], &row))
            return DERBufferOverflow;
        uint64_t size = row.item.length;
        if (!row.bare && (!addSize(&size, row.leadingZero ? 1 : 0) || !lengthOfItem(itemSpecs[i].tag, size, &size)))
            return DERBufferOverflow;
        if (!addSize(&sum, size))
            return DERBufferOverflow;
    }
    *contentLength = sum;
    return DERSuccess;
}

DERReturn DERLengthOfEncodedSequenceFromObject(DERTag tag, const void* object, uint64_t objectSize, uint16_t numItems,
                                               const DERItemSpec* itemSpecs, uint64_t* length) {
    uint64_t contentLength = 0;
    const DERReturn result = DERLengthOfSequenceContent(object, objectSize, numItems, itemSpecs, &contentLength);
    if (result != DERSuccess)
        return result;
    uint64_t total = 0;
    if (!lengthOfItem(tag, contentLength, &total))
        return DERBufferOverflow;
    *length = total;
    return DERSuccess;
}

uint64_t DERLengthOfEncodedSequence(DERTag tag, const void* object, uint16_t numItems, const DERItemSpec* itemSpecs) {
    uint64_t length = 0;
    DERLengthOfEncodedSequenceFromObject(tag, object, unbounded, numItems, itemSpecs, &length);
    return length;
}

DERReturn DEREncodeSequenceFromObject(DERTag tag, const void* object, uint64_t objectSize, uint16_t numItems,
                                      const DERItemSpec* itemSpecs, uint8_t* buffer, uint64_t bufferSize,
                                      uint64_t* written) {
    uint64_t tagSize = bufferSize;
    if (DEREncodeTag(tag, buffer, &tagSize) != DERSuccess)
        return DERBufferOverflow;
    uint64_t contentLength = 0;
    const DERReturn measured = DERLengthOfSequenceContent(object, objectSize, numItems, itemSpecs, &contentLength);
    if (measured != DERSuccess)
        return measured;
    uint64_t lengthSize = 0;
    if (DEREncodeLengthSized(contentLength, buffer + tagSize, bufferSize - tagSize, &lengthSize) != DERSuccess)
        return DERBufferOverflow;
    const uint64_t headerSize = tagSize + lengthSize;
    if (contentLength > bufferSize - headerSize)
        return DERBufferOverflow;
    uint8_t* out = buffer + headerSize;
    for (uint16_t i = 0; i < numItems; ++i) {
        RowItem row;
        if (!loadRow(object, objectSize, itemSpecs[i], &row))
            return DERBufferOverflow;
        out = writeRow(out, itemSpecs[i].tag, row);
    }
    *written = static_cast<uint64_t>(out - buffer);
    return DERSuccess;
}

DERReturn DEREncodeSequence(DERTag tag, const void* object, uint16_t numItems, const DERItemSpec* itemSpecs,
                            uint8_t* buffer, uint64_t* inOutLength) {
    return DEREncodeSequenceFromObject(tag, object, unbounded, numItems, itemSpecs, buffer, *inOutLength, inOutLength);
}
