#include "der/DERDecode.h"

#include <cstring>

namespace {

constexpr uint8_t tagNumberBits = 0x1F;
constexpr uint8_t moreBit = 0x80;
constexpr unsigned classAndFormShift = 56;
constexpr uint64_t unbounded = UINT64_MAX;

constexpr DERTag tagWord(uint8_t firstIdentifierOctet, uint64_t number) {
    return number | static_cast<uint64_t>(firstIdentifierOctet & ~tagNumberBits) << classAndFormShift;
}

// The octets of an item that are not read yet.
struct Reader {
    const uint8_t* next;
    const uint8_t* end;
};

uint64_t leftOf(const Reader& reader) {
    return static_cast<uint64_t>(reader.end - reader.next);
}

// The readers of a header's parts give out what is wrong, and then leave the reader at the octet at fault.

// Reads the digits of a high tag number (X.690 8.1.2.4). Every octet read leaves at least one for the length, so that
// no check is needed before the first length octet.
inline DERFault readHighTagNumber(Reader* reader, uint64_t* number) {
    constexpr uint64_t mostDigits = 9; // a tenth would take any number beyond the largest
    constexpr uint64_t codeDigits = 5;
    constexpr uint8_t leadingZeroDigit = moreBit;
    constexpr uint8_t lowestHighNumber = 31;
    const uint8_t* next = reader->next;
    if (*next == leadingZeroDigit)
        return DERFaultTagLeadingZero;
    if (*next < lowestHighNumber)
        return DERFaultTagForm;
    // Containers are full of tags that spell four characters, which take five digits. Read at fixed places, they let
    // the next item's place be known sooner than a loop does.
    constexpr uint32_t fourMoreBits = 0x80808080;
    uint32_t four = 0;
    if (leftOf(*reader) > codeDigits)
        std::memcpy(&four, next, sizeof four);
    if ((four & fourMoreBits) == fourMoreBits && next[4] < moreBit) {
        *number = (next[0] & 0x7FULL) << 28 | (next[1] & 0x7FU) << 21 | (next[2] & 0x7FU) << 14 |
                  (next[3] & 0x7FU) << 7 | next[4];
        reader->next += codeDigits;
        return DERFaultNone;
    }
    const bool isRoomy = leftOf(*reader) > mostDigits;
    const uint8_t* const limit = isRoomy ? next + mostDigits : reader->end - 1;
    uint64_t value = 0;
    uint8_t digit = moreBit;
    while ((digit & moreBit) != 0) {
        if (next == limit) {
            reader->next = next;
            return isRoomy ? DERFaultTagNumber : DERFaultHeaderCutShort;
        }
        digit = *next++;
        value = value << 7 | (digit & 0x7FU);
    }
    *number = value;
    if (value > DERTagNumberMask) {
        reader->next = next - 1;
        return DERFaultTagNumber;
    }
    reader->next = next;
    return DERFaultNone;
}

// Reads the identifier octets into a tag word. At least two octets are left.
inline DERFault readTag(Reader* reader, DERTag* tag) {
    const uint8_t first = *reader->next++;
    uint64_t number = first & tagNumberBits;
    if (number == tagNumberBits)
        if (const DERFault fault = readHighTagNumber(reader, &number); fault != DERFaultNone)
            return fault;
    *tag = tagWord(first, number);
    return DERFaultNone;
}

// Reads the length octets: definite and as short as can be (X.690 10.1). At least one octet is left.
inline DERFault readLength(Reader* reader, uint64_t* length) {
    const uint8_t* next = reader->next;
    const uint8_t first = *next++;
    uint64_t value = first;
    if ((first & moreBit) != 0) {
        const uint64_t count = first & 0x7FU;
        if (count == 0)
            return DERFaultLengthIndefinite;
        if (count > sizeof(uint64_t))
            return DERFaultLengthOctets;
        if (count > static_cast<uint64_t>(reader->end - next))
            return DERFaultHeaderCutShort;
        value = 0;
        const uint8_t leading = *next;
        for (const uint8_t* const end = next + count; next != end; ++next)
            value = value << 8 | *next;
        if (leading == 0 || value <= 0x7F)
            return DERFaultLengthForm;
    }
    *length = value;
    reader->next = next;
    return DERFaultNone;
}

inline void explain(DERRefusal* refusal, DERFault fault, const uint8_t* place, const uint8_t* item) {
    if (refusal != nullptr)
        *refusal = {fault, 0, place, item, 0, 0};
}

// Decodes the header of the item at the start of `der`. The content in *decoded starts behind it and has the declared
// length, which the caller compares with *left, the number of octets that are there.
inline DERReturn decodeHeader(DERItem der, DERDecodedInfo* decoded, uint64_t* left, DERRefusal* refusal) {
    Reader reader = {der.data, der.data + der.length};
    DERFault fault = DERFaultHeaderCutShort;
    if (der.length >= 2) {
        fault = readTag(&reader, &decoded->tag);
        if (fault == DERFaultNone)
            fault = readLength(&reader, &decoded->content.length);
    }
    if (fault != DERFaultNone) {
        explain(refusal, fault, fault == DERFaultHeaderCutShort ? reader.end : reader.next, der.data);
        return DERDecodeError;
    }
    decoded->content.data = reader.next;
    *left = leftOf(reader);
    return DERSuccess;
}

// The short path: nearly every item has one identifier octet and one length octet and lies inside its surroundings.
// Decodes such an item; says false, and refuses nothing, for any other.
inline bool decodeShortItem(DERItem der, DERDecodedInfo* decoded) {
    if (der.length < 2)
        return false;
    const uint8_t identifier = der.data[0];
    const uint8_t length = der.data[1];
    if ((identifier & tagNumberBits) == tagNumberBits || (length & moreBit) != 0 || length > der.length - 2)
        return false;
    decoded->tag = tagWord(identifier, identifier & tagNumberBits);
    decoded->content = {der.data + 2, length};
    return true;
}

// Within a walk, kept from a call of its own, which would cost as much again.
[[gnu::always_inline]] inline DERReturn decodeItemOfAnyForm(DERItem der, DERDecodedInfo* decoded, DERRefusal* refusal) {
    uint64_t left = 0;
    if (const DERReturn result = decodeHeader(der, decoded, &left, refusal); result != DERSuccess)
        return result;
    if (decoded->content.length <= left)
        return DERSuccess;
    explain(refusal, DERFaultContentCutShort, der.data + der.length, der.data);
    return DERDecodeError;
}

// Decodes the item at the start of `der`, all of which must be there.
inline DERReturn decodeWholeItem(DERItem der, DERDecodedInfo* decoded, DERRefusal* refusal = nullptr) {
    return decodeShortItem(der, decoded) ? DERSuccess : decodeItemOfAnyForm(der, decoded, refusal);
}

inline DERReturn decodeNext(DERSequence* sequence, DERDecodedInfo* decoded, DERRefusal* refusal = nullptr) {
    if (sequence->next >= sequence->end)
        return DEREndOfSequence;
    const DERItem rest = {sequence->next, static_cast<uint64_t>(sequence->end - sequence->next)};
    const DERReturn result = decodeWholeItem(rest, decoded, refusal);
    if (result == DERSuccess)
        sequence->next = decoded->content.data + decoded->content.length;
    return result;
}

inline DERSequence walkOf(DERItem content) {
    return {content.data, content.data + content.length};
}

bool isSequenceOrSet(DERTag tag) {
    return (tag & ~UINT64_C(1)) == DERTagSequence;
}

bool hasOption(const DERItemSpec& row, unsigned option) {
    return (row.options & option) != 0;
}

bool allOptional(const DERItemSpec* row, const DERItemSpec* end) {
    while (row != end && hasOption(*row, DEROptionOptional))
        ++row;
    return row == end;
}

// The first row from `row` on that takes an item of `tag`, or null when a row that is not optional stands before it or
// there is none.
const DERItemSpec* matchingRow(const DERItemSpec* row, const DERItemSpec* end, DERTag tag) {
    for (; row != end; ++row) {
        if (row->tag == tag || hasOption(*row, DEROptionAnyTag))
            return row;
        if (!hasOption(*row, DEROptionOptional))
            return nullptr;
    }
    return nullptr;
}

// Stores the item of the given encoding and content at its row's place.
DERReturn storeItem(const DERItemSpec& row, const uint8_t* encoding, DERItem item, void* dest, uint64_t destSize) {
    if (destSize < sizeof item || row.offset > destSize - sizeof item)
        return DERBufferOverflow;
    if (hasOption(row, DEROptionSaveDER)) {
        item.length += static_cast<uint64_t>(item.data - encoding);
        item.data = encoding;
    }
    // Records are packed by the caller's will, not ours: nothing promises that the place is aligned.
    std::memcpy(static_cast<uint8_t*>(dest) + row.offset, &item, sizeof item);
    return DERSuccess;
}

struct Rows {
    const DERItemSpec* first;
    const DERItemSpec* end;
};

// Passes `status` on. `row` is the first that was not matched, or the one that the record has no place for, `item` the
// one at hand.
DERReturn refuse(DERReturn status, DERFault fault, const Rows& rows, const DERItemSpec* row, const uint8_t* item,
                 DERTag tag, DERRefusal* refusal) {
    if (refusal == nullptr)
        return status;
    while (fault != DERFaultRecord && row != rows.end && hasOption(*row, DEROptionOptional))
        ++row;
    if (fault == DERFaultTag && row == rows.end)
        fault = DERFaultExcess;
    const bool isOfOneTag = row != rows.end && !hasOption(*row, DEROptionAnyTag);
    *refusal = {fault, static_cast<uint16_t>(row - rows.first), item, item, tag, isOfOneTag ? row->tag : 0};
    return status;
}

// Sees to it that nothing follows the item of the last row.
DERReturn checkEnd(DERSequence sequence, const Rows& rows, DERRefusal* refusal) {
    if (sequence.next == sequence.end)
        return DERSuccess;
    const uint8_t* const item = sequence.next;
    DERDecodedInfo decoded;
    if (refusal != nullptr && decodeNext(&sequence, &decoded, refusal) == DERSuccess)
        refuse(DERDecodeError, DERFaultExcess, rows, rows.end, item, decoded.tag, refusal);
    return DERDecodeError;
}

inline DERReturn parseContent(const DERItem& content, const Rows& rows, void* dest, uint64_t destSize,
                              uint64_t sizeToZero, DERRefusal* refusal) {
    DERSequence sequence = walkOf(content);
    if (sizeToZero != 0)
        std::memset(dest, 0, static_cast<size_t>(sizeToZero));
    for (const DERItemSpec* row = rows.first; row != rows.end; ++row) {
        const uint8_t* const encoding = sequence.next;
        DERDecodedInfo decoded;
        const DERReturn result = decodeNext(&sequence, &decoded, refusal);
        if (result == DEREndOfSequence)
            return allOptional(row, rows.end)
                       ? DERSuccess
                       : refuse(DERIncompleteSequence, DERFaultMissing, rows, row, encoding, 0, refusal);
        if (result != DERSuccess)
            return result;
        const DERItemSpec* const match = matchingRow(row, rows.end, decoded.tag);
        if (match == nullptr)
            return refuse(DERUnexpectedTag, DERFaultTag, rows, row, encoding, decoded.tag, refusal);
        row = match;
        if (hasOption(*row, DEROptionSkip))
            continue;
        if (const DERReturn stored = storeItem(*row, encoding, decoded.content, dest, destSize); stored != DERSuccess)
            return refuse(stored, DERFaultRecord, rows, row, encoding, decoded.tag, refusal);
    }
    return checkEnd(sequence, rows, refusal);
}

} // namespace

