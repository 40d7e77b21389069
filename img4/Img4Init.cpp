#include "img4/Img4Internal.h"

#include <cstddef>

namespace {

constexpr uint16_t required = 0;

} // namespace

const DERItemSpec DERImg4ItemSpecs[] = {
    {offsetof(Img4Container, magic), DERTagIA5String, required},
    {offsetof(Img4Container, payload), DERTagSequence, DEROptionSaveDER},
    {offsetof(Img4Container, manifest), DERTagContextConstructed(0), DEROptionOptional},
    {offsetof(Img4Container, restoreInfo), DERTagContextConstructed(1), DEROptionOptional},
};
const uint16_t DERNumImg4ItemSpecs = std::size(DERImg4ItemSpecs);

const DERItemSpec DERImg4PayloadWithPropertiesItemSpecs[] = {
    {offsetof(Img4PayloadWithProperties, magic), DERTagIA5String, required},
    {offsetof(Img4PayloadWithProperties, type), DERTagIA5String, required},
    {offsetof(Img4PayloadWithProperties, version), DERTagIA5String, required},
    {offsetof(Img4PayloadWithProperties, data), DERTagOctetString, required},
    {offsetof(Img4PayloadWithProperties, keybag), DERTagOctetString, DEROptionOptional},
    {offsetof(Img4PayloadWithProperties, compression), DERTagSequence, DEROptionOptional},
    {offsetof(Img4PayloadWithProperties, properties), DERTagContextConstructed(0), DEROptionOptional},
};
const uint16_t DERNumImg4PayloadWithPropertiesItemSpecs = std::size(DERImg4PayloadWithPropertiesItemSpecs);

const DERItemSpec DERImg4PayloadItemSpecs[] = {
    {offsetof(Img4PayloadRecord, magic), DERTagIA5String, required},
    {offsetof(Img4PayloadRecord, type), DERTagIA5String, required},
    {offsetof(Img4PayloadRecord, version), DERTagIA5String, required},
    {offsetof(Img4PayloadRecord, data), DERTagOctetString, required},
    {offsetof(Img4PayloadRecord, keybag), DERTagOctetString, DEROptionOptional},
    {offsetof(Img4PayloadRecord, compression), DERTagSequence, DEROptionOptional},
};
const uint16_t DERNumImg4PayloadItemSpecs = std::size(DERImg4PayloadItemSpecs);

const DERItemSpec DERImg4CompressionItemSpecs[] = {
    {offsetof(Img4Compression, algorithm), DERTagInteger, required},
    {offsetof(Img4Compression, uncompressedSize), DERTagInteger, required},
};
const uint16_t DERNumImg4CompressionItemSpecs = std::size(DERImg4CompressionItemSpecs);

const DERItemSpec DERImg4PayloadPropertiesItemSpecs[] = {
    {offsetof(Img4PayloadProperties, magic), DERTagIA5String, required},
    {offsetof(Img4PayloadProperties, properties), DERTagSet, required},
};
const uint16_t DERNumImg4PayloadPropertiesItemSpecs = std::size(DERImg4PayloadPropertiesItemSpecs);

const DERItemSpec DERImg4ManifestItemSpecs[] = {
    {offsetof(Img4ManifestRecord, magic), DERTagIA5String, required},
    {offsetof(Img4ManifestRecord, version), DERTagInteger, required},
    {offsetof(Img4ManifestRecord, body), DERTagSet, DEROptionSaveDER},
    {offsetof(Img4ManifestRecord, signature), DERTagOctetString, required},
    {offsetof(Img4ManifestRecord, certChain), DERTagSequence, required},
};
const uint16_t DERNumImg4ManifestItemSpecs = std::size(DERImg4ManifestItemSpecs);

const DERItemSpec DERImg4UnsignedManifestItemSpecs[] = {
    {offsetof(Img4ManifestRecord, magic), DERTagIA5String, required},
    {offsetof(Img4ManifestRecord, version), DERTagInteger, required},
    {offsetof(Img4ManifestRecord, body), DERTagSet, DEROptionSaveDER},
};
const uint16_t DERNumImg4UnsignedManifestItemSpecs = std::size(DERImg4UnsignedManifestItemSpecs);

