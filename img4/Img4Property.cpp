#include "img4/Img4Internal.h"

#include <cstddef>

using namespace img4;

namespace {

bool isNameOf(const DERItem& name, DERTag tag) {
    const uint32_t code = static_cast<uint32_t>(tag);
    return tag == Img4PropertyTag(code) && equalsFourCC(name, code);
}

// Decodes the property in `item`, whose name must be that of *tag unless `tag` is null.
DERReturn decodeProperty(const DERItem& item, const DERTag* tag, Img4Property* property) {
    DERDecodedInfo whole;
    DERDecodedInfo name;
    DERDecodedInfo value;
    DERSequence elements;
    if (const DERReturn result = DERDecodeItem(&item, &whole); result != DERSuccess)
        return result;
    if (whole.tag != DERTagSequence)
        return DERUnexpectedTag;
    DERDecodeSeqContentInit(&whole.content, &elements);
    if (const DERReturn result = DERDecodeSeqNext(&elements, &name); result != DERSuccess)
        return result == DEREndOfSequence ? DERUnexpectedTag : result;
    if (name.tag != DERTagIA5String || (tag != nullptr && !isNameOf(name.content, *tag)))
        return DERUnexpectedTag;
    if (const DERReturn result = DERDecodeSeqNext(&elements, &value); result != DERSuccess)
        return result == DEREndOfSequence ? DERIncompleteSequence : result;
    if (elements.next != elements.end)
        return DERUnexpectedTag;
    if (elements.end != item.data + item.length)
        return DERBufferOverflow;
    *property = {name.content, tag != nullptr ? *tag : 0, value.content, value.tag};
    return DERSuccess;
}

// The value of the single property `item`, which must be named `name` and of the type `type`.
template <typename T>
DERReturn getPropertyValue(const DERItem* item, uint32_t name, DERTag type, Parser<T> parse, T* value) {
    Img4Property property;
    if (value == nullptr)
        return DERParamError;
    if (const DERReturn result = DERImg4DecodeProperty(item, Img4PropertyTag(name), &property); result != DERSuccess)
        return result;
    return property.valueTag == type ? parse(&property.value, value) : DERUnexpectedTag;
}

} // namespace

bool img4::equalsFourCC(const DERItem& text, uint32_t code) {
    uint32_t spelled = 0;
    return text.length == sizeof code && DERParseInteger(&text, &spelled) == DERSuccess && spelled == code;
}

DERReturn img4::findFirst(const DERItem& content, DERTag tag, DERItem* found) {
    DERSequence elements;
    DERDecodedInfo element;
    DERDecodeSeqContentInit(&content, &elements);
    DERReturn result = DERDecodeSeqNext(&elements, &element);
    while (result == DERSuccess && element.tag != tag)
        result = DERDecodeSeqNext(&elements, &element);
    if (result == DERSuccess)
        *found = element.content;
    return result;
}

DERReturn DERImg4DecodeFindProperty(const DERItem* dictionary, DERTag tag, DERTag valueType, Img4Property* property) {
    struct NameAndValue {
        DERItem name;
        DERItem value;
    };
    if (dictionary == nullptr || property == nullptr)
        return DERParamError;
    DERItem element;
    if (const DERReturn result = findFirst(*dictionary, tag, &element); result != DERSuccess)
        return result;
    const DERItemSpec specs[] = {
        {offsetof(NameAndValue, name), DERTagIA5String, 0},
        {offsetof(NameAndValue, value), valueType, 0},
    };
    NameAndValue fields;
    if (const DERReturn result = DERParseSequence(&element, std::size(specs), specs, &fields, 0); result != DERSuccess)
        return result;
    if (!isNameOf(fields.name, tag))
        return DERUnexpectedTag;
    *property = {fields.name, tag, fields.value, valueType};
    return DERSuccess;
}

DERReturn DERImg4DecodeProperty(const DERItem* item, DERTag tag, Img4Property* property) {
    return item != nullptr && property != nullptr ? decodeProperty(*item, &tag, property) : DERParamError;
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
    if (const DERReturn result = findFirst(outer.value, tag, &element); result != DERSuccess)
        return result;
    if (const DERReturn result = decodeProperty(element, &tag, &inner); result != DERSuccess)
        return result;
    *value = inner.value;
    return DERSuccess;
}
