// Payload entries, and an object's list of them.
#include "sysconfig/SysConfig3Internal.h"

namespace {

using namespace sysconfig;

constexpr char allocation[] = "struct __SysConfig3PayloadEntry *__single_allocSysConfig3PayloadEntryInternal(uint32_t, "
                              "const char *, const uint8_t *, uint32_t, const char *, bool)";
constexpr char addition[] = "bool _sysConfig3AddPayloadEntry(struct __SysConfig3 *__single, const struct "
                            "__SysConfig3PayloadEntry *__single)";

} // namespace

bool sysconfig::isValidContent(const PayloadContent& content) {
    const bool hasData = content.data.data != nullptr;
    const bool hasString = content.string.data() != nullptr;
    const int kinds = int{hasData} + int{hasString} + int{content.deleted};
    if (content.key == 0)
        logHook()(messageLevel, "%s key was invalid", allocation);
    else if (kinds == 0)
        logHook()(messageLevel, "%s one of data, string, or deleted must be provided", allocation);
    else if (kinds > 1)
        logHook()(messageLevel,
                  "%s data, string and deleted are mutually exclusive. Caller provided parameters [%s%s%s ]",
                  allocation, hasData ? " data" : "", hasString ? " string" : "", content.deleted ? " deleted" : "");
    else if (hasData && content.data.length == 0)
        logHook()(messageLevel, "%s data was 0 length", allocation);
    else
        return true;
    return false;
}

__SysConfig3PayloadEntry* sysconfig::makeEntry(const PayloadContent& content, const Room* room) {
    const std::string_view comment = content.comment.empty() ? "." : content.comment;
    auto* const entry = allocEntry<__SysConfig3PayloadEntry>(comment, content.string, content.data, room, allocation);
    if (entry != nullptr) {
        entry->key = content.key;
        entry->deleted = content.deleted ? trueOctet : falseOctet;
    }
    return entry;
}

__SysConfig3PayloadEntry* _allocSysConfig3PayloadEntryInternal(std::uint32_t key, const char* comment,
                                                               const std::uint8_t* data, std::uint32_t dataLength,
                                                               const char* string, bool deleted) {
    const PayloadContent content = {key, viewOf(comment, maximumStringLength), viewOf(data, dataLength),
                                    viewOf(string, maximumStringLength), deleted};
    return isValidContent(content) ? makeEntry(content) : nullptr;
}

__SysConfig3PayloadEntry* allocSysConfig3PayloadEntryWithString(std::uint32_t key, const char* comment,
                                                                const char* string) {
    return _allocSysConfig3PayloadEntryInternal(key, comment, nullptr, 0, string, false);
}

__SysConfig3PayloadEntry* allocSysConfig3PayloadEntryWithData(std::uint32_t key, const char* comment,
                                                              const std::uint8_t* data, std::uint32_t dataLength) {
    return _allocSysConfig3PayloadEntryInternal(key, comment, data, dataLength, nullptr, false);
}

__SysConfig3PayloadEntry* allocSysConfig3PayloadEntryDeleted(std::uint32_t key, const char* comment) {
    return _allocSysConfig3PayloadEntryInternal(key, comment, nullptr, 0, nullptr, true);
}

__SysConfig3PayloadEntry* copySysConfig3PayloadEntry(const __SysConfig3PayloadEntry* entry) {
    if (entry == nullptr)
        return nullptr;
    const PayloadContent content = {entry->key, leadOf(*entry), dataOf(*entry), stringOf(*entry),
                                    entry->deleted != falseOctet};
    return isValidContent(content) ? makeEntry(content) : nullptr;
}

void deallocSysConfig3PayloadEntry(__SysConfig3PayloadEntry* entry) {
    std::free(entry);
}

bool sysConfig3PayloadEntriesAreEqual(const __SysConfig3PayloadEntry* a, const __SysConfig3PayloadEntry* b) {
    if (a == nullptr || b == nullptr)
        return a == b;
    return a->key == b->key && a->deleted == b->deleted && sameParts(*a, *b);
}