const DERItemSpec DERImg4RestoreInfoItemSpecs[] = {
    {offsetof(Img4RestoreInfoRecord, magic), DERTagIA5String, required},
    {offsetof(Img4RestoreInfoRecord, properties), DERTagSet, required},
};
const uint16_t DERNumImg4RestoreInfoItemSpecs = std::size(DERImg4RestoreInfoItemSpecs);

namespace {

using namespace img4;

// Zeroes the record, even when there is no buffer to decode.
bool prepare(const uint8_t* buffer, Img4Record* record) {
    if (record == nullptr)
        return false;
    *record = Img4Record{};
    return buffer != nullptr;
}

bool isCompressionInfo(const DERItem& content) {
    Img4Compression compression;
    uint32_t algorithm = 0;
    return DERParseSequenceContent(&content, DERNumImg4CompressionItemSpecs, DERImg4CompressionItemSpecs, &compression,
                                   sizeof compression) == DERSuccess &&
           DERParseInteger(&compression.algorithm, &algorithm) == DERSuccess &&
           algorithm <= highestCompressionAlgorithm;
}

bool isPayloadProperties(const DERItem& encoding) {
    Img4PayloadProperties fields;
    return DERParseSequence(&encoding, DERNumImg4PayloadPropertiesItemSpecs, DERImg4PayloadPropertiesItemSpecs, &fields,
                            sizeof fields) == DERSuccess &&
           equalsFourCC(fields.magic, payloadPropertiesMagic);
}

// Splits the payload into its fields. The status of a payload that fits neither table is that of the shorter one.
DERReturn parsePayload(const DERItem& encoding, Img4PayloadWithProperties* fields) {
    if (DERParseSequence(&encoding, DERNumImg4PayloadWithPropertiesItemSpecs, DERImg4PayloadWithPropertiesItemSpecs,
                         fields, sizeof *fields) == DERSuccess)
        return DERSuccess;
    static_assert(offsetof(Img4PayloadRecord, digest) == offsetof(Img4PayloadWithProperties, properties),
                  "both tables fill the same fields");
    return DERParseSequenceToObject(&encoding, DERNumImg4PayloadItemSpecs, DERImg4PayloadItemSpecs, fields,
                                    offsetof(Img4PayloadWithProperties, properties), sizeof *fields);
}

DERReturn decodePayload(const DERItem& encoding, Img4PayloadRecord* payload) {
    Img4PayloadWithProperties fields;
    if (const DERReturn result = parsePayload(encoding, &fields); result != DERSuccess)
        return result;
    if (!equalsFourCC(fields.magic, payloadMagic))
        return DERUnexpectedTag;
    if (isPresent(fields.compression) && !isCompressionInfo(fields.compression))
        return DERParamError;
    if (isPresent(fields.properties) && !isPayloadProperties(fields.properties))
        return DERUnexpectedTag;
    payload->magic = fields.magic;
    payload->type = fields.type;
    payload->version = fields.version;
    payload->data = fields.data;
    payload->keybag = fields.keybag;
    payload->compression = fields.compression;
    return DERSuccess;
}

enum class Signing {
    Signed,
    Unsigned
};

DERReturn decodeManifest(const DERItem& encoding, Signing signing, Img4ManifestRecord* manifest) {
    const bool isSigned = signing == Signing::Signed;
    const uint16_t rows = isSigned ? DERNumImg4ManifestItemSpecs : DERNumImg4UnsignedManifestItemSpecs;
    const DERItemSpec* specs = isSigned ? DERImg4ManifestItemSpecs : DERImg4UnsignedManifestItemSpecs;
    if (const DERReturn result = DERParseSequence(&encoding, rows, specs, manifest, sizeof *manifest);
        result != DERSuccess)
        return result;
    if (!equalsFourCC(manifest->magic, manifestMagic))
        return DERUnexpectedTag;
    uint32_t version = 0;
    if (const DERReturn result = DERParseInteger(&manifest->version, &version); result != DERSuccess)
        return result;
    return version > highestManifestVersion ? DERUnexpectedTag : DERSuccess;
}

DERReturn decodeRestoreInfo(const DERItem& encoding, Img4RestoreInfoRecord* restoreInfo) {
    if (const DERReturn result = DERParseSequence(&encoding, DERNumImg4RestoreInfoItemSpecs,
                                                  DERImg4RestoreInfoItemSpecs, restoreInfo, sizeof *restoreInfo);
        result != DERSuccess)
        return result;
    return equalsFourCC(restoreInfo->magic, restoreInfoMagic) ? DERSuccess : DERUnexpectedTag;
}

DERReturn parseContainer(const DERItem& buffer, Img4Container* container) {
    DERDecodedInfo whole;
    if (const DERReturn result = DERDecodeItem(&buffer, &whole); result != DERSuccess)
        return result;
    if (whole.tag != DERTagSequence)
        return DERUnexpectedTag;
    if (whole.content.data + whole.content.length != buffer.data + buffer.length)
        return DERBufferOverflow;
    if (const DERReturn result = DERParseSequenceContent(&whole.content, DERNumImg4ItemSpecs, DERImg4ItemSpecs,
                                                         container, sizeof *container);
        result != DERSuccess)
        return result;
    return equalsFourCC(container->magic, containerMagic) ? DERSuccess : DERUnexpectedTag;
}

DERReturn decodeBareManifest(const DERItem& buffer, Signing signing, Img4Record* record) {
    if (const DERReturn result = decodeManifest(buffer, signing, &record->manifest); result != DERSuccess)
        return result;
    if (!isPresent(record->manifest.body))
        return DERDecodeError;
    DERDecodedInfo whole;
    if (const DERReturn result = DERDecodeItem(&buffer, &whole); result != DERSuccess)
        return result;
    const uint64_t headerLength = static_cast<uint64_t>(whole.content.data - buffer.data);
    record->manifestRaw = {buffer.data, headerLength + whole.content.length};
    return record->manifestRaw.length == buffer.length ? DERSuccess : DERBufferOverflow;
}

} // namespace

