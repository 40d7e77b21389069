// The records of SysConfig3.h and the operations that its source files share. Not installed.
#ifndef VELTRA_SYSCONFIG_SYSCONFIG3INTERNAL_H
#define VELTRA_SYSCONFIG_SYSCONFIG3INTERNAL_H

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string_view>

#include "der/DERTypes.h"
#include "platform/Crypto.h"
#include "sysconfig/EntryList.h"
#include "sysconfig/SysConfig3.h"

// Records
//
// An entry and its texts and bytes are one piece of memory: the record, then each text with its NUL, then the data.

struct __SysConfig3PayloadEntry {
    __SysConfig3PayloadEntry* next;
    __SysConfig3PayloadEntry* previous;
    __SysConfig3PayloadEntry* bucketNext;
    // Of the text that every entry of the kind has: here the comment.
    std::uint32_t leadLength;
    // sysconfig::noString when the entry has no string.
    std::uint32_t stringLength;
    // 0 when the entry has no data.
    std::uint32_t dataLength;
    std::uint32_t key;
    // The content octet of a DER BOOLEAN: 0x00 or 0xFF.
    std::uint8_t deleted;
    bool isInBlock;

    std::uint32_t indexKey() const { return key; }
};

struct __SysConfig3MetadataEntry {
    __SysConfig3MetadataEntry* next;
    __SysConfig3MetadataEntry* previous;
    __SysConfig3MetadataEntry* bucketNext;
    std::uint32_t leadLength; // of the key
    std::uint32_t stringLength;
    std::uint32_t dataLength;
    bool isInBlock;

    std::string_view indexKey() const { return {reinterpret_cast<const char*>(this + 1), leadLength}; }
};

// The HMACs own their bytes.
struct __SysConfig3ManifestEntry {
    SysConfig3Version version;
    SysConfigData payloadHMAC;
    SysConfigData metadataHMAC;
    SysConfigData fullHMAC;
};

namespace sysconfig {

using PayloadList = EntryList<__SysConfig3PayloadEntry, std::uint32_t>;
using MetadataList = EntryList<__SysConfig3MetadataEntry, std::string_view>;

} // namespace sysconfig

struct __SysConfig3 {
    SysConfig3Magic magic;
    SysConfig3Version version;
    sysconfig::PayloadList payload;
    sysconfig::MetadataList metadata;
    __SysConfig3ManifestEntry* manifest;
    SysConfigData hmacKey;
    sysconfig::HashSecret secret;
};

