#include "img4/Img4Internal.h"

#include <cstddef>

using namespace img4;

namespace {

bool isNameOf(const DERItem& name, DERTag tag) {
    const uint32_t code = static_cast<uint32_t>(tag);
    return tag == Img4PropertyTag(code) && equalsFourCC(name, code);
}

// Why an item of a property could not be decoded, or is not there at all.
DERReturn refuseItem(DERReturn result, DERReturn missing, uint16_t row, const DERSequence& elements,
                     Img4Refusal* refusal) {
    DERRefusal why = {DERFaultMissing, row, elements.next, elements.next, 0, 0};
    const DERItem rest = {elements.next, static_cast<uint64_t>(elements.end - elements.next)};
    DERDecodedInfo decoded;
    if (result == DEREndOfSequence)
        result = missing;
    else if (refusal != nullptr)
        DERDecodeItemExplained(&rest, &decoded, &why);
    return refuse(refusal, result, why);
}

// Decodes the property in `item`, whose name must be that of *tag unless `tag` is null.
DERReturn decodeProperty(const DERItem& item, const DERTag* tag, Img4Property* property,
                         Img4Refusal* refusal = nullptr) {
    DERDecodedInfo whole;
    DERDecodedInfo name;
    DERDecodedInfo value;
    DERSequence elements;
    if (const DERReturn result = DERDecodeItem(&item, &whole); result != DERSuccess)
        return refuseItem(result, result, 0, {item.data, item.data + item.length}, refusal);
    if (whole.tag != DERTagSequence)
        return refuse(refusal, DERUnexpectedTag,
                      {DERFaultNoSequence, 0, item.data, item.data, whole.tag, DERTagSequence});
    DERDecodeSeqContentInit(&whole.content, &elements);
    if (const DERReturn result = DERDecodeSeqNext(&elements, &name); result != DERSuccess)
        return refuseItem(result, DERUnexpectedTag, 0, elements, refusal);
    if (name.tag != DERTagIA5String || (tag != nullptr && !isNameOf(name.content, *tag)))
        return refuse(refusal, DERUnexpectedTag, Img4FaultName, whole.content.data,
                      name.tag == DERTagIA5String ? name.content : DERItem{});
    if (const DERReturn result = DERDecodeSeqNext(&elements, &value); result != DERSuccess)
        return refuseItem(result, DERIncompleteSequence, 1, elements, refusal);
    if (elements.next != elements.end)
        return refuse(refusal, DERUnexpectedTag, {DERFaultExcess, 2, elements.next, elements.next, 0, 0});
    if (elements.end != item.data + item.length)
        return refuse(refusal, DERBufferOverflow, Img4FaultLength, elements.end);
    *property = {name.content, tag != nullptr ? *tag : 0, value.content, value.tag};
    return DERSuccess;
}

// The value of the single property `item`, which must be named `name` and of the type `type`.
template <typename T>
DERReturn getPropertyValue(const DERItem* item, uint32_t name, DERTag type, Parser<T> parse, T* value) {
    return getValue(value, parse, [&](Img4Property* property) {
        const DERReturn result = DERImg4DecodeProperty(item, Img4PropertyTag(name), property);
        return result == DERSuccess && property->valueTag != type ? DERUnexpectedTag : result;
    });
}

} // namespace

bool img4::equalsFourCC(const DERItem& text, uint32_t code) {
    uint32_t spelled = 0;
    return text.length == sizeof code && DERParseInteger(&text, &spelled) == DERSuccess && spelled == code;
}

DERReturn img4::findFirst(const DERItem& content, DERTag tag, DERItem* found, const uint8_t** end) {
    DERSequence elements;
    DERDecodedInfo element;
    DERDecodeSeqContentInit(&content, &elements);
    DERReturn result = DERDecodeSeqNext(&elements, &element);
    while (result == DERSuccess && element.tag != tag)
        result = DERDecodeSeqNext(&elements, &element);
    if (result == DERSuccess)
        *found = element.content;
    else if (end != nullptr)
        *end = elements.next;
    return result;
}

DERReturn img4::refuseSearch(DERReturn result, const DERItem& dictionary, const uint8_t* end, Img4Refusal* refusal) {
    if (result == DEREndOfSequence)
        return refuse(refusal, result, Img4FaultAbsent, dictionary.data);
    if (refusal != nullptr)
        refusal->tag = 0;
    return refuseItem(result, result, 0, {end, dictionary.data + dictionary.length}, refusal);
}

