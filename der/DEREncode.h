// DER encoding (ITU-T X.690) into buffers of the caller's. Nothing is allocated. The item-spec tables are those of
// DERDecode.h, so that one record serves both directions.
//
// Measure with a length operation, provide that many octets, and the encode cannot fail. In every operation with an
// in/out length, *inOutLength is the buffer's size on entry and the number of octets written on success.
// DERBufferOverflow is the only failure: the buffer is too small, a row lies outside the record, or a size exceeds 64
// bits. Octets written before a failure stay in the buffer.
#ifndef VELTRA_DER_ENCODE_H
#define VELTRA_DER_ENCODE_H

#include "der/DERTypes.h"

#ifdef __cplusplus
extern "C" {
#endif

// Lengths
//
// Always the shortest definite form (X.690 10.1).

// The number of octets that encode the length `length`: 1 to 9.
DER_API uint64_t DERLengthOfLength(uint64_t length);

// Writes the length octets of `length` into `buffer` of `bufferSize` octets and their number into *written.
DER_API DERReturn DEREncodeLengthSized(uint64_t length, uint8_t* buffer, uint64_t bufferSize, uint64_t* written);
DER_API DERReturn DEREncodeLength(uint64_t length, uint8_t* buffer, uint64_t* inOutLength);

// Items

// The number of octets of a whole item: identifier octets of `tag`, length octets and `length` content octets. 0 when
// that exceeds 64 bits.
DER_API uint64_t DERLengthOfItem(DERTag tag, uint64_t length);

// Writes identifier and length octets of an item whose `length` content octets follow, and their number into *written.
DER_API DERReturn DEREncodeHeaderSized(DERTag tag, uint64_t length, uint8_t* buffer, uint64_t bufferSize,
                                       uint64_t* written);

// Writes one item with the `length` octets at `content`. `content` may be null when `length` is 0. *written (and
// *inOutLength) is set to the whole size once it is known to fit.
DER_API DERReturn DEREncodeItemSized(DERTag tag, uint64_t length, const uint8_t* content, uint8_t* buffer,
                                     uint64_t bufferSize, uint64_t* written);
DER_API DERReturn DEREncodeItem(DERTag tag, uint64_t length, const uint8_t* content, uint8_t* buffer,
                                uint64_t* inOutLength);

// Sequences
//
// `object` is a record of `objectSize` bytes that holds the DERItem of each row at the row's offset; the forms without
// `objectSize` take it as unbounded. `tag` is the tag of the whole: DERTagSequence, DERTagSet or any other constructed
// one. Rows are written in table order; a SET is not sorted.

// The size of the whole constructed item, into *length. DERBufferOverflow, with *length as it was, when a row lies
// outside the record or the size exceeds 64 bits.
DER_API DERReturn DERLengthOfEncodedSequenceFromObject(DERTag tag, const void* object, uint64_t objectSize,
                                                       uint16_t numItems, const DERItemSpec* itemSpecs,
                                                       uint64_t* length);

// The same for an unbounded record: the size, or 0 on any error.
DER_API uint64_t DERLengthOfEncodedSequence(DERTag tag, const void* object, uint16_t numItems,
                                            const DERItemSpec* itemSpecs);

// Writes the whole constructed item into `buffer` of `bufferSize` octets and the number of octets into *written.
DER_API DERReturn DEREncodeSequenceFromObject(DERTag tag, const void* object, uint64_t objectSize, uint16_t numItems,
                                              const DERItemSpec* itemSpecs, uint8_t* buffer, uint64_t bufferSize,
                                              uint64_t* written);
DER_API DERReturn DEREncodeSequence(DERTag tag, const void* object, uint16_t numItems, const DERItemSpec* itemSpecs,
                                    uint8_t* buffer, uint64_t* inOutLength);

#ifdef __cplusplus
}
#endif

#endif
