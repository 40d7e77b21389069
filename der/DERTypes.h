// Types shared by the strict DER decoder (DERDecode.h) and encoder (DEREncode.h). The encoding rules are those of
// ITU-T X.690; clause numbers in this folder refer to it.
//
// Every record here is plain and owns nothing. A DERItem is a view into a buffer of the caller's, who keeps that buffer
// alive and unchanged for as long as the view is used.
#ifndef VELTRA_DER_TYPES_H
#define VELTRA_DER_TYPES_H

#include <stdbool.h>
#include <stdint.h>

#if defined(__GNUC__)
#define DER_API __attribute__((visibility("default")))
#else
#define DER_API
#endif

#ifdef __cplusplus
extern "C" {
#endif

// A view of bytes. An absent item has no data and length 0, so a zeroed record is a record of absent items.
typedef struct DERItem {
    const uint8_t* data;
    uint64_t length;
} DERItem;

// A tag word: the class in bits 63-62, the constructed flag in bit 61 and the tag number in bits 60-0 (X.690 8.1.2).
// The three top bits are those of the first identifier octet, moved up by 56.
typedef uint64_t DERTag;

#define DERTagBoolean UINT64_C(0x01)
#define DERTagInteger UINT64_C(0x02)
#define DERTagBitString UINT64_C(0x03)
#define DERTagOctetString UINT64_C(0x04)
#define DERTagObjectIdentifier UINT64_C(0x06)
#define DERTagIA5String UINT64_C(0x16)
#define DERTagSequence UINT64_C(0x2000000000000010)
#define DERTagSet UINT64_C(0x2000000000000011)
#define DERTagContextPrimitive(number) (UINT64_C(0x8000000000000000) + (number))
#define DERTagContextConstructed(number) (UINT64_C(0xA000000000000000) + (number))
#define DERTagPrivateConstructed(number) (UINT64_C(0xE000000000000000) + (number))

// The part of a tag word that is the tag number.
#define DERTagNumberMask UINT64_C(0x1FFFFFFFFFFFFFFF)

// One decoded item: its tag and a view of its content octets (without identifier and length octets).
typedef struct DERDecodedInfo {
    DERTag tag;
    DERItem content;
} DERDecodedInfo;

// A cursor over the items of a constructed item's content: the position of the next item and one past the last octet.
typedef struct DERSequence {
    const uint8_t* next;
    const uint8_t* end;
} DERSequence;

// Options of a DERItemSpec, combined by OR.
enum {
    // Decoding: the item may be missing. Encoding: an item of length 0 is left out.
    DEROptionOptional = 0x0001,
    // Decoding: the row matches an item of any tag.
    DEROptionAnyTag = 0x0002,
    // Decoding: the matched item is consumed but not stored.
    DEROptionSkip = 0x0004,
    // Decoding: identifier and length octets are stored along with the content.
    DEROptionSaveDER = 0x0008,
    // Encoding: a 0x00 octet goes before a content whose first octet has bit 7 set, so that the INTEGER is not
    // negative.
    DEROptionSignedInteger = 0x0100,
    // Encoding: the item is a complete encoding already and is copied as it stands; the row's tag is not written.
    DEROptionWriteDER = 0x0200
};

// One row of an item-spec table, which describes the items of a SEQUENCE in order. `offset` is the place of the item's
// DERItem in the record that the table fills or reads.
typedef struct DERItemSpec {
    uint64_t offset;
    DERTag tag;
    uint16_t options;
} DERItemSpec;

// Result of the operations of the codec and of the decoders built on it. The values are fixed; 4 is not used. Callbacks
// and the decoders above may return any other 32-bit value too, which C++ allows only for a type of fixed width.
#ifdef __cplusplus
enum DERReturn : uint32_t {
#else
typedef uint32_t DERReturn;
enum {
#endif
    DERSuccess = 0,
    // No further item in the sequence. The regular end of a walk, not an error.
    DEREndOfSequence = 1,
    // An item's tag is not the one that the caller or the table asks for.
    DERUnexpectedTag = 2,
    // Malformed identifier, length or content octets, or octets after the last item.
    DERDecodeError = 3,
    // The sequence ended before a row that is not optional was matched.
    DERIncompleteSequence = 5,
    // An argument is missing.
    DERParamError = 6,
    // A value does not fit: an INTEGER is too large, an offset lies beyond the record, or the output buffer is too
    // small.
    DERBufferOverflow = 7
};

// Why an item or a SEQUENCE was refused.
typedef enum DERFault {
    DERFaultNone,
    // An item's header, or an item that is not all there (X.690 8.1.2.4, 10.1).
    DERFaultHeaderCutShort,
    DERFaultTagLeadingZero,
    DERFaultTagForm,   // a number that fits one octet is written in the long form
    DERFaultTagNumber, // does not fit 61 bits
    DERFaultLengthIndefinite,
    DERFaultLengthOctets, // more than 8 of them
    DERFaultLengthForm,   // not the shortest
    DERFaultContentCutShort,
    // What an operation or a table of item specs asks for.
    DERFaultNoSequence, // an item of another tag
    DERFaultTag,        // an item of another tag than the row's
    DERFaultMissing,    // the content ends before the row
    DERFaultExcess,     // an item behind the last one that a row takes
    DERFaultRecord      // the record has no place for the row
} DERFault;

// What an operation refused, and where. `place` and `item` point into the input, or one past its end.
typedef struct DERRefusal {
    DERFault fault;
    uint16_t row;         // of the table: the first that is not optional and was not matched, or that has no place
    const uint8_t* place; // the octet at fault
    const uint8_t* item;  // the start of the item that it belongs to
    DERTag tag;           // of that item, when it is its tag that is refused
    DERTag expected;      // the row's, when it is not any
} DERRefusal;

#ifdef __cplusplus
}
#endif

#endif
