// Blobs put together by hand, and shorthands for the library's records.
#ifndef VELTRA_TESTS_SYSCONFIG_BLOB_H
#define VELTRA_TESTS_SYSCONFIG_BLOB_H

#include <cstdint>
#include <initializer_list>
#include <string>
#include <string_view>

#include "sysconfig/SysConfig3Ptr.h"
#include "tests/der/Bytes.h"

constexpr SysConfig3Magic bCfg = 0x62436667;
constexpr std::uint32_t keyWCh0 = 0x57436830;
constexpr std::uint32_t keyMiGB = 0x4D694742;

inline std::uint8_t keyBytes[] = {'k', 'e', 'y'};
inline const SysConfigData hmacKey = {keyBytes, sizeof keyBytes};

inline Bytes joined(std::initializer_list<Bytes> parts) {
    Bytes all;
    for (const Bytes& part : parts)
        all.insert(all.end(), part.begin(), part.end());
    return all;
}

inline Bytes text(std::string_view characters) {
    return {characters.begin(), characters.end()};
}

// One DER item with the given identifier octets. Written out here, so that it does not rest on the codec under test.
inline Bytes item(std::string_view identifier, const Bytes& content) {
    Bytes length;
    for (std::size_t rest = content.size(); rest > 0; rest >>= 8)
        length.insert(length.begin(), static_cast<std::uint8_t>(rest));
    if (content.size() < 0x80)
        length = {static_cast<std::uint8_t>(content.size())};
    else
        length.insert(length.begin(), static_cast<std::uint8_t>(0x80 | length.size()));
    return joined({bytes(identifier), length, content});
}

// The parts of a blob, those of the smallest valid one unless changed.
struct BlobParts {
    Bytes magic = bytes("67 66 43 62");
    Bytes version = bytes("03 00 03 00");
    Bytes payload = bytes("31 00");
    Bytes metadata = bytes("31 00");
    Bytes manifest = bytes("30 09 04 01 00 04 01 00 04 01 00");

    Bytes whole() const {
        return item("30", joined({item("02", magic), item("02", version), item("FF 85 9A C1 82 59", payload),
                                  item("FF 84 EA 95 A8 41", metadata), item("FF 84 EA 85 9C 49", manifest)}));
    }
};

inline sysconfig::SysConfig3Ptr decode(const Bytes& blob) {
    return sysconfig::SysConfig3Ptr(decodeSysConfig3(blob.data(), static_cast<std::uint32_t>(blob.size())));
}

// The encoded object, empty when it cannot be encoded.
inline Bytes encode(const __SysConfig3* object) {
    SysConfigData out = {};
    if (!encodeSysConfig3(object, &out))
        return {};
    const sysconfig::BytesPtr owner(out.data);
    return {out.data, out.data + out.length};
}

inline sysconfig::SysConfig3Ptr newObject(SysConfig3Version version = 0x30003) {
    return sysconfig::SysConfig3Ptr(allocSysConfig3(bCfg, version));
}

inline sysconfig::PayloadEntryPtr payloadData(std::uint32_t key, const Bytes& data, const char* comment = nullptr) {
    return sysconfig::PayloadEntryPtr(
        allocSysConfig3PayloadEntryWithData(key, comment, data.data(), static_cast<std::uint32_t>(data.size())));
}

inline sysconfig::PayloadEntryPtr payloadString(std::uint32_t key, const char* string, const char* comment = nullptr) {
    return sysconfig::PayloadEntryPtr(allocSysConfig3PayloadEntryWithString(key, comment, string));
}

inline sysconfig::PayloadEntryPtr payloadDeleted(std::uint32_t key, const char* comment = nullptr) {
    return sysconfig::PayloadEntryPtr(allocSysConfig3PayloadEntryDeleted(key, comment));
}

inline sysconfig::MetadataEntryPtr metadataData(const char* key, const Bytes& data) {
    return sysconfig::MetadataEntryPtr(
        allocSysConfig3MetadataEntry(key, data.data(), static_cast<std::uint32_t>(data.size()), nullptr));
}

inline sysconfig::MetadataEntryPtr metadataString(const char* key, const char* string) {
    return sysconfig::MetadataEntryPtr(allocSysConfig3MetadataEntry(key, nullptr, 0, string));
}

inline bool add(const sysconfig::SysConfig3Ptr& object, const sysconfig::PayloadEntryPtr& entry) {
    return sysConfig3AddPayloadEntry(object.get(), entry.get());
}

inline bool add(const sysconfig::SysConfig3Ptr& object, const sysconfig::MetadataEntryPtr& entry) {
    return sysConfig3AddMetadataEntry(object.get(), entry.get());
}

// What a list shows of an entry, "key=data 01 02", "key=string text" or "key=deleted".
inline std::string textOf(const std::string& key, bool hasData, const SysConfigData& data, const char* string,
                          bool isDeleted = false) {
    return key + (hasData ? "=data " + hexOf(data.data, data.length) : "") +
           (string != nullptr ? std::string("=string ") + string : "") + (isDeleted ? "=deleted" : "");
}

inline std::string textOf(const __SysConfig3PayloadEntry* entry) {
    SysConfigData data = {};
    const bool hasData = sysConfig3PayloadEntryGetData(entry, &data);
    std::string key, comment = sysConfig3PayloadEntryGetComment(entry);
    for (int shift = 24; shift >= 0; shift -= 8)
        key += static_cast<char>(sysConfig3PayloadEntryGetKey(entry) >> shift);
    return textOf(key + (comment == "." ? "" : " (" + comment + ")"), hasData, data,
                  sysConfig3PayloadEntryGetString(entry), sysConfig3PayloadEntryGetDeleted(entry));
}

inline std::string textOf(const __SysConfig3MetadataEntry* entry) {
    SysConfigData data = {};
    const bool hasData = sysConfig3MetadataEntryGetData(entry, &data);
    return textOf(sysConfig3MetadataEntryGetKey(entry), hasData, data, sysConfig3MetadataEntryGetString(entry));
}

// The entries from this one on.
template <typename Entry>
std::string listOf(const Entry* entry, const Entry* (*next)(const Entry*)) {
    std::string list;
    for (; entry != nullptr; entry = next(entry))
        list += (list.empty() ? "" : ", ") + textOf(entry);
    return list;
}

// The payload list in order, "WCh0=data 01 02, MiGB (comment)=string text".
inline std::string payloadOf(const sysconfig::SysConfig3Ptr& object) {
    return listOf(sysConfig3GetHeadPayloadEntry(object.get()), sysConfig3PayloadEntryGetNextEntry);
}

inline std::string metadataOf(const sysconfig::SysConfig3Ptr& object) {
    return listOf(sysConfig3GetHeadMetadataEntry(object.get()), sysConfig3MetadataEntryGetNextEntry);
}

// The manifest, "00|00|absent".
inline std::string manifestOf(const sysconfig::SysConfig3Ptr& object) {
    std::string list;
    for (const auto get :
         {sysConfig3ManifestGetPayloadHMAC, sysConfig3ManifestGetMetadataHMAC, sysConfig3ManifestGetFullHMAC}) {
        SysConfigData hmac = {};
        const bool isAnswered = get(sysConfig3GetManifest(object.get()), &hmac);
        list += list.empty() ? "" : "|";
        list += !isAnswered ? "none" : hmac.data == nullptr ? "absent" : hexOf(hmac.data, hmac.length);
    }
    std::erase(list, ' ');
    return list;
}

#endif