DERReturn DERDecodeItem(const DERItem* der, DERDecodedInfo* decoded) {
    return decodeWholeItem(*der, decoded);
}

DERReturn DERDecodeItemExplained(const DERItem* der, DERDecodedInfo* decoded, DERRefusal* refusal) {
    return decodeWholeItem(*der, decoded, refusal);
}

DERReturn DERDecodeItemPartialBufferGetLength(const DERItem* der, DERDecodedInfo* decoded, uint64_t* declaredLength) {
    if (declaredLength == nullptr)
        return decodeWholeItem(*der, decoded);
    uint64_t left = 0;
    if (const DERReturn result = decodeHeader(*der, decoded, &left, nullptr); result != DERSuccess)
        return result;
    *declaredLength = decoded->content.length;
    if (decoded->content.length > left)
        decoded->content.length = left;
    return DERSuccess;
}

DERReturn DERDecodeItemPartialBuffer(const DERItem* der, DERDecodedInfo* decoded, bool allowPartial) {
    uint64_t left = 0;
    if (const DERReturn result = decodeHeader(*der, decoded, &left, nullptr); result != DERSuccess)
        return result;
    if (!allowPartial && decoded->content.length > left)
        return DERDecodeError;
    // A length that is handed out unclipped must at least be one that a pointer difference can hold.
    const uint64_t toTopOfMemory = UINTPTR_MAX - reinterpret_cast<uintptr_t>(decoded->content.data);
    const uint64_t largest = toTopOfMemory < INT64_MAX ? toTopOfMemory : INT64_MAX;
    return decoded->content.length > largest ? DERBufferOverflow : DERSuccess;
}

