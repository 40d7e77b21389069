#include "img4/Img4Internal.h"

#include <cstddef>

using namespace img4;

namespace {

bool isPayloadPresent(const Img4Record& record) {
    return hasContent(record.payload.data);
}

// What every query of the payload begins with.
DERReturn checkPayload(const Img4Record* record, const void* out) {
    if (record == nullptr || out == nullptr)
        return DERParamError;
    return isPayloadPresent(*record) ? DERSuccess : DEREndOfSequence;
}

DERReturn getPayloadItem(const Img4Record* record, DERItem Img4PayloadRecord::*field, DERItem* item) {
    const DERReturn result = checkPayload(record, item);
    if (result == DERSuccess)
        *item = record->payload.*field;
    return clearOnFailure(result, item);
}

DERReturn payloadItemExists(const Img4Record* record, DERItem Img4PayloadRecord::*field, bool* exists) {
    const DERReturn result = checkPayload(record, exists);
    if (result == DERSuccess)
        *exists = hasContent(record->payload.*field);
    return clearOnFailure(result, exists);
}

DERReturn parseCompression(const Img4Record& record, uint32_t* algorithm, uint32_t* uncompressedSize) {
    if (!hasContent(record.payload.compression))
        return DEREndOfSequence;
    Img4Compression fields;
    DERReturn result = parseContent(record.payload.compression, DERImg4CompressionItemSpecs, &fields);
    if (result == DERSuccess)
        result = DERParseInteger(&fields.algorithm, algorithm);
    return result == DERSuccess ? DERParseInteger(&fields.uncompressedSize, uncompressedSize) : result;
}

// The content of the payload's [0], absent when there is none.
DERReturn parseProperties(const Img4Record& record, DERItem* properties) {
    Img4PayloadWithProperties fields = {};
    const DERReturn result = parseSequence(record.payloadRaw, DERImg4PayloadWithPropertiesItemSpecs, &fields);
    *properties = fields.properties;
    return result;
}

DERReturn requireProperties(const Img4Record& record, DERItem* properties) {
    const DERReturn result = parseProperties(record, properties);
    return result == DERSuccess && !isPresent(*properties) ? DERParamError : result;
}

// The content of the SET that holds the properties.
DERReturn findPropertySet(const Img4Record& record, DERItem* set) {
    DERItem properties;
    DERItem sequence;
    DERReturn result = requireProperties(record, &properties);
    if (result == DERSuccess)
        result = findFirst(properties, DERTagSequence, &sequence);
    return result == DERSuccess ? findFirst(sequence, DERTagSet, set) : result;
}

template <typename T>
DERReturn getPropertyValue(const Img4Record* record, DERTag tag, DERTag type, Parser<T> parse, T* value) {
    return getValue(value, parse,
                    [&](Img4Property* property) { return Img4DecodePayloadProperty(record, tag, type, property); });
}

// Looks whether the element with the content `element` is a property named `name`. Anything else leaves *value absent;
// an error is returned only for an element in which no name can be found.
DERReturn matchProperty(const DERItem& element, uint32_t name, DERItem* value) {
    struct NameAndValue {
        DERItem name;
        DERItem value;
    };
    static const DERItemSpec specs[] = {
        {offsetof(NameAndValue, name), DERTagIA5String, 0},
        {offsetof(NameAndValue, value), 0, DEROptionAnyTag},
    };
    *value = {nullptr, 0};
    DERDecodedInfo inner;
    if (DERDecodeItem(&element, &inner) != DERSuccess)
        return DERSuccess;
    DERItem firstString;
    if (const DERReturn result = findFirst(inner.content, DERTagIA5String, &firstString); result != DERSuccess)
        return result;
    NameAndValue fields;
    if (equalsFourCC(firstString, name) && parseSequence(element, specs, &fields) == DERSuccess)
        *value = fields.value;
    return DERSuccess;
}

} // namespace

DERReturn Img4DecodePayloadExists(const Img4Record* record, bool* exists) {
    if (record == nullptr || exists == nullptr)
        return clearOnFailure(DERParamError, exists);
    *exists = isPayloadPresent(*record);
    return DERSuccess;
}

DERReturn Img4DecodeGetPayload(const Img4Record* record, DERItem* data) {
    return getPayloadItem(record, &Img4PayloadRecord::data, data);
}

DERReturn Img4DecodeGetPayloadType(const Img4Record* record, uint32_t* type) {
    const DERReturn result = checkPayload(record, type);
    return clearOnFailure(result == DERSuccess ? DERParseInteger(&record->payload.type, type) : result, type);
}

DERReturn Img4DecodeGetPayloadVersion(const Img4Record* record, DERItem* version) {
    return getPayloadItem(record, &Img4PayloadRecord::version, version);
}

DERReturn Img4DecodePayloadKeybagExists(const Img4Record* record, bool* exists) {
    return payloadItemExists(record, &Img4PayloadRecord::keybag, exists);
}

