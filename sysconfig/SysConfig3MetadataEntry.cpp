// Metadata entries, and an object's list of them.
#include "sysconfig/SysConfig3Internal.h"

namespace {

using namespace sysconfig;

constexpr char allocation[] = "struct __SysConfig3MetadataEntry *__singleallocSysConfig3MetadataEntry(const char *, "
                              "const uint8_t *, uint32_t, const char *)";
constexpr char addition[] = "bool _sysConfig3AddMetadataEntry(struct __SysConfig3 *__single, const struct "
                            "__SysConfig3MetadataEntry *__single)";

} // namespace

bool sysconfig::isValidContent(const MetadataContent& content) {
    const bool hasData = content.data.data != nullptr;
    const bool hasString = content.string.data() != nullptr;
    if (content.key.data() == nullptr)
        logHook()(messageLevel, "%s key must be non-NULL", allocation);
    else if (hasData && hasString)
        logHook()(messageLevel, "%s data and string are mutually exclusive", allocation);
    else if (!hasData && !hasString)
        logHook()(messageLevel, "%s either data or string must be non-null", allocation);
    else if (hasData && content.data.length == 0)
        logHook()(messageLevel, "%s data cannot be length zero", allocation);
    else
        return true;
    return false;
}

__SysConfig3MetadataEntry* sysconfig::makeEntry(const MetadataContent& content, const Room* room) {
    return allocEntry<__SysConfig3MetadataEntry>(content.key, content.string, content.data, room, allocation);
}

__SysConfig3MetadataEntry* allocSysConfig3MetadataEntry(const char* key, const std::uint8_t* data,
                                                        std::uint32_t dataLength, const char* string) {
    const MetadataContent content = {viewOf(key, maximumKeyLength), viewOf(data, dataLength),
                                     viewOf(string, maximumStringLength)};
    return isValidContent(content) ? makeEntry(content) : nullptr;
}

__SysConfig3MetadataEntry* copySysConfig3MetadataEntry(const __SysConfig3MetadataEntry* entry) {
    if (entry == nullptr)
        return nullptr;
    const MetadataContent content = {leadOf(*entry), dataOf(*entry), stringOf(*entry)};
    return isValidContent(content) ? makeEntry(content) : nullptr;
}

void deallocSysConfig3MetadataEntry(__SysConfig3MetadataEntry* entry) {
    std::free(entry);
}

bool sysConfig3MetadataEntriesAreEqual(const __SysConfig3MetadataEntry* a, const __SysConfig3MetadataEntry* b) {
    if (a == nullptr || b == nullptr)
        return a == b;
    return sameParts(*a, *b);
}

const char* sysConfig3MetadataEntryGetKey(const __SysConfig3MetadataEntry* entry) {
    return entry != nullptr ? leadOf(*entry).data() : nullptr;
}

const char* sysConfig3MetadataEntryGetString(const __SysConfig3MetadataEntry* entry) {
    return entry != nullptr ? stringOf(*entry).data() : nullptr;
}

bool sysConfig3MetadataEntryGetData(const __SysConfig3MetadataEntry* entry, SysConfigData* out) {
    return entry != nullptr && out != nullptr && viewData(*entry, out);
}

const __SysConfig3MetadataEntry* sysConfig3MetadataEntryGetNextEntry(const __SysConfig3MetadataEntry* entry) {
    return entry != nullptr ? entry->next : nullptr;
}

bool _sysConfig3AddMetadataEntry(__SysConfig3* object, const __SysConfig3MetadataEntry* entry) {
    if (object == nullptr || entry == nullptr)
        return logHook()(messageLevel, "%s invalid argument. sysconfig and entry cannot be NULL", addition), false;
    return addTo(&object->metadata, copySysConfig3MetadataEntry(entry), object->secret, addition);
}

bool _sysConfig3DeleteMetadataEntryForKey(__SysConfig3* object, const char* key) {
    constexpr char operation[] =
        "bool _sysConfig3DeleteMetadataEntryForKey(struct __SysConfig3 *__single, const char *)";
    if (object == nullptr || key == nullptr)
        return logHook()(messageLevel, "%s invalid argument. sysconfig and key cannot be NULL", operation), false;
    object->metadata.remove(object->secret, viewOf(key, maximumKeyLength));
    return true;
}

bool sysConfig3AddMetadataEntry(__SysConfig3* object, const __SysConfig3MetadataEntry* entry) {
    constexpr char operation[] =
        "bool sysConfig3AddMetadataEntry(struct __SysConfig3 *__single, const struct __SysConfig3MetadataEntry "
        "*__single)";
    if (object == nullptr || entry == nullptr)
        return logHook()(messageLevel, "%s invalid argument. sysconfig and entry cannot be NULL", operation), false;
    return hasNoStaleHMAC(object, operation) && _sysConfig3AddMetadataEntry(object, entry) &&
           metadataHasChanged(object);
}

bool sysConfig3DeleteMetadataEntryForKey(__SysConfig3* object, const char* key) {
    constexpr char operation[] =
        "bool sysConfig3DeleteMetadataEntryForKey(struct __SysConfig3 *__single, const char *)";
    if (object == nullptr || key == nullptr)
        return logHook()(messageLevel, "%s invalid argument. sysconfig and key cannot be NULL", operation), false;
    return hasNoStaleHMAC(object, operation) && _sysConfig3DeleteMetadataEntryForKey(object, key) &&
           metadataHasChanged(object);
}

const __SysConfig3MetadataEntry* sysConfig3GetMetadataEntryForKey(const __SysConfig3* object, const char* key) {
    constexpr char operation[] =
        "const struct __SysConfig3MetadataEntry *__singlesysConfig3GetMetadataEntryForKey(const struct __SysConfig3 "
        "*__single, const char *)";
    if (object == nullptr)
        return logHook()(messageLevel, "%s invalid argument. sysconfig cannot be NULL", operation), nullptr;
    return key != nullptr ? object->metadata.find(object->secret, viewOf(key, maximumKeyLength)) : nullptr;
}