DERReturn DERDecodeSeqInit(const DERItem* der, DERTag* tagOut, DERSequence* sequence) {
    DERDecodedInfo decoded;
    if (const DERReturn result = decodeWholeItem(*der, &decoded); result != DERSuccess)
        return result;
    *tagOut = decoded.tag;
    if (!isSequenceOrSet(decoded.tag))
        return DERUnexpectedTag;
    *sequence = walkOf(decoded.content);
    return DERSuccess;
}

DERReturn DERDecodeSeqContentInit(const DERItem* content, DERSequence* sequence) {
    *sequence = walkOf(*content);
    return DERSuccess;
}

DERReturn DERDecodeSeqNext(DERSequence* sequence, DERDecodedInfo* decoded) {
    return decodeNext(sequence, decoded);
}

DERReturn DERDecodeSequenceWithBlock(const DERItem* der, DERDecodeSequenceCallback callback, void* context) {
    DERDecodedInfo decoded;
    if (const DERReturn result = decodeWholeItem(*der, &decoded); result != DERSuccess)
        return result;
    if (!isSequenceOrSet(decoded.tag))
        return DERUnexpectedTag;
    return DERDecodeSequenceContentWithBlock(&decoded.content, callback, context);
}

DERReturn DERDecodeSequenceContentWithBlock(const DERItem* content, DERDecodeSequenceCallback callback, void* context) {
    DERSequence sequence = walkOf(*content);
    DERDecodedInfo decoded;
    bool stop = false;
    DERReturn result = DERSuccess;
    while (result == DERSuccess && !stop) {
        result = decodeNext(&sequence, &decoded);
        if (result == DERSuccess)
            result = callback(&decoded, &stop, context);
    }
    return result == DEREndOfSequence ? DERSuccess : result;
}