std::uint32_t sysConfig3PayloadEntryGetKey(const __SysConfig3PayloadEntry* entry) {
    return entry != nullptr ? entry->key : 0;
}

const char* sysConfig3PayloadEntryGetComment(const __SysConfig3PayloadEntry* entry) {
    return entry != nullptr ? leadOf(*entry).data() : nullptr;
}

bool sysConfig3PayloadEntryGetDeleted(const __SysConfig3PayloadEntry* entry) {
    return entry != nullptr && entry->deleted != falseOctet;
}

const char* sysConfig3PayloadEntryGetString(const __SysConfig3PayloadEntry* entry) {
    return entry != nullptr ? stringOf(*entry).data() : nullptr;
}

const __SysConfig3PayloadEntry* sysConfig3PayloadEntryGetNextEntry(const __SysConfig3PayloadEntry* entry) {
    return entry != nullptr ? entry->next : nullptr;
}

bool sysConfig3PayloadEntryGetData(const __SysConfig3PayloadEntry* entry, SysConfigData* out) {
    constexpr char operation[] =
        "bool sysConfig3PayloadEntryGetData(const struct __SysConfig3PayloadEntry *__single, SysConfigData *__single)";
    if (entry == nullptr || out == nullptr)
        return logHook()(messageLevel, "%s invalid arguments. Either entry or data was NULL", operation), false;
    return viewData(*entry, out);
}

bool _sysConfig3AddPayloadEntry(__SysConfig3* object, const __SysConfig3PayloadEntry* entry) {
    if (object == nullptr || entry == nullptr)
        return logHook()(messageLevel, "%s invalid argument. sysconfig and etnry cannot be NULL", addition), false;
    return addTo(&object->payload, copySysConfig3PayloadEntry(entry), object->secret, addition);
}

bool _sysConfig3DeletePayloadEntryForKey(__SysConfig3* object, std::uint32_t key) {
    constexpr char operation[] = "bool _sysConfig3DeletePayloadEntryForKey(struct __SysConfig3 *__single, uint32_t)";
    if (object == nullptr)
        return logHook()(messageLevel, "%s invalid argument. sysconfig cannot be NULL", operation), false;
    object->payload.remove(object->secret, key);
    return true;
}

bool sysConfig3AddPayloadEntry(__SysConfig3* object, const __SysConfig3PayloadEntry* entry) {
    constexpr char operation[] = "bool sysConfig3AddPayloadEntry(struct __SysConfig3 *__single, const struct "
                                 "__SysConfig3PayloadEntry *__single)";
    if (object == nullptr || entry == nullptr)
        return logHook()(messageLevel, "%s invalid argument. sysconfig and entry cannot be NULL", operation), false;
    if (!hasNoStaleHMAC(object, operation))
        return false;
    if (entry->deleted != falseOctet && object->version < deletedFlagVersion) {
        logHook()(messageLevel, "%s Payloads with the deleted flag are only supported on version 0x%08X or higher.",
                  operation, deletedFlagVersion);
        return false;
    }
    return _sysConfig3AddPayloadEntry(object, entry) && payloadHasChanged(object);
}

bool sysConfig3DeletePayloadEntryForKey(__SysConfig3* object, std::uint32_t key) {
    constexpr char operation[] = "bool sysConfig3DeletePayloadEntryForKey(struct __SysConfig3 *__single, uint32_t)";
    if (object == nullptr)
        return logHook()(messageLevel, "%s invalid argument. sysconfig cannot be NULL", operation), false;
    return hasNoStaleHMAC(object, operation) && _sysConfig3DeletePayloadEntryForKey(object, key) &&
           payloadHasChanged(object);
}

const __SysConfig3PayloadEntry* sysConfig3GetPayloadEntryForKey(const __SysConfig3* object, std::uint32_t key) {
    constexpr char operation[] =
        "const struct __SysConfig3PayloadEntry *__singlesysConfig3GetPayloadEntryForKey(const struct __SysConfig3 "
        "*__single, uint32_t)";
    if (object == nullptr)
        return logHook()(messageLevel, "%s invalid argument. sysconfig cannot be NULL", operation), nullptr;
    return object->payload.find(object->secret, key);
}
