// The parts of the encoder that its public operations are made of. They are not exported.
#ifndef VELTRA_DER_ENCODE_INTERNAL_H
#define VELTRA_DER_ENCODE_INTERNAL_H

#include "der/DERTypes.h"

extern "C" {

// Writes the identifier octets of `tag` into `buffer` of *inOutLength octets and sets *inOutLength to their number.
// Returns DERBufferOverflow when they do not fit.
DERReturn DEREncodeTag(DERTag tag, uint8_t* buffer, uint64_t* inOutLength);

// Sets *contentLength to the summed size of the encoded rows: the content length of the sequence that they make.
// Returns DERBufferOverflow, with *contentLength 0, when a row lies outside the record or the sum exceeds 64 bits.
DERReturn DERLengthOfSequenceContent(const void* object, uint64_t objectSize, uint16_t numItems,
                                     const DERItemSpec* itemSpecs, uint64_t* contentLength);
}

#endif