DERReturn DERParseSequenceToObject(const DERItem* der, uint16_t numItems, const DERItemSpec* itemSpecs, void* dest,
                                   uint64_t destSize, uint64_t sizeToZero) {
    return DERParseSequenceExplained(der, numItems, itemSpecs, dest, destSize, sizeToZero, nullptr);
}

DERReturn DERParseSequenceContentToObject(const DERItem* content, uint16_t numItems, const DERItemSpec* itemSpecs,
                                          void* dest, uint64_t destSize, uint64_t sizeToZero) {
    return parseContent(*content, {itemSpecs, itemSpecs + numItems}, dest, destSize, sizeToZero, nullptr);
}

DERReturn DERParseSequenceExplained(const DERItem* der, uint16_t numItems, const DERItemSpec* itemSpecs, void* dest,
                                    uint64_t destSize, uint64_t sizeToZero, DERRefusal* refusal) {
    DERDecodedInfo decoded;
    if (const DERReturn result = decodeWholeItem(*der, &decoded, refusal); result != DERSuccess)
        return result;
    if (decoded.tag == DERTagSequence)
        return parseContent(decoded.content, {itemSpecs, itemSpecs + numItems}, dest, destSize, sizeToZero, refusal);
    if (refusal != nullptr)
        *refusal = {DERFaultNoSequence, 0, der->data, der->data, decoded.tag, DERTagSequence};
    return DERUnexpectedTag;
}

