#include "img4/Img4Internal.h"

#include <cstddef>

namespace {

constexpr uint16_t required = 0;

struct PayloadProperties {
    DERItem magic;
    DERItem properties;
};

} // namespace

constexpr DERItemSpec DERImg4ItemSpecs[] = {
    {offsetof(Img4Container, magic), DERTagIA5String, required},
    {offsetof(Img4Container, payload), DERTagSequence, DEROptionSaveDER},
    {offsetof(Img4Container, manifest), DERTagContextConstructed(0), DEROptionOptional},
    {offsetof(Img4Container, restoreInfo), DERTagContextConstructed(1), DEROptionOptional},
};

const DERItemSpec DERImg4PayloadWithPropertiesItemSpecs[] = {
    {offsetof(Img4PayloadWithProperties, payload.magic), DERTagIA5String, required},
    {offsetof(Img4PayloadWithProperties, payload.type), DERTagIA5String, required},
    {offsetof(Img4PayloadWithProperties, payload.version), DERTagIA5String, required},
    {offsetof(Img4PayloadWithProperties, payload.data), DERTagOctetString, required},
    {offsetof(Img4PayloadWithProperties, payload.keybag), DERTagOctetString, DEROptionOptional},
    {offsetof(Img4PayloadWithProperties, payload.compression), DERTagSequence, DEROptionOptional},
    {offsetof(Img4PayloadWithProperties, properties), DERTagContextConstructed(0), DEROptionOptional},
};
constexpr img4::ItemSpecs DERImg4PayloadItemSpecs(DERImg4PayloadWithPropertiesItemSpecs, 6);

const DERItemSpec DERImg4CompressionItemSpecs[] = {
    {offsetof(Img4Compression, algorithm), DERTagInteger, required},
    {offsetof(Img4Compression, uncompressedSize), DERTagInteger, required},
};

constexpr DERItemSpec DERImg4PayloadPropertiesItemSpecs[] = {
    {offsetof(PayloadProperties, magic), DERTagIA5String, required},
    {offsetof(PayloadProperties, properties), DERTagSet, required},
};

constexpr DERItemSpec DERImg4ManifestItemSpecs[] = {
    {offsetof(Img4ManifestRecord, magic), DERTagIA5String, required},
    {offsetof(Img4ManifestRecord, version), DERTagInteger, required},
    {offsetof(Img4ManifestRecord, body), DERTagSet, DEROptionSaveDER},
    {offsetof(Img4ManifestRecord, signature), DERTagOctetString, required},
    {offsetof(Img4ManifestRecord, certChain), DERTagSequence, required},
};
constexpr img4::ItemSpecs DERImg4UnsignedManifestItemSpecs(DERImg4ManifestItemSpecs, 3);

constexpr DERItemSpec DERImg4RestoreInfoItemSpecs[] = {
    {offsetof(Img4RestoreInfoRecord, magic), DERTagIA5String, required},
    {offsetof(Img4RestoreInfoRecord, properties), DERTagSet, required},
};

