#include "img4/Img4Internal.h"

using namespace img4;

namespace {

DERReturn findObjectProperty(const Img4Record* record, uint32_t object, DERTag tag, DERTag valueType,
                             Img4Property* property) {
    DERItem manb;
    DERItem manp;
    Img4Property found;
    if (record == nullptr || property == nullptr)
        return DERParamError;
    DERReturn result = findManifestDictionaries(*record, &manb, &manp);
    if (result == DERSuccess)
        result = findProperty(manb, Img4PropertyTag(object), DERTagSet, &found);
    return result == DERSuccess ? findProperty(found.value, tag, valueType, property) : result;
}

template <typename T>
DERReturn getObjectValue(const Img4Record* record, uint32_t object, uint32_t name, DERTag type, Parser<T> parse,
                         T* value) {
    return getValue(value, parse, [&](Img4Property* property) {
        return findObjectProperty(record, object, Img4PropertyTag(name), type, property);
    });
}

// The octets that hold the properties of a section; absent when the section is.
const DERItem* sectionItem(const Img4Record& record, uint32_t section) {
    switch (section) {
    case Img4SectionManifest:
        return &record.manifest.body;
    case Img4SectionRestoreInfo:
        return &record.restoreInfo.properties;
    default:
        return nullptr;
    }
}

DERReturn findSectionProperty(const Img4Record* record, uint32_t section, DERTag tag, DERTag valueType,
                              Img4Property* property) {
    const DERItem* item = record != nullptr ? sectionItem(*record, section) : nullptr;
    if (item == nullptr || property == nullptr)
        return DERParamError;
    if (!isPresent(*item))
        return DEREndOfSequence;
    if (section == Img4SectionRestoreInfo)
        return findProperty(*item, tag, valueType, property);
    DERItem manb;
    DERItem manp;
    const DERReturn result = findManifestDictionaries(*record, &manb, &manp);
    return result == DERSuccess ? findProperty(manp, tag, valueType, property) : result;
}

template <typename T>
DERReturn getSectionValue(const Img4Record* record, uint32_t section, uint32_t name, DERTag type, Parser<T> parse,
                          T* value) {
    return getValue(value, parse, [&](Img4Property* property) {
        return findSectionProperty(record, section, Img4PropertyTag(name), type, property);
    });
}

// Unlike those of an object, the getters of a section touch a number only once its property was found.
DERReturn parseNumber(const DERItem* item, uint32_t* value) {
    return clearOnFailure(DERParseInteger(item, value), value);
}

DERReturn parseNumber64(const DERItem* item, uint64_t* value) {
    return clearOnFailure(DERParseInteger64(item, value), value);
}

} // namespace

DERReturn img4::findManifestDictionaries(const Img4Record& record, DERItem* manb, DERItem* manp, Img4Refusal* refusal) {
    DERDecodedInfo body;
    uint32_t version = 0;
    Img4Property found;
    enter(refusal, Img4SubjectBody);
    if (const DERReturn result = DERDecodeItem(&record.manifest.body, &body); result != DERSuccess)
        return refuse(refusal, result, Img4FaultOther, record.manifest.body.data);
    if (const DERReturn result = DERParseInteger(&record.manifest.version, &version); result != DERSuccess)
        return refuse(refusal, result, Img4FaultOther, record.manifest.version.data);
    const DERTag type = version == highestManifestVersion ? DERTagSequence : DERTagSet;
    if (const DERReturn result = findProperty(body.content, manifestBodyTag, type, &found, refusal);
        result != DERSuccess)
        return result;
    *manb = found.value;
    enter(refusal, Img4SubjectManb);
    if (const DERReturn result = findProperty(*manb, manifestPropertiesTag, DERTagSet, &found, refusal);
        result != DERSuccess)
        return result;
    *manp = found.value;
    return DERSuccess;
}

DERReturn Img4DecodeFindDictionariesExplained(const Img4Record* record, DERItem* manb, DERItem* manp,
                                              Img4Refusal* refusal) {
    if (record == nullptr || manb == nullptr || manp == nullptr)
        return DERParamError;
    if (refusal != nullptr)
        *refusal = Img4Refusal{};
    return findManifestDictionaries(*record, manb, manp, refusal);
}

DERReturn Img4DecodeManifestExists(const Img4Record* record, bool* exists) {
    if (record == nullptr || exists == nullptr)
        return clearOnFailure(DERParamError, exists);
    *exists = isPresent(record->manifestRaw);
    return DERSuccess;
}

