#include <array>

#include "der/DERDecode.h"
#include "sysconfig/SysConfig3Internal.h"
#include "sysconfig/SysConfig3Wire.h"

namespace {

using namespace sysconfig;

struct BlobItems {
    DERItem magic;
    DERItem version;
    DERItem payload;
    DERItem metadata;
    DERItem manifest;
};

struct PayloadItems {
    DERItem key;
    DERItem comment;
    DERItem data;
    DERItem string;
    DERItem deleted;
};

struct MetadataItems {
    DERItem key;
    DERItem data;
    DERItem string;
};

constexpr std::array<DERItemSpec, 5> DERDecodeSysConfig3ItemSpecs = {{
    {offsetof(BlobItems, magic), DERTagInteger, 0},
    {offsetof(BlobItems, version), DERTagInteger, 0},
    {offsetof(BlobItems, payload), payloadTag, 0},
    {offsetof(BlobItems, metadata), metadataTag, 0},
    {offsetof(BlobItems, manifest), manifestTag, 0},
}};

constexpr std::array<DERItemSpec, 5> DERDecodeSysConfig3PayloadItemSpecs = {{
    {offsetof(PayloadItems, key), DERTagInteger, 0},
    {offsetof(PayloadItems, comment), DERTagIA5String, 0},
    {offsetof(PayloadItems, data), DERTagOctetString, DEROptionOptional},
    {offsetof(PayloadItems, string), DERTagIA5String, DEROptionOptional},
    {offsetof(PayloadItems, deleted), DERTagBoolean, DEROptionOptional},
}};

constexpr std::array<DERItemSpec, 3> DERDecodeSysConfig3MetadataItemSpecs = {{
    {offsetof(MetadataItems, key), DERTagIA5String, 0},
    {offsetof(MetadataItems, data), DERTagOctetString, DEROptionOptional},
    {offsetof(MetadataItems, string), DERTagIA5String, DEROptionOptional},
}};

// Fills `items` from the content of a SEQUENCE.
template <typename Items, std::size_t count>
DERReturn parse(const DERItem& content, const std::array<DERItemSpec, count>& rows, Items* items, DERRefusal* refusal) {
    return DERParseSequenceContentExplained(&content, count, rows.data(), items, sizeof *items, sizeof *items, refusal);
}

// Appends an entry of the content, or says that memory is lacking, so that it is not silently left out. The codec has
// no code of its own for that.
template <typename Content, typename List>
DERReturn append(const Content& content, const DERItem& encoding, const Decoding& decoding, List* list) {
    constexpr std::uint64_t headerSize = 2; // of most entries
    const Room room = {&list->blocks, encoding.length + headerSize,
                       static_cast<std::uint64_t>(decoding.end - encoding.data) + headerSize};
    auto* const entry = makeEntry(content, &room);
    if (entry == nullptr)
        return DERBufferOverflow;
    list->appendWithoutIndex(entry);
    return DERSuccess;
}

// The value of four octets, least significant first. Content of any other length gives 0.
std::uint32_t valueOf(const DERItem& item) {
    std::uint32_t value = 0;
    for (std::uint64_t i = item.length; item.length == sizeof value && i-- > 0;)
        value = value << 8 | item.data[i];
    return value;
}

// The characters of a string item, up to its first NUL and at most `maximum` of them.
std::string_view textOf(const DERItem& item, std::size_t maximum) {
    if (item.data == nullptr)
        return {};
    const auto* const text = reinterpret_cast<const char*>(item.data);
    return viewOf(text, std::min(static_cast<std::size_t>(item.length), maximum));
}

Bytes bytesOf(const DERItem& item) {
    return viewOf(item.data, static_cast<std::uint32_t>(item.length));
}

// The bytes for a new manifest, which copies them.
SysConfigData dataOf(const DERItem& item) {
    return {const_cast<std::uint8_t*>(item.data), static_cast<std::uint32_t>(item.length)};
}

bool refuse(SysConfig3Refusal* refusal, SysConfig3Subject subject, DERReturn status, const std::uint8_t* place) {
    refusal->subject = subject;
    refusal->status = status;
    refusal->place = place;
    return false;
}

// The one item that an element of the blob holds, and the formats that report anything else.
struct Element {
    SysConfig3Subject subject;
    SysConfig3Subject entry;
    DERTag tag;
    const char* undecodable;
    const char* otherTag;
};

constexpr Element payloadElement = {SysConfig3SubjectPayload, SysConfig3SubjectPayloadEntry, DERTagSet,
                                    "Unable to decode payload with error %d",
                                    "Tag was not the expected Payload tag %llX"};
constexpr Element metadataElement = {SysConfig3SubjectMetadata, SysConfig3SubjectMetadataEntry, DERTagSet,
                                     "Unable to decode metadata with error %d",
                                     "Tag was not the expected metadata tag %llX"};
constexpr Element manifestElement = {SysConfig3SubjectManifest, SysConfig3SubjectNone, DERTagSequence,
                                     "Unable to decode manifest with error %d",
                                     "Tag was not the expected manifest tag %llX"};

bool openElement(const DERItem& element, const Element& expected, DERItem* content, SysConfig3Refusal* refusal) {
    DERDecodedInfo item;
    if (const DERReturn result = DERDecodeItemExplained(&element, &item, &refusal->encoding); result != DERSuccess) {
        logHook()(messageLevel, expected.undecodable, static_cast<int>(result));
        return refuse(refusal, expected.subject, result, element.data);
    }
    if (item.tag != expected.tag) {
        logHook()(messageLevel, expected.otherTag, static_cast<unsigned long long>(item.tag));
        refusal->encoding = {DERFaultTag, 0, element.data, element.data, item.tag, expected.tag};
        return refuse(refusal, expected.subject, DERUnexpectedTag, element.data);
    }
    *content = item.content;
    return true;
}

// Fills a list of the object with the entries of an element.
template <typename List>
bool decodeList(const DERItem& element, const Element& expected, DERDecodeSequenceCallback addEntry,
                __SysConfig3* object, List* list, SysConfig3Refusal* refusal) {
    constexpr char operation[] = "struct __SysConfig3 *__singledecodeSysConfig3(const uint8_t *, uint32_t)";
    DERItem rest;
    if (!openElement(element, expected, &rest, refusal))
        return false;
    const std::uint8_t* const end = rest.data + rest.length;
    Decoding decoding = {object, &refusal->encoding, end};
    while (rest.data != end) {
        DERDecodedInfo entry;
        bool stop = false;
        DERReturn result = DERDecodeItemExplained(&rest, &entry, &refusal->encoding);
        if (result == DERSuccess)
            result = addEntry(&entry, &stop, &decoding);
        if (result != DERSuccess) {
            logHook()(messageLevel, "Decode sequence error: %d", static_cast<int>(result));
            return refuse(refusal, expected.entry, result, rest.data);
        }
        rest.data = entry.content.data + entry.content.length;
        rest.length = static_cast<std::uint64_t>(end - rest.data);
    }
    if (list->indexAll(object->secret))
        return true;
    logHook()(messageLevel, "%s malloc failed.", operation);
    return refuse(refusal, expected.subject, DERBufferOverflow, element.data);
}

bool decodeManifest(const DERItem& element, __SysConfig3* object, SysConfig3Refusal* refusal) {
    DERItem content;
    if (!openElement(element, manifestElement, &content, refusal))
        return false;
    ManifestItems items;
    if (const DERReturn result = parse(content, manifestRows, &items, nullptr); result != DERSuccess) {
        // A blob whose HMACs cannot be read is still worth having: the object keeps the manifest it was made with.
        logHook()(messageLevel, "Decode manifest sequence error: %d", static_cast<int>(result));
        return true;
    }
    const bool empty = items.payloadHMAC.length == 0 && items.metadataHMAC.length == 0 && items.fullHMAC.length == 0;
    return empty ||
           installManifest(object, dataOf(items.payloadHMAC), dataOf(items.metadataHMAC), dataOf(items.fullHMAC)) ||
           refuse(refusal, SysConfig3SubjectManifest, DERBufferOverflow, element.data);
}

// Parses the outer SEQUENCE.
bool parseBlob(const DERItem& blob, BlobItems* items, SysConfig3Refusal* refusal) {
    constexpr SysConfig3Subject elements[] = {SysConfig3SubjectMagic, SysConfig3SubjectVersion,
                                              SysConfig3SubjectPayload, SysConfig3SubjectMetadata,
                                              SysConfig3SubjectManifest};
    const DERRefusal& encoding = refusal->encoding;
    const DERReturn result =
        DERParseSequenceExplained(&blob, DERDecodeSysConfig3ItemSpecs.size(), DERDecodeSysConfig3ItemSpecs.data(),
                                  items, sizeof *items, sizeof *items, &refusal->encoding);
    if (result == DERSuccess)
        return true;
    const bool isElement = encoding.fault == DERFaultTag || encoding.fault == DERFaultMissing;
    return refuse(refusal, isElement ? elements[encoding.row] : SysConfig3SubjectBlob, result, encoding.item);
}

} // namespace

