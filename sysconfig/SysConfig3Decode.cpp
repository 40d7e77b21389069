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

constexpr std::array<DERItemSpec, 3> DERDecodeSysConfig3ManifestItemSpecs = {{
    {offsetof(ManifestItems, payloadHMAC), DERTagOctetString, 0},
    {offsetof(ManifestItems, metadataHMAC), DERTagOctetString, 0},
    {offsetof(ManifestItems, fullHMAC), DERTagOctetString, 0},
}};

// Fills `items` from the content of a SEQUENCE.
template <typename Items, std::size_t count>
DERReturn parse(const DERItem& content, const std::array<DERItemSpec, count>& rows, Items* items) {
    return DERParseSequenceContentToObject(&content, count, rows.data(), items, sizeof *items, sizeof *items);
}

// Appends an entry, null when memory is lacking, so that it is not silently left out. The codec has no code of its own
// for that.
template <typename Entry, typename List>
DERReturn append(Entry* entry, List* list) {
    if (entry == nullptr)
        return DERBufferOverflow;
    list->appendWithoutIndex(entry);
    return DERSuccess;
}

// The value of four octets, least significant first. Content of any other length gives 0.
std::uint32_t valueOf(const DERItem& item) {
    return item.length == 4 ? valueOf(Octets4{{item.data[0], item.data[1], item.data[2], item.data[3]}}) : 0;
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

// The one item that an element of the blob holds, and the formats that report anything else.
struct Element {
    DERTag tag;
    const char* undecodable;
    const char* otherTag;
};

constexpr Element payloadElement = {DERTagSet, "Unable to decode payload with error %d",
                                    "Tag was not the expected Payload tag %llX"};
constexpr Element metadataElement = {DERTagSet, "Unable to decode metadata with error %d",
                                     "Tag was not the expected metadata tag %llX"};
constexpr Element manifestElement = {DERTagSequence, "Unable to decode manifest with error %d",
                                     "Tag was not the expected manifest tag %llX"};

bool openElement(const DERItem& element, const Element& expected, DERItem* content) {
    DERDecodedInfo item;
    if (const DERReturn result = DERDecodeItem(&element, &item); result != DERSuccess)
        return logHook()(messageLevel, expected.undecodable, static_cast<int>(result)), false;
    if (item.tag != expected.tag)
        return logHook()(messageLevel, expected.otherTag, static_cast<unsigned long long>(item.tag)), false;
    *content = item.content;
    return true;
}

// Fills a list of the object with the entries of an element.
template <typename List>
bool decodeList(const DERItem& element, const Element& expected, DERDecodeSequenceCallback addEntry,
                __SysConfig3* object, List* list) {
    constexpr char operation[] = "struct __SysConfig3 *__singledecodeSysConfig3(const uint8_t *, uint32_t)";
    DERItem entries;
    if (!openElement(element, expected, &entries))
        return false;
    if (const DERReturn result = DERDecodeSequenceContentWithBlock(&entries, addEntry, object); result != DERSuccess)
        return logHook()(messageLevel, "Decode sequence error: %d", static_cast<int>(result)), false;
    if (list->indexAll(object->secret))
        return true;
    logHook()(messageLevel, "%s malloc failed.", operation);
    return false;
}

bool decodePayload(const DERItem& element, __SysConfig3* object) {
    return decodeList(element, payloadElement, _DERDecodeSysConfig3ParseAndPopulatePayloadSequence, object,
                      &object->payload);
}

bool decodeMetadata(const DERItem& element, __SysConfig3* object) {
    return decodeList(element, metadataElement, _DERDecodeSysConfig3ParseAndPopulateMetadataSequence, object,
                      &object->metadata);
}

bool decodeManifest(const DERItem& element, __SysConfig3* object) {
    DERItem content;
    if (!openElement(element, manifestElement, &content))
        return false;
    ManifestItems items;
    if (const DERReturn result = parse(content, DERDecodeSysConfig3ManifestItemSpecs, &items); result != DERSuccess) {
        // A blob whose HMACs cannot be read is still worth having: the object keeps the manifest it was made with.
        logHook()(messageLevel, "Decode manifest sequence error: %d", static_cast<int>(result));
        return true;
    }
    const bool empty = items.payloadHMAC.length == 0 && items.metadataHMAC.length == 0 && items.fullHMAC.length == 0;
    return empty ||
           installManifest(object, dataOf(items.payloadHMAC), dataOf(items.metadataHMAC), dataOf(items.fullHMAC));
}

} // namespace

DERReturn _DERDecodeSysConfig3ParseAndPopulatePayloadSequence(const DERDecodedInfo* decoded, bool*, void* context) {
    auto* const object = static_cast<__SysConfig3*>(context);
    if (object == nullptr)
        return DERParamError;
    PayloadItems items;
    bool deleted = false;
    DERReturn result = parse(decoded->content, DERDecodeSysConfig3PayloadItemSpecs, &items);
    if (result == DERSuccess)
        result = DERParseBooleanWithDefault(&items.deleted, false, &deleted);
    if (result != DERSuccess)
        return result;
    const PayloadContent content = {valueOf(items.key), textOf(items.comment, maximumStringLength), bytesOf(items.data),
                                    textOf(items.string, maximumStringLength), deleted};
    if (!isValidContent(content))
        return reportNoPayloadEntry(), DERSuccess;
    return append(makeEntry(content), &object->payload);
}

DERReturn _DERDecodeSysConfig3ParseAndPopulateMetadataSequence(const DERDecodedInfo* decoded, bool*, void* context) {
    constexpr char operation[] = "DERReturn _DERDecodeSysConfig3ParseAndPopulateMetadataSequence(const DERDecodedInfo "
                                 "*__single, bool *__single, void *__single)";
    auto* const object = static_cast<__SysConfig3*>(context);
    if (object == nullptr)
        return logHook()(messageLevel, "%s the refcon arg was NULL", operation), DERParamError;
    MetadataItems items;
    if (const DERReturn result = parse(decoded->content, DERDecodeSysConfig3MetadataItemSpecs, &items);
        result != DERSuccess)
        return result;
    const MetadataContent content = {textOf(items.key, maximumKeyLength), bytesOf(items.data),
                                     textOf(items.string, maximumStringLength)};
    if (!isValidContent(content))
        return reportNoMetadataEntry(), DERSuccess;
    return append(makeEntry(content), &object->metadata);
}

__SysConfig3* decodeSysConfig3(const std::uint8_t* data, std::uint32_t length) {
    const DERItem blob = {data, data != nullptr ? length : 0};
    BlobItems items;
    if (DERParseSequenceToObject(&blob, DERDecodeSysConfig3ItemSpecs.size(), DERDecodeSysConfig3ItemSpecs.data(),
                                 &items, sizeof items, sizeof items) != DERSuccess)
        return nullptr;
    const SysConfig3Magic magic = valueOf(items.magic);
    const SysConfig3Version version = valueOf(items.version);
    if (!isSupportedSysConfig3Magic(magic))
        return logHook()(messageLevel, "Sysconfig magic 0x%X is not valid", magic), nullptr;
    __SysConfig3* const object = allocSysConfig3(magic, version);
    if (object == nullptr) {
        logHook()(messageLevel,
                  "Unable to allocate sysconfig3vX object. Likely due to an unsupported magic: 0x%X or version: 0x%X",
                  magic, version);
        return nullptr;
    }
    if (decodePayload(items.payload, object) && decodeMetadata(items.metadata, object) &&
        decodeManifest(items.manifest, object))
        return object;
    deallocSysConfig3(object);
    return nullptr;
}