DERReturn Img4DecodeGetManifest(const Img4Record* record, const uint8_t** start, uint32_t* length) {
    DERReturn result = DERSuccess;
    if (record == nullptr || start == nullptr || length == nullptr)
        result = DERParamError;
    else if (!hasContent(record->manifestRaw))
        result = Img4Failure;
    else if (record->manifestRaw.length > UINT32_MAX)
        result = DERBufferOverflow;
    if (result != DERSuccess) {
        clearOnFailure(result, start);
        return clearOnFailure(result, length);
    }
    *start = record->manifestRaw.data;
    *length = static_cast<uint32_t>(record->manifestRaw.length);
    return DERSuccess;
}

DERReturn Img4DecodeSectionExists(const Img4Record* record, uint32_t section, bool* exists) {
    const DERItem* item = record != nullptr ? sectionItem(*record, section) : nullptr;
    if (item == nullptr || exists == nullptr)
        return clearOnFailure(DERParamError, exists);
    *exists = isPresent(*item);
    return DERSuccess;
}

DERReturn Img4DecodeRestoreInfoExists(const Img4Record* record, bool* exists) {
    return Img4DecodeSectionExists(record, Img4SectionRestoreInfo, exists);
}

DERReturn Img4DecodeGetPropertyFromSection(const Img4Record* record, uint32_t section, DERTag tag, DERTag valueType,
                                           Img4Property* property) {
    return clearOnFailure(findSectionProperty(record, section, tag, valueType, property), property);
}

DERReturn Img4DecodeGetBooleanFromSection(const Img4Record* record, uint32_t section, uint32_t name, bool* value) {
    return getSectionValue(record, section, name, DERTagBoolean, DERParseBoolean, value);
}

DERReturn Img4DecodeGetIntegerFromSection(const Img4Record* record, uint32_t section, uint32_t name, uint32_t* value) {
    return getSectionValue(record, section, name, DERTagInteger, parseNumber, value);
}

DERReturn Img4DecodeGetInteger64FromSection(const Img4Record* record, uint32_t section, uint32_t name,
                                            uint64_t* value) {
    return getSectionValue(record, section, name, DERTagInteger, parseNumber64, value);
}

DERReturn Img4DecodeGetDataFromSection(const Img4Record* record, uint32_t section, uint32_t name, DERItem* value) {
    return clearOnFailure(getSectionValue(record, section, name, DERTagOctetString, parseData, value), value);
}

DERReturn Img4DecodeGetRestoreInfoBoolean(const Img4Record* record, uint32_t name, bool* value) {
    return Img4DecodeGetBooleanFromSection(record, Img4SectionRestoreInfo, name, value);
}

DERReturn Img4DecodeGetRestoreInfoInteger(const Img4Record* record, uint32_t name, uint32_t* value) {
    return Img4DecodeGetIntegerFromSection(record, Img4SectionRestoreInfo, name, value);
}

DERReturn Img4DecodeGetRestoreInfoInteger64(const Img4Record* record, uint32_t name, uint64_t* value) {
    return Img4DecodeGetInteger64FromSection(record, Img4SectionRestoreInfo, name, value);
}

DERReturn Img4DecodeGetRestoreInfoData(const Img4Record* record, uint32_t name, DERItem* value) {
    return Img4DecodeGetDataFromSection(record, Img4SectionRestoreInfo, name, value);
}

DERReturn Img4DecodeGetObjectProperty(const Img4Record* record, uint32_t object, DERTag tag, DERTag valueType,
                                      Img4Property* property) {
    return clearOnFailure(findObjectProperty(record, object, tag, valueType, property), property);
}

DERReturn Img4DecodeGetObjectPropertyBoolean(const Img4Record* record, uint32_t object, uint32_t name, bool* value) {
    return getObjectValue(record, object, name, DERTagBoolean, DERParseBoolean, value);
}

DERReturn Img4DecodeGetObjectPropertyInteger(const Img4Record* record, uint32_t object, uint32_t name,
                                             uint32_t* value) {
    return clearOnFailure(getObjectValue(record, object, name, DERTagInteger, DERParseInteger, value), value);
}

DERReturn Img4DecodeGetObjectPropertyInteger64(const Img4Record* record, uint32_t object, uint32_t name,
                                               uint64_t* value) {
    return clearOnFailure(getObjectValue(record, object, name, DERTagInteger, DERParseInteger64, value), value);
}

DERReturn Img4DecodeGetObjectPropertyData(const Img4Record* record, uint32_t object, uint32_t name, DERItem* value) {
    return clearOnFailure(getObjectValue(record, object, name, DERTagOctetString, parseData, value), value);
}

DERReturn Img4DecodeGetObjectPropertyString(const Img4Record* record, uint32_t object, uint32_t name, DERItem* value) {
    return clearOnFailure(getObjectValue(record, object, name, DERTagIA5String, parseData, value), value);
}