DERReturn _DERDecodeSysConfig3ParseAndPopulatePayloadSequence(const DERDecodedInfo* decoded, bool*, void* context) {
    const auto* const decoding = static_cast<const Decoding*>(context);
    if (decoding == nullptr)
        return DERParamError;
    __SysConfig3* const object = decoding->object;
    PayloadItems items;
    bool deleted = false;
    DERReturn result = parse(decoded->content, DERDecodeSysConfig3PayloadItemSpecs, &items, decoding->refusal);
    if (result == DERSuccess)
        result = DERParseBooleanWithDefault(&items.deleted, false, &deleted);
    if (result != DERSuccess)
        return result;
    const PayloadContent content = {valueOf(items.key), textOf(items.comment, maximumStringLength), bytesOf(items.data),
                                    textOf(items.string, maximumStringLength), deleted};
    if (!isValidContent(content))
        return _sysConfig3AddPayloadEntry(object, nullptr), DERSuccess;
    return append(content, decoded->content, *decoding, &object->payload);
}

DERReturn _DERDecodeSysConfig3ParseAndPopulateMetadataSequence(const DERDecodedInfo* decoded, bool*, void* context) {
    constexpr char operation[] = "DERReturn _DERDecodeSysConfig3ParseAndPopulateMetadataSequence(const DERDecodedInfo "
                                 "*__single, bool *__single, void *__single)";
    const auto* const decoding = static_cast<const Decoding*>(context);
    if (decoding == nullptr)
        return logHook()(messageLevel, "%s the refcon arg was NULL", operation), DERParamError;
    __SysConfig3* const object = decoding->object;
    MetadataItems items;
    if (const DERReturn result =
            parse(decoded->content, DERDecodeSysConfig3MetadataItemSpecs, &items, decoding->refusal);
        result != DERSuccess)
        return result;
    const MetadataContent content = {textOf(items.key, maximumKeyLength), bytesOf(items.data),
                                     textOf(items.string, maximumStringLength)};
    if (!isValidContent(content))
        return _sysConfig3AddMetadataEntry(object, nullptr), DERSuccess;
    return append(content, decoded->content, *decoding, &object->metadata);
}