namespace sysconfig {

constexpr std::uint32_t noString = UINT32_MAX;
constexpr std::size_t maximumStringLength = 0x1000000;
constexpr std::size_t maximumKeyLength = 256;
constexpr std::uint8_t trueOctet = 0xFF;
constexpr std::uint8_t falseOctet = 0x00;
constexpr SysConfig3Version hmacVersion = 0x30002;
constexpr SysConfig3Version deletedFlagVersion = 0x30003;
// The version in which two absent HMACs are equal.
constexpr SysConfig3Version absentHMACVersion = 0x30001;

// A view of bytes; null data when absent.
struct Bytes {
    const std::uint8_t* data;
    std::uint32_t length;
};

// The parts of an entry. An absent text has null data.

template <typename Entry>
std::string_view leadOf(const Entry& entry) {
    return {reinterpret_cast<const char*>(&entry + 1), entry.leadLength};
}

template <typename Entry>
std::string_view stringOf(const Entry& entry) {
    if (entry.stringLength == noString)
        return {};
    return {leadOf(entry).end() + 1, entry.stringLength};
}

template <typename Entry>
std::size_t sizeOfTexts(const Entry& entry) {
    const std::size_t stringSize = entry.stringLength == noString ? 0 : std::size_t{entry.stringLength} + 1;
    return std::size_t{entry.leadLength} + 1 + stringSize;
}

template <typename Entry>
Bytes dataOf(const Entry& entry) {
    if (entry.dataLength == 0)
        return {};
    return {reinterpret_cast<const std::uint8_t*>(&entry + 1) + sizeOfTexts(entry), entry.dataLength};
}

// Sets *out to a view of the data, which public views give as changeable. False when there is none.
template <typename Entry>
bool viewData(const Entry& entry, SysConfigData* out) {
    const Bytes data = dataOf(entry);
    if (data.data == nullptr)
        return false;
    *out = {const_cast<std::uint8_t*>(data.data), data.length};
    return true;
}

// Whether texts and data are the same.
template <typename Entry>
bool sameParts(const Entry& a, const Entry& b) {
    return a.leadLength == b.leadLength && a.stringLength == b.stringLength && a.dataLength == b.dataLength &&
           std::memcmp(&a + 1, &b + 1, sizeOfTexts(a) + a.dataLength) == 0;
}

// Reporting

// The level of every message.
constexpr int messageLevel = 2;

// The registered hook, or a function that does nothing. Called as
// logHook()(messageLevel, "%s ...", operation, arguments...).
SysConfig3LogHandler logHook();
SysConfig3ExceptionHandler exceptionHook();

// Making entries

// What is to go into an entry, as views. Absent parts have null data.
struct PayloadContent {
    std::uint32_t key;
    std::string_view comment;
    Bytes data;
    std::string_view string;
    bool deleted;
};

struct MetadataContent {
    std::string_view key;
    Bytes data;
    std::string_view string;
};

// At most the first `maximum` characters of `text`, up to its NUL. Null gives an absent view.
std::string_view viewOf(const char* text, std::size_t maximum);

// The `length` bytes at `data`. Null gives an absent view, whatever the length.
inline Bytes viewOf(const std::uint8_t* data, std::uint32_t length) {
    return {data, data != nullptr ? length : 0};
}

// False, after reporting why, when no entry can be made of the content.
bool isValidContent(const PayloadContent& content);
bool isValidContent(const MetadataContent& content);

// Where an entry of a blob gets its memory. It has `octets` of the `rest` of the blob's list.
struct Room {
    Blocks* blocks;
    std::uint64_t octets;
    std::uint64_t rest;
};

// Makes an entry of the content, from malloc unless there is a room. Null, after reporting it, when memory is lacking.
__SysConfig3PayloadEntry* makeEntry(const PayloadContent& content, const Room* room = nullptr);
__SysConfig3MetadataEntry* makeEntry(const MetadataContent& content, const Room* room = nullptr);

// Allocates a zeroed entry with the given parts behind it and their lengths set. Null, after reporting it for
// `operation`, when memory is lacking.
template <typename Entry>
Entry* allocEntry(std::string_view lead, std::string_view string, Bytes data, const Room* room, const char* operation) {
    const bool hasString = string.data() != nullptr;
    const std::uint64_t size =
        std::uint64_t{sizeof(Entry)} + lead.size() + 1 + (hasString ? string.size() + 1 : 0) + data.length;
    void* memory = nullptr;
    if (size <= PTRDIFF_MAX && room != nullptr)
        memory = room->blocks->take(static_cast<std::size_t>(size), room->octets, room->rest);
    else if (size <= PTRDIFF_MAX)
        memory = std::malloc(static_cast<std::size_t>(size));
    if (memory == nullptr)
        return logHook()(messageLevel, "%s malloc failed.", operation), nullptr;
    auto* const entry = static_cast<Entry*>(memory);
    *entry = {};
    entry->isInBlock = room != nullptr;
    entry->leadLength = static_cast<std::uint32_t>(lead.size());
    auto* out = reinterpret_cast<char*>(entry + 1);
    out = std::copy(lead.begin(), lead.end(), out);
    *out++ = '\0';
    entry->stringLength = noString;
    if (hasString) {
        entry->stringLength = static_cast<std::uint32_t>(string.size());
        out = std::copy(string.begin(), string.end(), out);
        *out++ = '\0';
    }
    entry->dataLength = data.length;
    std::copy_n(data.data, data.length, reinterpret_cast<std::uint8_t*>(out));
    return entry;
}

// Changing the lists

// Adds an entry, null for none, and releases it when that fails. False, after reporting for `operation` that memory is
// lacking if it is.
template <typename List, typename Entry>
bool addTo(List* list, Entry* entry, const HashSecret& secret, const char* operation) {
    if (entry == nullptr || list->add(entry, secret))
        return entry != nullptr;
    logHook()(messageLevel, "%s malloc failed.", operation);
    std::free(entry);
    return false;
}

// Manifests

// Gives the object a new manifest of its version with copies of the HMACs. False when memory is lacking.
bool installManifest(__SysConfig3* object, const SysConfigData& payloadHMAC, const SysConfigData& metadataHMAC,
                     const SysConfigData& fullHMAC);

// HMACs

// True when the object's version has no HMACs or they are valid. Otherwise reports it for `operation`.
bool hasNoStaleHMAC(const __SysConfig3* object, const char* operation);

// Recompute the HMACs that cover the list, where the version has them. True, whatever comes of that: the change stands.
bool payloadHasChanged(__SysConfig3* object);
bool metadataHasChanged(__SysConfig3* object);

// Overwrites and releases the bytes of a key and leaves it absent.
void releaseSecret(SysConfigData* secret);

} // namespace sysconfig

