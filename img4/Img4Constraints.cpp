#include "img4/Img4TrustInternal.h"

#include <cstring>

using namespace img4;

namespace {

constexpr DERTag objectPropertiesTag = Img4PropertyTag(Img4FourCC('O', 'B', 'J', 'P'));
constexpr DERTag measurementTag = Img4PropertyTag(Img4FourCC('m', 'a', 'n', 'x'));
constexpr DERTag mustBePresent = DERTagContextConstructed(0);
constexpr DERTag mustBeAbsent = DERTagContextConstructed(1);

// Judges the search for the constrained property, whose content is `found` when `search` is a success.
DERReturn judge(const Img4Property& constraint, const DERItem& required, DERReturn search, const DERItem& found) {
    switch (constraint.valueTag) {
    case DERTagBoolean:
    case DERTagInteger:
    case DERTagOctetString:
        if (search != DERSuccess)
            return search;
        return found.length == required.length &&
                       std::memcmp(found.data, required.data, static_cast<std::size_t>(found.length)) == 0
                   ? DERSuccess
                   : Img4Failure;
    case mustBePresent:
        return search;
    case mustBeAbsent:
        if (search == DERSuccess)
            return DERUnexpectedTag;
        return search == DEREndOfSequence ? DERSuccess : search;
    default:
        return DERUnexpectedTag;
    }
}

// Calls `check` for each element of the SET's content `set` until one fails.
template <typename Check>
DERReturn checkEach(const DERItem& set, Check check) {
    DERSequence rest;
    DERDecodedInfo element;
    DERDecodeSeqContentInit(&set, &rest);
    DERReturn result = DERDecodeSeqNext(&rest, &element);
    for (; result == DERSuccess; result = DERDecodeSeqNext(&rest, &element))
        if (const DERReturn checked = check(element); checked != DERSuccess)
            return checked;
    return result == DEREndOfSequence ? DERSuccess : result;
}

DERReturn constrain(const DERItem& dictionary, const DERDecodedInfo& constraints) {
    Img4Property constraining;
    if (const DERReturn result = DERImg4DecodeProperty(&constraints.content, constraints.tag, &constraining);
        result != DERSuccess)
        return result;
    if (constraining.valueTag != DERTagSet)
        return DERUnexpectedTag;
    return checkEach(constraining.value, [&](const DERDecodedInfo& element) {
        Img4Property constraint;
        if (const DERReturn result = DERImg4DecodeProperty(&element.content, element.tag, &constraint);
            result != DERSuccess)
            return result;
        DERItem found = {};
        const DERReturn search = findFirst(dictionary, element.tag, &found);
        return judge(constraint, element.content, search, found);
    });
}

} // namespace

DERReturn Img4DecodeEvaluateCertificateProperties(const Img4Record* record) {
    if (record == nullptr)
        return DERParamError;
    DERDecodedInfo properties;
    if (!isPresent(record->manifest.certProperties))
        return DERDecodeError;
    if (const DERReturn result = DERDecodeItem(&record->manifest.certProperties, &properties); result != DERSuccess)
        return result;
    if (properties.tag != DERTagSet)
        return DERUnexpectedTag;
    return checkEach(properties.content, [&](const DERDecodedInfo& element) {
        switch (element.tag) {
        case manifestPropertiesTag:
            return constrain(record->manp, element);
        case objectPropertiesTag:
            return hasContent(record->objp) ? constrain(record->objp, element) : DERSuccess;
        case measurementTag:
            return DERSuccess;
        default:
            return DERUnexpectedTag;
        }
    });
}