namespace {

using namespace img4;

// Zeroes the record, even when there is no buffer to decode.
bool prepare(const uint8_t* buffer, Img4Record* record) {
    if (record == nullptr)
        return false;
    *record = Img4Record{};
    return buffer != nullptr;
}

// Where no refusal is asked for, the first failure ends an initialisation.
bool goesOn(DERReturn result, const Img4Refusal* refusal) {
    return result == DERSuccess || refusal != nullptr;
}

DERReturn firstOf(DERReturn earlier, DERReturn later) {
    return earlier != DERSuccess ? earlier : later;
}

DERReturn checkMagic(const DERItem& magic, uint32_t expected, Img4Refusal* refusal) {
    return equalsFourCC(magic, expected) ? DERSuccess
                                         : refuse(refusal, DERUnexpectedTag, Img4FaultMagic, magic.data, magic);
}

DERReturn checkNumber(const DERItem& number, uint32_t highest, Img4Refusal* refusal) {
    uint32_t value = 0;
    if (const DERReturn result = DERParseInteger(&number, &value); result != DERSuccess)
        return refuse(refusal, result, Img4FaultNumber, number.data, number);
    return value <= highest ? DERSuccess : refuse(refusal, DERUnexpectedTag, Img4FaultRange, number.data, number);
}

// Whatever is wrong, the status is that of a bad parameter.
DERReturn checkCompressionInfo(const DERItem& content, Img4Refusal* refusal) {
    Img4Compression compression;
    Img4Refusal why = {};
    enter(refusal, Img4SubjectCompression);
    if (parseContent(content, DERImg4CompressionItemSpecs, &compression, &why) != DERSuccess)
        return refuse(refusal, DERParamError, why.encoding);
    return checkNumber(compression.algorithm, highestCompressionAlgorithm, refusal) == DERSuccess ? DERSuccess
                                                                                                  : DERParamError;
}

// Whatever is wrong, the status is that of an unexpected tag.
DERReturn checkPayloadProperties(const DERItem& encoding, Img4Refusal* refusal) {
    PayloadProperties fields;
    enter(refusal, Img4SubjectPayloadProperties);
    const DERReturn result = parseSequence(encoding, DERImg4PayloadPropertiesItemSpecs, &fields, refusal);
    return result == DERSuccess ? checkMagic(fields.magic, payloadPropertiesMagic, refusal) : DERUnexpectedTag;
}

// Splits the payload into its fields. The status of a payload that fits neither table is that of the shorter one; what
// is wrong with it the longer one tells.
DERReturn parsePayload(const DERItem& encoding, Img4PayloadWithProperties* fields, Img4Refusal* refusal) {
    Img4Refusal why = {};
    if (parseSequence(encoding, DERImg4PayloadWithPropertiesItemSpecs, fields, refusal != nullptr ? &why : nullptr) ==
        DERSuccess)
        return DERSuccess;
    const DERReturn result = parseSequence(encoding, DERImg4PayloadItemSpecs, fields);
    return result == DERSuccess ? result : refuse(refusal, result, why.encoding);
}

DERReturn decodePayload(const DERItem& encoding, Img4PayloadRecord* payload, Img4Refusal* refusal) {
    Img4PayloadWithProperties fields = {};
    enter(refusal, Img4SubjectPayload);
    DERReturn result = parsePayload(encoding, &fields, refusal);
    if (result == DERSuccess)
        result = checkMagic(fields.payload.magic, payloadMagic, refusal);
    if (goesOn(result, refusal) && isPresent(fields.payload.compression))
        result = firstOf(result, checkCompressionInfo(fields.payload.compression, refusal));
    if (goesOn(result, refusal) && isPresent(fields.properties))
        result = firstOf(result, checkPayloadProperties(fields.properties, refusal));
    if (goesOn(result, refusal))
        *payload = fields.payload;
    return result;
}

// `specs` is the table of a signed or of an unsigned manifest.
DERReturn decodeManifest(const DERItem& encoding, ItemSpecs specs, Img4ManifestRecord* manifest, Img4Refusal* refusal) {
    enter(refusal, Img4SubjectManifest);
    DERReturn result = parseSequence(encoding, specs, manifest, refusal);
    if (result == DERSuccess)
        result = checkMagic(manifest->magic, manifestMagic, refusal);
    return result == DERSuccess ? checkNumber(manifest->version, highestManifestVersion, refusal) : result;
}

DERReturn decodeRestoreInfo(const DERItem& encoding, Img4RestoreInfoRecord* restoreInfo, Img4Refusal* refusal) {
    enter(refusal, Img4SubjectRestoreInfo);
    const DERReturn result = parseSequence(encoding, DERImg4RestoreInfoItemSpecs, restoreInfo, refusal);
    return result == DERSuccess ? checkMagic(restoreInfo->magic, restoreInfoMagic, refusal) : result;
}

// Decodes the first item of the buffer, which must be a SEQUENCE.
DERReturn decodeSequence(const DERItem& buffer, Img4Subject subject, DERDecodedInfo* whole, Img4Refusal* refusal) {
    DERRefusal why;
    enter(refusal, subject);
    if (const DERReturn result = DERDecodeItemExplained(&buffer, whole, &why); result != DERSuccess)
        return refuse(refusal, result, why);
    return whole->tag == DERTagSequence
               ? DERSuccess
               : refuse(refusal, DERUnexpectedTag,
                        {DERFaultNoSequence, 0, buffer.data, buffer.data, whole->tag, DERTagSequence});
}

DERReturn parseContainer(const DERItem& buffer, Img4Container* container, Img4Refusal* refusal) {
    DERDecodedInfo whole;
    DERReturn result = decodeSequence(buffer, Img4SubjectContainer, &whole, refusal);
    if (result != DERSuccess)
        return result;
    const uint8_t* const end = whole.content.data + whole.content.length;
    if (end != buffer.data + buffer.length)
        result = refuse(refusal, DERBufferOverflow, Img4FaultLength, end);
    if (!goesOn(result, refusal))
        return result;
    if (const DERReturn parsed = parseContent(whole.content, DERImg4ItemSpecs, container, refusal);
        parsed != DERSuccess)
        return firstOf(result, parsed);
    return firstOf(result, checkMagic(container->magic, containerMagic, refusal));
}

DERReturn decodeContainer(const DERItem& buffer, Img4Record* record, Img4Refusal* refusal) {
    Img4Container container = {};
    DERReturn result = parseContainer(buffer, &container, refusal);
    if (goesOn(result, refusal) && isPresent(container.payload))
        result = firstOf(result, decodePayload(container.payload, &record->payload, refusal));
    if (goesOn(result, refusal) && isPresent(container.manifest))
        result =
            firstOf(result, decodeManifest(container.manifest, DERImg4ManifestItemSpecs, &record->manifest, refusal));
    if (goesOn(result, refusal) && isPresent(container.restoreInfo))
        result = firstOf(result, decodeRestoreInfo(container.restoreInfo, &record->restoreInfo, refusal));
    if (goesOn(result, refusal)) {
        record->payloadRaw = container.payload;
        record->manifestRaw = container.manifest;
    }
    return result;
}

DERReturn decodeBarePayload(const DERItem& buffer, Img4Record* record, Img4Refusal* refusal) {
    record->payloadRaw = buffer;
    return decodePayload(buffer, &record->payload, refusal);
}

DERReturn decodeBareManifest(const DERItem& buffer, ItemSpecs specs, Img4Record* record, Img4Refusal* refusal) {
    DERReturn result = decodeManifest(buffer, specs, &record->manifest, refusal);
    if (result == DERSuccess && !isPresent(record->manifest.body))
        result = DERDecodeError;
    DERDecodedInfo whole;
    if (!goesOn(result, refusal) || DERDecodeItem(&buffer, &whole) != DERSuccess)
        return result;
    const uint8_t* const end = whole.content.data + whole.content.length;
    record->manifestRaw = {buffer.data, static_cast<uint64_t>(end - buffer.data)};
    if (record->manifestRaw.length == buffer.length)
        return result;
    return firstOf(result, refuse(refusal, DERBufferOverflow, Img4FaultLength, end));
}

// The kind that the magic in front tells. Anything else is refused.
DERReturn findKind(const DERItem& buffer, Img4Kind* kind, Img4Refusal* refusal) {
    DERDecodedInfo whole;
    DERDecodedInfo magic = {};
    if (const DERReturn result = decodeSequence(buffer, Img4SubjectFile, &whole, refusal); result != DERSuccess)
        return result;
    const bool hasMagic = DERDecodeItem(&whole.content, &magic) == DERSuccess && magic.tag == DERTagIA5String;
    *kind = !hasMagic                                     ? Img4KindUnknown
            : equalsFourCC(magic.content, containerMagic) ? Img4KindContainer
            : equalsFourCC(magic.content, payloadMagic)   ? Img4KindPayload
            : equalsFourCC(magic.content, manifestMagic)  ? Img4KindManifest
                                                          : Img4KindUnknown;
    return *kind != Img4KindUnknown ? DERSuccess
                                    : refuse(refusal, DERUnexpectedTag, Img4FaultMagic, whole.content.data,
                                             hasMagic ? magic.content : DERItem{});
}

DERReturn decodeKind(const DERItem& buffer, Img4Record* record, Img4Kind* kind, Img4Refusal* refusal) {
    if (const DERReturn result = findKind(buffer, kind, refusal); result != DERSuccess)
        return result;
    if (*kind == Img4KindContainer)
        return decodeContainer(buffer, record, refusal);
    if (*kind == Img4KindPayload)
        return decodeBarePayload(buffer, record, refusal);
    if (decodeBareManifest(buffer, DERImg4UnsignedManifestItemSpecs, record, nullptr) == DERSuccess) {
        *kind = Img4KindUnsignedManifest;
        return DERSuccess;
    }
    *record = Img4Record{};
    return decodeBareManifest(buffer, DERImg4ManifestItemSpecs, record, refusal);
}

} // namespace