__SysConfig3* decodeSysConfig3Explained(const std::uint8_t* data, std::uint32_t length, SysConfig3Refusal* refusal) {
    SysConfig3Refusal unasked;
    if (refusal == nullptr)
        refusal = &unasked;
    *refusal = {};
    const DERItem blob = {data, data != nullptr ? length : 0};
    BlobItems items;
    if (!parseBlob(blob, &items, refusal))
        return nullptr;
    const SysConfig3Magic magic = valueOf(items.magic);
    const SysConfig3Version version = valueOf(items.version);
    if (!isSupportedSysConfig3Magic(magic)) {
        logHook()(messageLevel, "Sysconfig magic 0x%X is not valid", magic);
        refuse(refusal, SysConfig3SubjectMagic, DERSuccess, items.magic.data);
        return nullptr;
    }
    __SysConfig3* const object = allocSysConfig3(magic, version);
    if (object == nullptr) {
        logHook()(messageLevel,
                  "Unable to allocate sysconfig3vX object. Likely due to an unsupported magic: 0x%X or version: 0x%X",
                  magic, version);
        if (isSupportedSysConfig3Version(version))
            refuse(refusal, SysConfig3SubjectBlob, DERBufferOverflow, data);
        else
            refuse(refusal, SysConfig3SubjectVersion, DERSuccess, items.version.data);
        return nullptr;
    }
    if (decodeList(items.payload, payloadElement, _DERDecodeSysConfig3ParseAndPopulatePayloadSequence, object,
                   &object->payload, refusal) &&
        decodeList(items.metadata, metadataElement, _DERDecodeSysConfig3ParseAndPopulateMetadataSequence, object,
                   &object->metadata, refusal) &&
        decodeManifest(items.manifest, object, refusal)) {
        refusal->place = items.manifest.data + items.manifest.length;
        return object;
    }
    deallocSysConfig3(object);
    return nullptr;
}

__SysConfig3* decodeSysConfig3(const std::uint8_t* data, std::uint32_t length) {
    return decodeSysConfig3Explained(data, length, nullptr);
}
