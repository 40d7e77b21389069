// The key of an object and the three HMACs of its manifest.
#include "sysconfig/SysConfig3Internal.h"
#include "sysconfig/SysConfig3Wire.h"

namespace {

using namespace sysconfig;

// One of the three HMACs of an object: its place in the manifest, the operation that creates it, and the formats of two
// messages.
struct Kind {
    SysConfigData __SysConfig3ManifestEntry::*stored;
    const char* creation;
    const char* noKey;
    const char* noMatch;
};

constexpr Kind payloadKind = {
    &__SysConfig3ManifestEntry::payloadHMAC,
    "bool sysConfig3CreatePayloadHMAC(const struct __SysConfig3 *__single, SysConfigData *__single)",
    "%s Invalid HAMC key. sysconfig->hmacKey.data = %p, sysconfig->hmacKey.length = %u",
    "%s Payload HMAC does not match."};
constexpr Kind metadataKind = {
    &__SysConfig3ManifestEntry::metadataHMAC,
    "bool sysConfig3CreateMetadataHMAC(const struct __SysConfig3 *__single, SysConfigData *__single)",
    payloadKind.noKey, "%s Metadata HMAC does not match."};
constexpr Kind fullKind = {
    &__SysConfig3ManifestEntry::fullHMAC,
    "bool sysConfig3CreateFullHMAC(const struct __SysConfig3 *__single, SysConfigData *__single)",
    "%s Invalid HMAC key. sysconfig->hmacKey.data = %p, sysconfig->hmacKey.length = %u",
    "%s Full HMAC does not match."};
constexpr const Kind* kinds[] = {&payloadKind, &metadataKind, &fullKind};

// The address of the key, for messages.
const void* keyOf(const __SysConfig3* object) {
    return object->hmacKey.data;
}

// On running out of memory out->data is null and out->length the length that it would have.
bool createHMAC(const __SysConfig3* object, const Kind& kind, SysConfigData* out) {
    if (keyOf(object) == nullptr)
        return logHook()(messageLevel, kind.noKey, kind.creation, keyOf(object), object->hmacKey.length), false;
    if (out == nullptr)
        return logHook()(messageLevel, "%s hmac is NULL", kind.creation), false;
    crypto::HMACSHA256 context;
    std::uint8_t result[crypto::sha256Size];
    context.init(object->hmacKey.data, object->hmacKey.length);
    if (&kind != &metadataKind)
        _updatePayloadHMAC(object->payload.first, &context);
    if (&kind != &payloadKind)
        _updateMetadataHMAC(object->metadata.first, &context);
    *out = {static_cast<std::uint8_t*>(std::malloc(sizeof result)), sizeof result};
    if (out->data != nullptr && context.final(result)) {
        std::memcpy(out->data, result, sizeof result);
        return true;
    }
    std::free(out->data);
    out->data = nullptr;
    logHook()(messageLevel, "%s malloc failed.", kind.creation);
    return false;
}

// Replaces a stored HMAC by a newly computed one, unless that cannot be computed.
bool replaceHMAC(__SysConfig3* object, const Kind& kind) {
    SysConfigData computed = {};
    if (!createHMAC(object, kind, &computed))
        return false;
    SysConfigData& stored = object->manifest->*kind.stored;
    std::free(stored.data);
    stored = computed;
    return true;
}

bool matches(const __SysConfig3* object, const Kind& kind) {
    const __SysConfig3ManifestEntry& manifest = *object->manifest;
    SysConfigData computed = {};
    const bool equal = createHMAC(object, kind, &computed) &&
                       _sysConfig3HMACsAreEqual(manifest.version, &(manifest.*kind.stored), &computed);
    std::free(computed.data);
    return equal;
}

bool listHasChanged(__SysConfig3* object, const Kind& list) {
    if (sysConfig3HMACIsSupported(object->version)) {
        replaceHMAC(object, list);
        replaceHMAC(object, fullKind);
    }
    return true;
}

template <typename Entry>
void feedParts(crypto::HMACSHA256* context, const Entry& entry) {
    const std::string_view lead = leadOf(entry), string = stringOf(entry);
    const Bytes data = dataOf(entry);
    context->update(lead.data(), lead.size());
    context->update(string.data(), string.size());
    context->update(data.data, data.length);
}

} // namespace

void sysconfig::releaseSecret(SysConfigData* secret) {
    if (secret->data != nullptr) {
        explicit_bzero(secret->data, secret->length);
        std::free(secret->data);
    }
    *secret = {};
}

bool sysconfig::hasNoStaleHMAC(const __SysConfig3* object, const char* operation) {
    if (!sysConfig3HMACIsSupported(object->version) || sysConfig3IsValidHMAC(object))
        return true;
    logHook()(messageLevel, "%s Failed to validate HMAC.", operation);
    return false;
}