__SysConfig3PayloadEntry* _allocSysConfig3PayloadEntryInternal(std::uint32_t key, const char* comment,
                                                               const std::uint8_t* data, std::uint32_t dataLength,
                                                               const char* string, bool deleted);

// The list changes without the rules on HMACs and on the deleted flag. An add without an entry is reported.
bool _sysConfig3AddPayloadEntry(__SysConfig3* object, const __SysConfig3PayloadEntry* entry);
bool _sysConfig3AddMetadataEntry(__SysConfig3* object, const __SysConfig3MetadataEntry* entry);
bool _sysConfig3DeletePayloadEntryForKey(__SysConfig3* object, std::uint32_t key);
bool _sysConfig3DeleteMetadataEntryForKey(__SysConfig3* object, const char* key);

// Installs a copy of the manifest in the object.
bool _sysConfig3SetManifest(__SysConfig3* object, const __SysConfig3ManifestEntry* manifest);

// Whether two HMACs are equal by the rules of the version.
bool _sysConfig3HMACsAreEqual(SysConfig3Version version, const SysConfigData* a, const SysConfigData* b);

// A copy of `length` bytes, or null.
std::uint8_t* _allocAndCopyData(const std::uint8_t* source, std::uint32_t length);

// Sets *destination to a copy of the source. An empty source is reported and clears the destination. False when there
// is no copy; when memory is lacking the destination is left as it was.
bool _copySysConfigData(const SysConfigData* source, SysConfigData* destination);

// Feed the stream of a list, from its first entry on, to an HMAC.
void _updatePayloadHMAC(const __SysConfig3PayloadEntry* first, crypto::HMACSHA256* context);
void _updateMetadataHMAC(const __SysConfig3MetadataEntry* first, crypto::HMACSHA256* context);

namespace sysconfig {

// What a walk over a SET of entries fills: the context of its callbacks.
struct Decoding {
    __SysConfig3* object;
    DERRefusal* refusal;     // why an entry's items were refused
    const std::uint8_t* end; // of the SET's content
};

} // namespace sysconfig

// The walk's callbacks: each parses one entry of a SET and appends it to its list of the `context`'s object. An entry
// that no record can hold is reported and left out. They do not index what they append: no look-up finds it before the
// walk's caller has called the list's indexAll.
DERReturn _DERDecodeSysConfig3ParseAndPopulatePayloadSequence(const DERDecodedInfo* decoded, bool* stop, void* context);
DERReturn _DERDecodeSysConfig3ParseAndPopulateMetadataSequence(const DERDecodedInfo* decoded, bool* stop,
                                                               void* context);

#endif