DERReturn DERParseSequenceContentExplained(const DERItem* content, uint16_t numItems, const DERItemSpec* itemSpecs,
                                           void* dest, uint64_t destSize, uint64_t sizeToZero, DERRefusal* refusal) {
    return parseContent(*content, {itemSpecs, itemSpecs + numItems}, dest, destSize, sizeToZero, refusal);
}

DERReturn DERParseSequence(const DERItem* der, uint16_t numItems, const DERItemSpec* itemSpecs, void* dest,
                           uint64_t sizeToZero) {
    return DERParseSequenceToObject(der, numItems, itemSpecs, dest, unbounded, sizeToZero);
}

DERReturn DERParseSequenceContent(const DERItem* content, uint16_t numItems, const DERItemSpec* itemSpecs, void* dest,
                                  uint64_t sizeToZero) {
    return DERParseSequenceContentToObject(content, numItems, itemSpecs, dest, unbounded, sizeToZero);
}

DERReturn DERParseInteger64(const DERItem* item, uint64_t* value) {
    const uint8_t* octets = item->data;
    const uint64_t length = item->length;
    if (length == 0 || (octets[0] & 0x80) != 0)
        return DERDecodeError;
    const bool leadingZero = octets[0] == 0 && length > 1;
    // A zero octet in front only keeps the next one from reading as negative (X.690 8.3.2).
    if (leadingZero && (octets[1] & 0x80) == 0)
        return DERDecodeError;
    if (length > sizeof *value + (leadingZero ? 1 : 0))
        return DERBufferOverflow;
    uint64_t number = 0;
    for (uint64_t i = 0; i < length; ++i)
        number = number << 8 | octets[i];
    *value = number;
    return DERSuccess;
}

DERReturn DERParseInteger(const DERItem* item, uint32_t* value) {
    uint64_t number = 0;
    if (const DERReturn result = DERParseInteger64(item, &number); result != DERSuccess)
        return result;
    if (number > UINT32_MAX)
        return DERBufferOverflow;
    *value = static_cast<uint32_t>(number);
    return DERSuccess;
}

DERReturn DERParseBoolean(const DERItem* item, bool* value) {
    if (item->length != 1 || (item->data[0] != 0x00 && item->data[0] != 0xFF))
        return DERDecodeError;
    *value = item->data[0] != 0;
    return DERSuccess;
}

DERReturn DERParseBooleanWithDefault(const DERItem* item, bool defaultValue, bool* value) {
    if (item->length != 0)
        return DERParseBoolean(item, value);
    *value = defaultValue;
    return DERSuccess;
}

DERReturn DERParseBitString(const DERItem* item, DERItem* bits, uint8_t* unusedBits) {
    const DERItem content = *item;
    *unusedBits = 0;
    *bits = {nullptr, 0};
    if (content.length == 0)
        return DERDecodeError;
    const uint8_t unused = content.data[0];
    *unusedBits = unused;
    if (content.length == 1)
        return unused == 0 ? DERSuccess : DERDecodeError;
    if (unused > 7 || (content.data[content.length - 1] & (0xFF >> (8 - unused))) != 0)
        return DERDecodeError;
    *bits = {content.data + 1, content.length - 1};
    return DERSuccess;
}

bool DEROidCompare(const DERItem* oid1, const DERItem* oid2) {
    if (oid1 == nullptr || oid2 == nullptr || oid1->data == nullptr || oid2->data == nullptr)
        return false;
    return oid1->length == oid2->length && std::memcmp(oid1->data, oid2->data, static_cast<size_t>(oid1->length)) == 0;
}