DERReturn Img4DecodeInit(const uint8_t* buffer, uint64_t length, Img4Record* record) {
    if (!prepare(buffer, record))
        return DERParamError;
    Img4Container container;
    if (const DERReturn result = parseContainer({buffer, length}, &container); result != DERSuccess)
        return result;
    if (const DERReturn result = decodePayload(container.payload, &record->payload); result != DERSuccess)
        return result;
    if (isPresent(container.manifest)) {
        if (const DERReturn result = decodeManifest(container.manifest, Signing::Signed, &record->manifest);
            result != DERSuccess)
            return result;
    }
    if (isPresent(container.restoreInfo)) {
        if (const DERReturn result = decodeRestoreInfo(container.restoreInfo, &record->restoreInfo);
            result != DERSuccess)
            return result;
    }
    record->payloadRaw = container.payload;
    record->manifestRaw = container.manifest;
    return DERSuccess;
}

DERReturn Img4DecodeInitPayload(const uint8_t* buffer, uint64_t length, Img4Record* record) {
    if (!prepare(buffer, record))
        return DERParamError;
    record->payloadRaw = {buffer, length};
    return decodePayload(record->payloadRaw, &record->payload);
}

DERReturn Img4DecodeInitManifest(const uint8_t* buffer, uint64_t length, Img4Record* record) {
    return prepare(buffer, record) ? decodeBareManifest({buffer, length}, Signing::Signed, record) : DERParamError;
}

DERReturn Img4DecodeInitUnsignedManifest(const uint8_t* buffer, uint64_t length, Img4Record* record) {
    return prepare(buffer, record) ? decodeBareManifest({buffer, length}, Signing::Unsigned, record) : DERParamError;
}