bool sysconfig::payloadHasChanged(__SysConfig3* object) {
    return listHasChanged(object, payloadKind);
}

bool sysconfig::metadataHasChanged(__SysConfig3* object) {
    return listHasChanged(object, metadataKind);
}

void _updatePayloadHMAC(const __SysConfig3PayloadEntry* first, crypto::HMACSHA256* context) {
    for (const __SysConfig3PayloadEntry* entry = first; entry != nullptr; entry = entry->next) {
        const Octets4 key = octetsOf(entry->key);
        context->update(key.octets, sizeof key.octets);
        feedParts(context, *entry);
    }
}

void _updateMetadataHMAC(const __SysConfig3MetadataEntry* first, crypto::HMACSHA256* context) {
    for (const __SysConfig3MetadataEntry* entry = first; entry != nullptr; entry = entry->next)
        feedParts(context, *entry);
}

bool sysConfig3HMACIsSupported(SysConfig3Version version) {
    return version == hmacVersion;
}

bool sysConfig3SetHMACKey(__SysConfig3* object, SysConfigData key) {
    constexpr char operation[] = "bool sysConfig3SetHMACKey(struct __SysConfig3 *__single, SysConfigData)";
    if (object == nullptr)
        return logHook()(messageLevel, "%s sysconfig is NULL.", operation), false;
    releaseSecret(&object->hmacKey);
    if (key.data == nullptr || key.length == 0)
        return true;
    auto* const copy = static_cast<std::uint8_t*>(std::malloc(key.length));
    if (copy == nullptr)
        return logHook()(messageLevel, "%s malloc() returned NULL.", operation), false;
    std::memcpy(copy, key.data, key.length);
    object->hmacKey = {copy, key.length};
    return true;
}

__SysConfig3* allocSysConfig3WithHMACKey(SysConfig3Magic magic, SysConfig3Version version, SysConfigData key) {
    constexpr char operation[] =
        "struct __SysConfig3 *__singleallocSysConfig3WithHMACKey(SysConfig3Magic, SysConfig3Version, SysConfigData)";
    if (!sysConfig3HMACIsSupported(version)) {
        logHook()(messageLevel, "%s Requested version (0x%X) does not support HMAC.", operation, version);
        return nullptr;
    }
    __SysConfig3* const object = allocSysConfig3(magic, version);
    if (object == nullptr)
        return logHook()(messageLevel, "%s Failed to allocate sysconfig.", operation), nullptr;
    if (!sysConfig3SetHMACKey(object, key))
        logHook()(messageLevel, "%s Failed to set HMAC key.", operation);
    else if (!sysConfig3UpdateHMAC(object))
        logHook()(messageLevel, "%s Failed to update HMAC.", operation);
    else
        return object;
    deallocSysConfig3(object);
    return nullptr;
}

bool sysConfig3CreatePayloadHMAC(const __SysConfig3* object, SysConfigData* out) {
    return object != nullptr && createHMAC(object, payloadKind, out);
}

bool sysConfig3CreateMetadataHMAC(const __SysConfig3* object, SysConfigData* out) {
    return object != nullptr && createHMAC(object, metadataKind, out);
}

bool sysConfig3CreateFullHMAC(const __SysConfig3* object, SysConfigData* out) {
    if (object != nullptr)
        return createHMAC(object, fullKind, out);
    logHook()(messageLevel, "%s sysconfig is NULL.", fullKind.creation);
    return false;
}

bool sysConfig3UpdateHMAC(__SysConfig3* object) {
    constexpr char operation[] = "bool sysConfig3UpdateHMAC(struct __SysConfig3 *__single)";
    if (object == nullptr)
        return logHook()(messageLevel, "%s sysconfig is NULL.", operation), false;
    if (!sysConfig3HMACIsSupported(object->version)) {
        logHook()(messageLevel, "%s This SysConfig version (0x%X) does not support HMAC.", operation, object->version);
        return false;
    }
    bool complete = true;
    for (const Kind* kind : kinds)
        complete = replaceHMAC(object, *kind) && complete;
    return complete;
}

bool sysConfig3IsValidHMAC(const __SysConfig3* object) {
    constexpr char operation[] = "bool sysConfig3IsValidHMAC(const struct __SysConfig3 *__single)";
    if (object == nullptr)
        return logHook()(messageLevel, "%s sysconfig is NULL.", operation), false;
    if (keyOf(object) == nullptr) {
        logHook()(messageLevel,
                  "Invalid HMAC key. sysconfig->hmacKey.data = %p, sysconfig->hmacKey.length = %d. Did you register "
                  "HMAC key?",
                  keyOf(object), static_cast<int>(object->hmacKey.length));
        return false;
    }
    bool valid = true;
    for (const Kind* kind : kinds) {
        if (matches(object, *kind))
            continue;
        logHook()(messageLevel, kind->noMatch, operation);
        valid = false;
    }
    return valid;
}
