#include "sysconfig/SysConfig3.h"

#include <algorithm>
#include <cstdlib>

#include "sysconfig/SysConfig3Internal.h"

namespace {

SysConfig3LogHandler registeredLogHook = nullptr;
SysConfig3ExceptionHandler registeredExceptionHook = nullptr;

SYSCONFIG3_PRINTF(2, 3) void dropMessage(int, const char*, ...) {}

SYSCONFIG3_PRINTF(1, 2) void dropException(const char*, ...) {}

constexpr SysConfig3Magic supportedMagics[] = {
    0x30436667, // 0Cfg
    0x61707076, // appv
    0x62436667, // bCfg
    0x64436667, // dCfg
    0x65436667, // eCfg
    0x66436667, // fCfg
    0x6D436667, // mCfg
    0x7365616C, // seal
    0x74436667, // tCfg
};

constexpr SysConfig3Version firstVersion = 0x30001;
constexpr SysConfig3Version endOfVersions = 0x30004;

// Installs the manifest of an object whose HMACs were never computed.
bool installPlaceholderManifest(__SysConfig3* object) {
    std::uint8_t octet = 0x00;
    const SysConfigData placeholder = {&octet, sizeof octet};
    return sysconfig::installManifest(object, placeholder, placeholder, placeholder);
}

template <typename Entry>
bool listsAreEqual(const Entry* a, const Entry* b, bool (*entriesAreEqual)(const Entry*, const Entry*)) {
    while (a != nullptr && b != nullptr && entriesAreEqual(a, b)) {
        a = a->next;
        b = b->next;
    }
    return a == nullptr && b == nullptr;
}

} // namespace

SysConfig3LogHandler sysconfig::logHook() {
    return registeredLogHook != nullptr ? registeredLogHook : dropMessage;
}

SysConfig3ExceptionHandler sysconfig::exceptionHook() {
    return registeredExceptionHook != nullptr ? registeredExceptionHook : dropException;
}

void setSysConfig3LogHandler(SysConfig3LogHandler handler) {
    registeredLogHook = handler;
}

SysConfig3LogHandler getSysConfig3LogHandler(void) {
    return registeredLogHook;
}

void setSysConfig3ExceptionHandler(SysConfig3ExceptionHandler handler) {
    registeredExceptionHook = handler;
}

SysConfig3ExceptionHandler getSysConfig3ExceptionHandler(void) {
    return registeredExceptionHook;
}

bool isSupportedSysConfig3Magic(SysConfig3Magic magic) {
    return std::find(std::begin(supportedMagics), std::end(supportedMagics), magic) != std::end(supportedMagics);
}

bool isSupportedSysConfig3Version(SysConfig3Version version) {
    return version >= firstVersion && version < endOfVersions;
}

__SysConfig3* allocSysConfig3(SysConfig3Magic magic, SysConfig3Version version) {
    using namespace sysconfig;
    constexpr char operation[] = "struct __SysConfig3 *__singleallocSysConfig3(SysConfig3Magic, SysConfig3Version)";
    if (!isSupportedSysConfig3Magic(magic))
        return logHook()(messageLevel, "%s invalid magic provided 0x%08X", operation, magic), nullptr;
    if (!isSupportedSysConfig3Version(version))
        return logHook()(messageLevel, "%s invalid version provided 0x%08X", operation, version), nullptr;
    auto* const object = static_cast<__SysConfig3*>(std::calloc(1, sizeof(__SysConfig3)));
    if (object == nullptr)
        return logHook()(messageLevel, "%s malloc failed.", operation), nullptr;
    object->magic = magic;
    object->version = version;
    if (!crypto::randomBytes(&object->secret, sizeof object->secret))
        logHook()(messageLevel, "%s random source failed.", operation);
    else if (installPlaceholderManifest(object))
        return object;
    deallocSysConfig3(object);
    return nullptr;
}

void deallocSysConfig3(__SysConfig3* object) {
    if (object == nullptr || !isSupportedSysConfig3Magic(object->magic))
        return;
    object->magic = 0;
    object->version = 0;
    object->payload.clear();
    object->metadata.clear();
    deallocSysConfig3Manifest(object->manifest);
    sysconfig::releaseSecret(&object->hmacKey);
    std::free(object);
}

bool sysConfig3ObjectsAreEqual(const __SysConfig3* a, const __SysConfig3* b) {
    if (a == nullptr || b == nullptr)
        return false;
    return a->magic == b->magic && a->version == b->version &&
           listsAreEqual(a->payload.first, b->payload.first, sysConfig3PayloadEntriesAreEqual) &&
           listsAreEqual(a->metadata.first, b->metadata.first, sysConfig3MetadataEntriesAreEqual) &&
           sysConfig3ManifestsAreEqual(a->manifest, b->manifest);
}

SysConfig3Magic sysConfig3GetMagic(const __SysConfig3* object) {
    return object != nullptr ? object->magic : 0;
}

SysConfig3Version sysConfig3GetVersion(const __SysConfig3* object) {
    return object != nullptr ? object->version : 0;
}

const __SysConfig3PayloadEntry* sysConfig3GetHeadPayloadEntry(const __SysConfig3* object) {
    return object != nullptr ? object->payload.first : nullptr;
}

const __SysConfig3MetadataEntry* sysConfig3GetHeadMetadataEntry(const __SysConfig3* object) {
    return object != nullptr ? object->metadata.first : nullptr;
}

const __SysConfig3ManifestEntry* sysConfig3GetManifest(const __SysConfig3* object) {
    return object != nullptr ? object->manifest : nullptr;
}

std::uint32_t sysConfig3GetPayloadEntryCount(const __SysConfig3* object) {
    return object != nullptr ? object->payload.count : 0;
}

std::uint32_t sysConfig3GetMetadataEntryCount(const __SysConfig3* object) {
    return object != nullptr ? object->metadata.count : 0;
}
