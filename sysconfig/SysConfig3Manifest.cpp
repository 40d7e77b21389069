// Manifests, and the byte strings that they and the key are made of.
#include "sysconfig/SysConfig3Internal.h"

namespace {

using namespace sysconfig;

// Compares without an early end, so that the time taken does not tell where a forged HMAC differs.
bool sameBytes(const std::uint8_t* a, const std::uint8_t* b, std::uint32_t length) {
    std::uint8_t difference = 0;
    for (std::uint32_t i = 0; i < length; ++i)
        difference = static_cast<std::uint8_t>(difference | (a[i] ^ b[i]));
    return difference == 0;
}

bool isPresent(const SysConfigData& data) {
    return data.data != nullptr && data.length > 0;
}

bool copyIfPresent(const SysConfigData& source, SysConfigData* destination) {
    return !isPresent(source) || _copySysConfigData(&source, destination);
}

bool viewHMAC(const __SysConfig3ManifestEntry* manifest, SysConfigData __SysConfig3ManifestEntry::*hmac,
              SysConfigData* out, const char* operation) {
    if (manifest == nullptr || out == nullptr)
        return logHook()(messageLevel, "%s invalid arguments. entry and data cannot be null", operation), false;
    *out = manifest->*hmac;
    return true;
}

} // namespace

bool sysconfig::installManifest(__SysConfig3* object, const SysConfigData& payloadHMAC,
                                const SysConfigData& metadataHMAC, const SysConfigData& fullHMAC) {
    __SysConfig3ManifestEntry* const manifest =
        allocSysConfig3Manifest(object->version, &payloadHMAC, &metadataHMAC, &fullHMAC);
    if (manifest == nullptr)
        return false;
    deallocSysConfig3Manifest(object->manifest);
    object->manifest = manifest;
    return true;
}

std::string_view sysconfig::viewOf(const char* text, std::size_t maximum) {
    if (text == nullptr)
        return {};
    const void* const end = std::memchr(text, '\0', maximum);
    return {text, end != nullptr ? static_cast<std::size_t>(static_cast<const char*>(end) - text) : maximum};
}

std::uint8_t* _allocAndCopyData(const std::uint8_t* source, std::uint32_t length) {
    constexpr char operation[] = "uint8_t *__single_allocAndCopyData(const uint8_t *, uint32_t)";
    if (source == nullptr || length == 0)
        return logHook()(messageLevel, "%s data was zero length", operation), nullptr;
    auto* const copy = static_cast<std::uint8_t*>(std::malloc(length));
    if (copy == nullptr)
        return logHook()(messageLevel, "%s malloc failed.", operation), nullptr;
    std::memcpy(copy, source, length);
    return copy;
}

bool _copySysConfigData(const SysConfigData* source, SysConfigData* destination) {
    constexpr char operation[] = "bool _copySysConfigData(const SysConfigData *__single, SysConfigData *__single)";
    if (source == nullptr || destination == nullptr)
        return logHook()(messageLevel, "%s sourceData or destData was NULL", operation), false;
    if (!isPresent(*source)) {
        *destination = {};
        logHook()(messageLevel, "%s sourceData was 0 length", operation);
        return false;
    }
    std::uint8_t* const copy = _allocAndCopyData(source->data, source->length);
    if (copy == nullptr)
        return false;
    *destination = {copy, source->length};
    return true;
}

__SysConfig3ManifestEntry* allocSysConfig3Manifest(SysConfig3Version version, const SysConfigData* payloadHMAC,
                                                   const SysConfigData* metadataHMAC, const SysConfigData* fullHMAC) {
    constexpr char operation[] =
        "struct __SysConfig3ManifestEntry *__singleallocSysConfig3Manifest(SysConfig3Version, const SysConfigData "
        "*__single, const SysConfigData *__single, const SysConfigData *__single)";
    if (payloadHMAC == nullptr || metadataHMAC == nullptr || fullHMAC == nullptr) {
        logHook()(messageLevel, "%s one of the hmacs were NULL. payload ptr: %p metdata ptr: %p full ptr: %p",
                  operation, static_cast<const void*>(payloadHMAC), static_cast<const void*>(metadataHMAC),
                  static_cast<const void*>(fullHMAC));
        return nullptr;
    }
    auto* const manifest = static_cast<__SysConfig3ManifestEntry*>(std::calloc(1, sizeof(__SysConfig3ManifestEntry)));
    if (manifest == nullptr)
        return logHook()(messageLevel, "%s malloc failed.", operation), nullptr;
    manifest->version = version;
    if (copyIfPresent(*payloadHMAC, &manifest->payloadHMAC) && copyIfPresent(*metadataHMAC, &manifest->metadataHMAC) &&
        copyIfPresent(*fullHMAC, &manifest->fullHMAC))
        return manifest;
    deallocSysConfig3Manifest(manifest);
    return nullptr;
}