DERReturn Img4DecodeInit(const uint8_t* buffer, uint64_t length, Img4Record* record) {
    return prepare(buffer, record) ? decodeContainer({buffer, length}, record, nullptr) : DERParamError;
}

DERReturn Img4DecodeInitPayload(const uint8_t* buffer, uint64_t length, Img4Record* record) {
    return prepare(buffer, record) ? decodeBarePayload({buffer, length}, record, nullptr) : DERParamError;
}

DERReturn Img4DecodeInitManifest(const uint8_t* buffer, uint64_t length, Img4Record* record) {
    return prepare(buffer, record) ? decodeBareManifest({buffer, length}, DERImg4ManifestItemSpecs, record, nullptr)
                                   : DERParamError;
}

DERReturn Img4DecodeInitUnsignedManifest(const uint8_t* buffer, uint64_t length, Img4Record* record) {
    return prepare(buffer, record)
               ? decodeBareManifest({buffer, length}, DERImg4UnsignedManifestItemSpecs, record, nullptr)
               : DERParamError;
}

DERReturn Img4DecodeInitExplained(const uint8_t* buffer, uint64_t length, Img4Record* record, Img4Kind* kind,
                                  Img4Refusal* refusal) {
    if (!prepare(buffer, record) || kind == nullptr || refusal == nullptr)
        return DERParamError;
    *kind = Img4KindUnknown;
    *refusal = Img4Refusal{};
    const DERReturn result = decodeKind({buffer, length}, record, kind, refusal);
    if (result == DERSuccess)
        refusal->subject = Img4SubjectNone;
    return refusal->status = result;
}