DERReturn img4::findProperty(const DERItem& dictionary, DERTag tag, DERTag valueType, Img4Property* property,
                             Img4Refusal* refusal) {
    struct NameAndValue {
        DERItem name;
        DERItem value;
    };
    DERItem element;
    const uint8_t* end = nullptr;
    if (refusal != nullptr)
        refusal->tag = tag;
    if (const DERReturn result = findFirst(dictionary, tag, &element, &end); result != DERSuccess)
        return refuseSearch(result, dictionary, end, refusal);
    const DERItemSpec specs[] = {
        {offsetof(NameAndValue, name), DERTagIA5String, 0},
        {offsetof(NameAndValue, value), valueType, 0},
    };
    NameAndValue fields;
    DERReturn result = parseSequence(element, specs, &fields, refusal);
    if (refusal != nullptr && result == DERUnexpectedTag && refusal->encoding.fault == DERFaultTag)
        refusal->fault = refusal->encoding.row == 0 ? Img4FaultName : Img4FaultValueType;
    if (result == DERSuccess && !isNameOf(fields.name, tag))
        result = refuse(refusal, DERUnexpectedTag, Img4FaultName, fields.name.data, fields.name);
    if (result == DERSuccess)
        *property = {fields.name, tag, fields.value, valueType};
    return result;
}

DERReturn DERImg4DecodeFindProperty(const DERItem* dictionary, DERTag tag, DERTag valueType, Img4Property* property) {
    return dictionary != nullptr && property != nullptr ? findProperty(*dictionary, tag, valueType, property)
                                                        : DERParamError;
}

DERReturn DERImg4DecodeProperty(const DERItem* item, DERTag tag, Img4Property* property) {
    return item != nullptr && property != nullptr ? decodeProperty(*item, &tag, property) : DERParamError;
}

DERReturn DERImg4DecodePropertyExplained(const DERItem* item, DERTag tag, Img4Property* property,
                                         Img4Refusal* refusal) {
    if (item == nullptr || property == nullptr)
        return DERParamError;
    if (refusal != nullptr)
        *refusal = {Img4SubjectProperty, Img4FaultNone, DERSuccess, nullptr, tag, {}, {}};
    const DERReturn result = decodeProperty(*item, &tag, property, refusal);
    if (refusal != nullptr && result != DERSuccess && tag != Img4PropertyTag(tag))
        *refusal = {Img4SubjectProperty, Img4FaultTag, result, item->data, tag, {}, {}};
    return result;
}

DERReturn Img4DecodeGetPropertyBoolean(const DERItem* item, uint32_t name, bool* value) {
    return getPropertyValue(item, name, DERTagBoolean, DERParseBoolean, value);
}

DERReturn Img4DecodeGetPropertyInteger(const DERItem* item, uint32_t name, uint32_t* value) {
    return clearOnFailure(getPropertyValue(item, name, DERTagInteger, DERParseInteger, value), value);
}

DERReturn Img4DecodeGetPropertyInteger64(const DERItem* item, uint32_t name, uint64_t* value) {
    return clearOnFailure(getPropertyValue(item, name, DERTagInteger, DERParseInteger64, value), value);
}

DERReturn Img4DecodeGetPropertyData(const DERItem* item, uint32_t name, DERItem* value) {
    return clearOnFailure(getPropertyValue(item, name, DERTagOctetString, parseData, value), value);
}

DERReturn Img4DecodeGetPayloadVersionPropertyString(const DERItem* property, DERTag tag, DERItem* value) {
    Img4Property outer;
    Img4Property inner;
    DERItem element;
    if (property == nullptr || value == nullptr)
        return DERParamError;
    if (const DERReturn result = decodeProperty(*property, nullptr, &outer); result != DERSuccess)
        return result;
    if (outer.valueTag != DERTagSet && outer.valueTag != DERTagSequence)
        return DERUnexpectedTag;
    DERReturn result = findFirst(outer.value, tag, &element);
    if (result == DERSuccess)
        result = decodeProperty(element, &tag, &inner);
    if (result == DERSuccess)
        *value = inner.value;
    return result;
}
