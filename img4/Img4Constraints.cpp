#include "img4/Img4TrustInternal.h"

#include <cstring>

using namespace img4;

namespace {

constexpr DERTag objectPropertiesTag = Img4PropertyTag(Img4FourCC('O', 'B', 'J', 'P'));
constexpr DERTag measurementTag = Img4PropertyTag(Img4FourCC('m', 'a', 'n', 'x'));
constexpr DERTag mustBePresent = DERTagContextConstructed(0);
constexpr DERTag mustBeAbsent = DERTagContextConstructed(1);

// What a check tells of each constraint, unless `each` is null. With it the check goes on behind a failure.
struct Listener {
    Img4ConstraintCallback each;
    void* context;

    DERReturn hear(DERReturn result, Img4Constraint& constraint) const {
        constraint.refusal.subject = Img4SubjectConstraints;
        if (each != nullptr)
            each(&constraint, context);
        return result;
    }
};

// Judges the search for the constrained property, whose content is `found` when `search` is a success.
DERReturn judge(const Img4Property& constraint, const DERItem& required, DERReturn search, const DERItem& found,
                Img4Refusal* refusal) {
    const uint8_t* const place = required.data;
    switch (constraint.valueTag) {
    case DERTagBoolean:
    case DERTagInteger:
    case DERTagOctetString:
        if (search == DERSuccess)
            return found.length == required.length &&
                           std::memcmp(found.data, required.data, static_cast<std::size_t>(found.length)) == 0
                       ? DERSuccess
                       : refuse(refusal, Img4Failure, Img4FaultValue, place);
        [[fallthrough]];
    case mustBePresent:
        return search == DERSuccess ? search : refuse(refusal, search, Img4FaultAbsent, place);
    case mustBeAbsent:
        if (search == DERSuccess)
            return refuse(refusal, DERUnexpectedTag, Img4FaultPresent, place);
        return search == DEREndOfSequence ? DERSuccess : refuse(refusal, search, Img4FaultAbsent, place);
    default:
        return refuse(refusal, DERUnexpectedTag, Img4FaultValueType, place);
    }
}

// Calls `check` for each element of the SET's content `set`, with its encoding, until one fails; with a listener to
// all, for every one. `where` is the row of the SET itself.
template <typename Check>
DERReturn checkEach(const DERItem& set, const Img4Constraint& where, const Listener& listener, Check check) {
    DERSequence rest;
    DERDecodedInfo element;
    DERReturn first = DERSuccess;
    DERDecodeSeqContentInit(&set, &rest);
    for (;;) {
        const uint8_t* const start = rest.next;
        DERReturn result = DERDecodeSeqNext(&rest, &element);
        if (result == DEREndOfSequence)
            return first;
        const bool isBroken = result != DERSuccess;
        const uint8_t* const end = isBroken ? rest.end : rest.next;
        const DERItem encoding = {start, static_cast<uint64_t>(end - start)};
        if (!isBroken)
            result = check(element, encoding);
        else if (listener.each != nullptr) {
            Img4Constraint broken = {where.dictionary, encoding, 0, {}, where.isChecked, {}};
            DERDecodeItemExplained(&encoding, &element, &broken.refusal.encoding);
            refuse(&broken.refusal, result, broken.refusal.encoding);
            listener.hear(result, broken);
        }
        if (first == DERSuccess)
            first = result;
        if (isBroken || (result != DERSuccess && listener.each == nullptr))
            return first;
    }
}

// Finds the property that is bound, as a whole encoding for a listener.
DERReturn findBound(const DERItem& dictionary, DERTag tag, DERItem* content, DERItem* encoding) {
    DERSequence rest;
    DERDecodedInfo element;
    const uint8_t* start = dictionary.data;
    DERReturn result;
    DERDecodeSeqContentInit(&dictionary, &rest);
    while ((result = DERDecodeSeqNext(&rest, &element)) == DERSuccess && element.tag != tag)
        start = rest.next;
    if (result == DERSuccess) {
        *content = element.content;
        *encoding = {start, static_cast<uint64_t>(rest.next - start)};
    }
    return result;
}

// `bound` is null when it is not to be checked.
DERReturn constrain(const DERItem* bound, const DERDecodedInfo& constraints, const DERItem& whole,
                    const Listener& listener) {
    Img4Property constraining;
    Img4Constraint row = {constraints.tag, whole, 0, {}, bound != nullptr, {}};
    Img4Refusal* const refusal = listener.each != nullptr ? &row.refusal : nullptr;
    if (const DERReturn result =
            DERImg4DecodePropertyExplained(&constraints.content, constraints.tag, &constraining, refusal);
        result != DERSuccess)
        return listener.hear(result, row);
    if (constraining.valueTag != DERTagSet) {
        row.refusal.encoding.tag = constraining.valueTag;
        row.refusal.encoding.expected = DERTagSet;
        return listener.hear(refuse(refusal, DERUnexpectedTag, Img4FaultValueType, whole.data), row);
    }
    return checkEach(constraining.value, row, listener, [&](const DERDecodedInfo& element, const DERItem& encoding) {
        Img4Property constraint;
        row.encoding = encoding;
        row.kind = 0;
        row.found = {};
        DERReturn result = DERImg4DecodePropertyExplained(&element.content, element.tag, &constraint, refusal);
        if (result == DERSuccess) {
            DERItem found = {};
            row.kind = constraint.valueTag;
            row.refusal.encoding.tag = constraint.valueTag;
            if (bound != nullptr)
                result = judge(constraint, element.content, findBound(*bound, element.tag, &found, &row.found), found,
                               refusal);
        }
        return listener.hear(result, row);
    });
}

DERReturn check(const Img4Record& record, const Listener& listener) {
    DERDecodedInfo properties;
    Img4Constraint row = {0, record.manifest.certProperties, 0, {}, true, {}};
    if (!isPresent(record.manifest.certProperties))
        return listener.hear(refuse(&row.refusal, DERDecodeError, Img4FaultAbsent, record.manifest.certChain.data),
                             row);
    if (const DERReturn result = DERDecodeItem(&record.manifest.certProperties, &properties); result != DERSuccess)
        return listener.hear(refuse(&row.refusal, result, Img4FaultOther, row.encoding.data), row);
    if (properties.tag != DERTagSet)
        return listener.hear(refuse(&row.refusal, DERUnexpectedTag, Img4FaultOther, row.encoding.data), row);
    const bool isListed = listener.each != nullptr;
    row.isChecked = isPresent(record.manp);
    return checkEach(properties.content, row, listener, [&](const DERDecodedInfo& element, const DERItem& encoding) {
        switch (element.tag) {
        case manifestPropertiesTag:
            return constrain(isListed && !isPresent(record.manp) ? nullptr : &record.manp, element, encoding, listener);
        case objectPropertiesTag:
            if (hasContent(record.objp))
                return constrain(&record.objp, element, encoding, listener);
            [[fallthrough]];
        case measurementTag:
            if (isListed)
                constrain(nullptr, element, encoding, listener);
            return DERSuccess;
        default:
            Img4Constraint unknown = {element.tag, encoding, 0, {}, row.isChecked, {}};
            unknown.refusal.tag = element.tag;
            return listener.hear(refuse(&unknown.refusal, DERUnexpectedTag, Img4FaultTag, encoding.data), unknown);
        }
    });
}

} // namespace

DERReturn img4::checkConstraints(const Img4Record& record, Img4Refusal* refusal) {
    const auto keepFirst = [](const Img4Constraint* constraint, void* first) {
        Img4Refusal* const kept = static_cast<Img4Refusal*>(first);
        if (constraint->isChecked && constraint->refusal.fault != Img4FaultNone && kept->fault == Img4FaultNone)
            *kept = constraint->refusal;
    };
    return check(record, {keepFirst, refusal});
}

DERReturn Img4DecodeEvaluateCertificateProperties(const Img4Record* record) {
    return record != nullptr ? check(*record, {nullptr, nullptr}) : DERParamError;
}

DERReturn Img4DecodeEvaluateCertificatePropertiesExplained(const Img4Record* record, Img4ConstraintCallback callback,
                                                           void* context) {
    return record != nullptr && callback != nullptr ? check(*record, {callback, context}) : DERParamError;
}