__SysConfig3ManifestEntry* copySysConfig3Manifest(const __SysConfig3ManifestEntry* manifest) {
    if (manifest == nullptr)
        return nullptr;
    return allocSysConfig3Manifest(manifest->version, &manifest->payloadHMAC, &manifest->metadataHMAC,
                                   &manifest->fullHMAC);
}

void deallocSysConfig3Manifest(__SysConfig3ManifestEntry* manifest) {
    if (manifest == nullptr)
        return;
    std::free(manifest->payloadHMAC.data);
    std::free(manifest->metadataHMAC.data);
    std::free(manifest->fullHMAC.data);
    std::free(manifest);
}

bool _sysConfig3SetManifest(__SysConfig3* object, const __SysConfig3ManifestEntry* manifest) {
    constexpr char operation[] = "bool _sysConfig3SetManifest(struct __SysConfig3 *__single, const struct "
                                 "__SysConfig3ManifestEntry *__single)";
    if (object == nullptr || manifest == nullptr) {
        logHook()(messageLevel, "%s sysconfig (0x%p) or manifest (0x%p) argument was null", operation,
                  static_cast<const void*>(object), static_cast<const void*>(manifest));
        return false;
    }
    if (object->version != manifest->version) {
        logHook()(messageLevel, "%s sysconfig version (0X%08X) did not match manifest version (0X%08X", operation,
                  object->version, manifest->version);
        return false;
    }
    return installManifest(object, manifest->payloadHMAC, manifest->metadataHMAC, manifest->fullHMAC);
}

bool _sysConfig3HMACsAreEqual(SysConfig3Version version, const SysConfigData* a, const SysConfigData* b) {
    constexpr char operation[] = "bool _sysConfig3HMACsAreEqual(SysConfig3Version, const SysConfigData *__single, "
                                 "const SysConfigData *__single)";
    if (!isSupportedSysConfig3Version(version))
        return logHook()(messageLevel, "%s Unsupported sysconfig version: 0x%X", operation, version), false;
    if (a == nullptr || b == nullptr)
        return false;
    if (a->data == nullptr)
        return version == absentHMACVersion && b->data == nullptr;
    return b->data != nullptr && a->length == b->length && sameBytes(a->data, b->data, a->length);
}

bool sysConfig3ManifestsAreEqual(const __SysConfig3ManifestEntry* a, const __SysConfig3ManifestEntry* b) {
    if (a == nullptr || b == nullptr)
        return false;
    return a->version == b->version && _sysConfig3HMACsAreEqual(a->version, &a->payloadHMAC, &b->payloadHMAC) &&
           _sysConfig3HMACsAreEqual(a->version, &a->metadataHMAC, &b->metadataHMAC) &&
           _sysConfig3HMACsAreEqual(a->version, &a->fullHMAC, &b->fullHMAC);
}

SysConfig3Version sysConfig3ManifestGetVersion(const __SysConfig3ManifestEntry* manifest) {
    return manifest != nullptr ? manifest->version : 0;
}

bool sysConfig3ManifestGetPayloadHMAC(const __SysConfig3ManifestEntry* manifest, SysConfigData* out) {
    return viewHMAC(manifest, &__SysConfig3ManifestEntry::payloadHMAC, out,
                    "bool sysConfig3ManifestGetPayloadHMAC(const struct __SysConfig3ManifestEntry *__single, "
                    "SysConfigData *__single)");
}

bool sysConfig3ManifestGetMetadataHMAC(const __SysConfig3ManifestEntry* manifest, SysConfigData* out) {
    return viewHMAC(manifest, &__SysConfig3ManifestEntry::metadataHMAC, out,
                    "bool sysConfig3ManifestGetMetadataHMAC(const struct __SysConfig3ManifestEntry *__single, "
                    "SysConfigData *__single)");
}

bool sysConfig3ManifestGetFullHMAC(const __SysConfig3ManifestEntry* manifest, SysConfigData* out) {
    return viewHMAC(manifest, &__SysConfig3ManifestEntry::fullHMAC, out,
                    "bool sysConfig3ManifestGetFullHMAC(const struct __SysConfig3ManifestEntry *__single, "
                    "SysConfigData *__single)");
}