DERReturn Img4DecodeGetPayloadKeybag(const Img4Record* record, DERItem* keybag) {
    return getPayloadItem(record, &Img4PayloadRecord::keybag, keybag);
}

DERReturn Img4DecodePayloadCompressionInfoExists(const Img4Record* record, bool* exists) {
    return payloadItemExists(record, &Img4PayloadRecord::compression, exists);
}

DERReturn Img4DecodeGetPayloadCompressionInfo(const Img4Record* record, uint32_t* algorithm,
                                              uint32_t* uncompressedSize) {
    DERReturn result = algorithm != nullptr ? checkPayload(record, uncompressedSize) : DERParamError;
    if (result == DERSuccess)
        result = parseCompression(*record, algorithm, uncompressedSize);
    if (result == DERSuccess)
        return result;
    if (algorithm != nullptr)
        *algorithm = UINT32_MAX;
    if (uncompressedSize != nullptr)
        *uncompressedSize = UINT32_MAX;
    return result;
}

DERReturn Img4DecodePayloadPropertiesExists(const Img4Record* record, bool* exists) {
    DERItem properties;
    if (record == nullptr || exists == nullptr)
        return DERParamError;
    const DERReturn result = parseProperties(*record, &properties);
    if (result == DERSuccess)
        *exists = isPresent(properties);
    return result;
}

DERReturn Img4DecodeGetPayloadProperties(const Img4Record* record, DERItem* properties) {
    DERItem found;
    if (record == nullptr || properties == nullptr)
        return DERParamError;
    const DERReturn result = requireProperties(*record, &found);
    if (result == DERSuccess)
        *properties = found;
    return result;
}

DERReturn Img4DecodePayloadProperty(const Img4Record* record, DERTag tag, DERTag valueType, Img4Property* property) {
    DERItem set;
    if (record == nullptr || property == nullptr)
        return DERParamError;
    const DERReturn result = findPropertySet(*record, &set);
    return result == DERSuccess ? findProperty(set, tag, valueType, property) : result;
}

DERReturn Img4DecodeGetPayloadPropertiesBoolean(const Img4Record* record, DERTag tag, bool* value) {
    return getPropertyValue(record, tag, DERTagBoolean, DERParseBoolean, value);
}

DERReturn Img4DecodeGetPayloadPropertiesInteger(const Img4Record* record, DERTag tag, uint32_t* value) {
    return getPropertyValue(record, tag, DERTagInteger, DERParseInteger, value);
}

DERReturn Img4DecodeGetPayloadPropertiesInteger64(const Img4Record* record, DERTag tag, uint64_t* value) {
    return getPropertyValue(record, tag, DERTagInteger, DERParseInteger64, value);
}

DERReturn Img4DecodeGetPayloadPropertiesData(const Img4Record* record, DERTag tag, DERItem* value) {
    return getPropertyValue(record, tag, DERTagOctetString, parseData, value);
}

DERReturn Img4DecodePayloadPropertyExistsByTag(const Img4Record* record, DERTag tag, bool* exists) {
    DERItem set;
    DERItem element;
    if (record == nullptr || exists == nullptr)
        return DERParamError;
    if (const DERReturn result = findPropertySet(*record, &set); result != DERSuccess)
        return result;
    const DERReturn result = findFirst(set, tag, &element);
    if (result == DERSuccess || result == DEREndOfSequence)
        *exists = result == DERSuccess;
    return result;
}

DERReturn Img4DecodePayloadPropertiesFindItemWithTag(const DERItem* properties, uint32_t name, DERItem* value) {
    DERItem sequence;
    DERItem magic;
    DERItem set;
    if (properties == nullptr || value == nullptr || !isPresent(*properties))
        return DERParamError;
    if (const DERReturn result = findFirst(*properties, DERTagSequence, &sequence); result != DERSuccess)
        return result;
    if (sequence.length == 0)
        return DERUnexpectedTag;
    if (findFirst(sequence, DERTagIA5String, &magic) != DERSuccess || !equalsFourCC(magic, payloadPropertiesMagic))
        return DERParamError;
    if (const DERReturn result = findFirst(sequence, DERTagSet, &set); result != DERSuccess)
        return result;
    DERSequence elements;
    DERDecodedInfo element;
    DERDecodeSeqContentInit(&set, &elements);
    DERReturn result = DERDecodeSeqNext(&elements, &element);
    while (result == DERSuccess) {
        DERItem found;
        if (const DERReturn matched = matchProperty(element.content, name, &found); matched != DERSuccess)
            return matched;
        if (isPresent(found)) {
            if (found.length != 0)
                *value = found;
            return found.length != 0 ? DERSuccess : DERUnexpectedTag;
        }
        result = DERDecodeSeqNext(&elements, &element);
    }
    return result;
}
