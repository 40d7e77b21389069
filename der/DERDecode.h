// Strict DER decoding (ITU-T X.690), in place: nothing is allocated or copied, and every result is a view into the
// input. All operations are pure functions of their arguments and may run on any number of threads. Nothing is ever
// read outside the given item, whatever octets it holds.
//
// Unless an operation says otherwise its output arguments must not be null, and what it wrote before a failure must not
// be relied on.
#ifndef VELTRA_DER_DECODE_H
#define VELTRA_DER_DECODE_H

#include "der/DERTypes.h"

#ifdef __cplusplus
extern "C" {
#endif

// Items
//
// An item is identifier octets, length octets and content (X.690 8.1). The decoder accepts the high-tag-number form
// only for numbers from 31 on and without a leading zero group, tag numbers below 2^61, and definite lengths in their
// shortest form (X.690 8.1.2.4, 10.1). Anything else is DERDecodeError.

// Decodes the item at the start of *der into *decoded. Octets after the item are allowed and ignored. Returns
// DERDecodeError when *der holds fewer than two octets, when the header is not strict DER, or when the content runs
// past the end of *der.
DER_API DERReturn DERDecodeItem(const DERItem* der, DERDecodedInfo* decoded);

// As DERDecodeItem, and says in *refusal why it refuses the item. *refusal is written on failure only; null is allowed.
DER_API DERReturn DERDecodeItemExplained(const DERItem* der, DERDecodedInfo* decoded, DERRefusal* refusal);

// As DERDecodeItem while `declaredLength` is null. With it, a content that runs past the end of *der is accepted:
// decoded->content is clipped to what is there. On success *declaredLength is the length that the encoding declares,
// clipped or not.
DER_API DERReturn DERDecodeItemPartialBufferGetLength(const DERItem* der, DERDecodedInfo* decoded,
                                                      uint64_t* declaredLength);

// As DERDecodeItem while `allowPartial` is false. With it, a content that runs past the end of *der is accepted and
// decoded->content.length is the declared length, NOT clipped: the caller must not read beyond *der. Returns
// DERBufferOverflow when the declared length could not lie in memory behind the content's start.
DER_API DERReturn DERDecodeItemPartialBuffer(const DERItem* der, DERDecodedInfo* decoded, bool allowPartial);

// Walking a SEQUENCE or SET
//
// The cursor is a plain value of the caller's and holds nothing. Start it with one of the Init operations, then call
// DERDecodeSeqNext until it returns DEREndOfSequence.

// Decodes the item at *der, stores its tag in *tagOut and sets *sequence to walk its content. Returns DERUnexpectedTag
// when the item is neither a constructed SEQUENCE nor a constructed SET; *tagOut is stored even then.
DER_API DERReturn DERDecodeSeqInit(const DERItem* der, DERTag* tagOut, DERSequence* sequence);

// Sets *sequence to walk the octets of *content. Always returns DERSuccess.
DER_API DERReturn DERDecodeSeqContentInit(const DERItem* content, DERSequence* sequence);

// Decodes the next item into *decoded and moves the cursor behind it. Returns DEREndOfSequence when no octets are left.
// An error leaves the cursor where it was.
DER_API DERReturn DERDecodeSeqNext(DERSequence* sequence, DERDecodedInfo* decoded);

// Called by the walks below for each item. `context` is the pointer that was given to the walk. The walk ends with
// success when the callback sets *stop or returns DEREndOfSequence, and with the callback's result when that is larger,
// whatever *stop says.
typedef DERReturn (*DERDecodeSequenceCallback)(const DERDecodedInfo* decoded, bool* stop, void* context);

// Calls `callback` for each item of the SEQUENCE or SET at *der, in order. Returns DERUnexpectedTag for any other item,
// the callback's result as said there, or the error of the item that could not be decoded.
DER_API DERReturn DERDecodeSequenceWithBlock(const DERItem* der, DERDecodeSequenceCallback callback, void* context);

// The same over the octets of *content, with no tag to check.
DER_API DERReturn DERDecodeSequenceContentWithBlock(const DERItem* content, DERDecodeSequenceCallback callback,
                                                    void* context);

// Filling a record
//
// A table of DERItemSpec rows describes the items of a SEQUENCE in order; the DERItem of each matched item is stored in
// the record `dest` at the row's offset. Rows of an optional item that is missing leave their place in the record
// alone, so callers pass the size of the record as `sizeToZero`.

// Parses the SEQUENCE at *der, which must be one (a SET is DERUnexpectedTag), into `dest` as
// DERParseSequenceContentToObject does. Octets after the SEQUENCE are ignored. When *der is no SEQUENCE, or none that
// can be decoded, `dest` is left alone, not even zeroed.
DER_API DERReturn DERParseSequenceToObject(const DERItem* der, uint16_t numItems, const DERItemSpec* itemSpecs,
                                           void* dest, uint64_t destSize, uint64_t sizeToZero);

// Parses the items in *content into the record `dest` of `destSize` bytes, by the `numItems` rows of `itemSpecs`. The
// first `sizeToZero` bytes of `dest` are zeroed before anything else, whatever the result. `dest` may be null only when
// nothing is zeroed or stored. Returns:
// - DERUnexpectedTag when an item matches no row that it may stand for;
// - DERIncompleteSequence when the content ends before a row that is not optional was matched;
// - DERDecodeError for an item that is not strict DER, and for octets after the item that matched the last row;
// - DERBufferOverflow when a matched row's place lies beyond `destSize`.
DER_API DERReturn DERParseSequenceContentToObject(const DERItem* content, uint16_t numItems,
                                                  const DERItemSpec* itemSpecs, void* dest, uint64_t destSize,
                                                  uint64_t sizeToZero);

// The same two operations for a `dest` that is known to be large enough for every row.
DER_API DERReturn DERParseSequence(const DERItem* der, uint16_t numItems, const DERItemSpec* itemSpecs, void* dest,
                                   uint64_t sizeToZero);
DER_API DERReturn DERParseSequenceContent(const DERItem* content, uint16_t numItems, const DERItemSpec* itemSpecs,
                                          void* dest, uint64_t sizeToZero);

// The first two of these operations, and in *refusal why they refuse what they were given. *refusal is written on
// failure only; null is allowed.
DER_API DERReturn DERParseSequenceExplained(const DERItem* der, uint16_t numItems, const DERItemSpec* itemSpecs,
                                            void* dest, uint64_t destSize, uint64_t sizeToZero, DERRefusal* refusal);
DER_API DERReturn DERParseSequenceContentExplained(const DERItem* content, uint16_t numItems,
                                                   const DERItemSpec* itemSpecs, void* dest, uint64_t destSize,
                                                   uint64_t sizeToZero, DERRefusal* refusal);

// Primitive contents
//
// These take content octets, as DERDecodedInfo and filled records hold them.

// Parses a non-negative INTEGER (X.690 8.3) into *value. Returns DERDecodeError when it is empty, negative or not in
// its shortest form, DERBufferOverflow when it does not fit 64 or 32 bits. *value is written on success only.
DER_API DERReturn DERParseInteger64(const DERItem* item, uint64_t* value);
DER_API DERReturn DERParseInteger(const DERItem* item, uint32_t* value);

// Parses a BOOLEAN (X.690 11.1): one octet, 0x00 or 0xFF, or DERDecodeError.
DER_API DERReturn DERParseBoolean(const DERItem* item, bool* value);

// The same, but an empty or absent item gives `defaultValue`.
DER_API DERReturn DERParseBooleanWithDefault(const DERItem* item, bool defaultValue, bool* value);

// Parses a BIT STRING (X.690 8.6, 11.2): *bits views the octets that hold the bits, *unusedBits (0 to 7) counts the low
// bits of the last one that do not belong to the value and must be zero. Both outputs are cleared first. An empty bit
// string leaves *bits absent.
DER_API DERReturn DERParseBitString(const DERItem* item, DERItem* bits, uint8_t* unusedBits);

// True when both object identifiers are present and their content octets are equal. Null arguments are absent.
DER_API bool DEROidCompare(const DERItem* oid1, const DERItem* oid2);

#ifdef __cplusplus
}
#endif

#endif
