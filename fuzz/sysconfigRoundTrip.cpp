// Decodes a blob, and when it is one, encodes it, decodes that and compares. Then changes the object as the octets
// behind the blob say and checks lists, index and HMACs against a plain model.
#include <algorithm>
#include <cstdarg>
#include <string>
#include <vector>

#include "der/DERDecode.h"
#include "fuzz/Fuzz.h"
#include "tests/sysconfig/Blob.h"

namespace {

using sysconfig::SysConfig3Ptr;

constexpr SysConfig3Version hmacVersion = 0x30002;
constexpr SysConfig3Version deletedFlagVersion = 0x30003;

// Formats every message, so that the sanitizer sees what its arguments refer to.
SYSCONFIG3_PRINTF(2, 3) void formatMessage(int level, const char* format, ...) {
    char text[2048];
    std::va_list arguments;
    va_start(arguments, format);
    FUZZ_REQUIRE(level == 2 && std::vsnprintf(text, sizeof text, format, arguments) >= 0);
    va_end(arguments);
}

SYSCONFIG3_PRINTF(1, 2) void refuseException(const char*, ...) {
    FUZZ_REQUIRE(false);
}

void registerKey(__SysConfig3* object) {
    if (sysConfig3GetVersion(object) == hmacVersion)
        FUZZ_REQUIRE(sysConfig3SetHMACKey(object, hmacKey));
}

void checkRoundTrip(const __SysConfig3* object) {
    const Bytes blob = encode(object);
    const SysConfig3Ptr decoded = decode(blob);
    FUZZ_REQUIRE(decoded != nullptr);
    // An object with an absent HMAC may be equal to none, itself included.
    FUZZ_REQUIRE(sysConfig3ObjectsAreEqual(object, decoded.get()) == sysConfig3ObjectsAreEqual(object, object));
    registerKey(decoded.get());
    FUZZ_REQUIRE(encode(decoded.get()) == blob);
}

// The keys of both lists in order, kept in the plainest way.
struct Model {
    std::vector<std::uint32_t> payload;
    std::vector<std::string> metadata;

    explicit Model(const __SysConfig3* object) {
        for (const auto* entry = sysConfig3GetHeadPayloadEntry(object); entry != nullptr;
             entry = sysConfig3PayloadEntryGetNextEntry(entry))
            payload.push_back(sysConfig3PayloadEntryGetKey(entry));
        for (const auto* entry = sysConfig3GetHeadMetadataEntry(object); entry != nullptr;
             entry = sysConfig3MetadataEntryGetNextEntry(entry))
            metadata.emplace_back(sysConfig3MetadataEntryGetKey(entry));
    }
};

void checkLists(const __SysConfig3* object, const Model& expected) {
    const Model actual(object);
    FUZZ_REQUIRE(actual.payload == expected.payload && actual.metadata == expected.metadata);
    FUZZ_REQUIRE(sysConfig3GetPayloadEntryCount(object) == expected.payload.size());
    FUZZ_REQUIRE(sysConfig3GetMetadataEntryCount(object) == expected.metadata.size());
    for (const std::uint32_t key : expected.payload)
        FUZZ_REQUIRE(sysConfig3PayloadEntryGetKey(sysConfig3GetPayloadEntryForKey(object, key)) == key);
    for (const std::string& key : expected.metadata)
        FUZZ_REQUIRE(sysConfig3MetadataEntryGetKey(sysConfig3GetMetadataEntryForKey(object, key.c_str())) == key);
}

std::string textOf(fuzz::Input& script) {
    std::string taken(std::size_t{100} * (script.octet() % 4), 'x');
    const std::size_t length = std::min<std::size_t>(script.octet() % 16, script.left.size());
    taken.append(reinterpret_cast<const char*>(script.left.data()), length);
    script.left = script.left.subspan(length);
    return taken.substr(0, taken.find('\0'));
}

void changePayload(__SysConfig3* object, Model* model, fuzz::Input& script) {
    const std::uint8_t kind = script.octet() % 5;
    std::uint32_t key = script.octet() % 8;
    if (!model->payload.empty() && script.octet() % 2 == 0)
        key = model->payload[key % model->payload.size()];
    const std::string text = textOf(script);
    if (kind == 4) {
        FUZZ_REQUIRE(sysConfig3DeletePayloadEntryForKey(object, key));
        std::erase(model->payload, key);
        return;
    }
    const auto entry = kind == 0   ? payloadDeleted(key, text.c_str())
                       : kind == 1 ? payloadString(key, text.c_str())
                                   : payloadData(key, {text.begin(), text.end()}, "note");
    FUZZ_REQUIRE((entry == nullptr) == (key == 0 || (kind > 1 && text.empty())));
    const bool allowed = entry != nullptr && (kind != 0 || sysConfig3GetVersion(object) >= deletedFlagVersion);
    FUZZ_REQUIRE(sysConfig3AddPayloadEntry(object, entry.get()) == allowed);
    if (allowed) {
        std::erase(model->payload, key);
        model->payload.push_back(key);
    }
}

void changeMetadata(__SysConfig3* object, Model* model, fuzz::Input& script) {
    const bool deletes = script.octet() % 4 == 0;
    const std::string key = textOf(script);
    const std::string storedKey = key.substr(0, 256);
    std::erase(model->metadata, storedKey);
    if (deletes) {
        FUZZ_REQUIRE(sysConfig3DeleteMetadataEntryForKey(object, key.c_str()));
        return;
    }
    const auto entry = metadataString(key.c_str(), textOf(script).c_str());
    FUZZ_REQUIRE(sysConfig3AddMetadataEntry(object, entry.get()));
    model->metadata.push_back(storedKey);
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    setSysConfig3LogHandler(formatMessage);
    setSysConfig3ExceptionHandler(refuseException);
    const SysConfig3Ptr object(decodeSysConfig3(data, static_cast<std::uint32_t>(size)));
    if (object == nullptr)
        return 0;
    fuzz::taken = true;
    Model model(object.get());
    checkLists(object.get(), model);
    registerKey(object.get());
    if (sysConfig3GetVersion(object.get()) == hmacVersion)
        FUZZ_REQUIRE(sysConfig3UpdateHMAC(object.get()));
    checkRoundTrip(object.get());

    const DERItem input = {data, size};
    DERDecodedInfo blob;
    FUZZ_REQUIRE(DERDecodeItem(&input, &blob) == DERSuccess);
    const std::uint8_t* const end = blob.content.data + blob.content.length;
    fuzz::Input script = {{end, data + size}};
    constexpr int mostChanges = 32;
    for (int change = 0; change < mostChanges && !script.left.empty(); ++change) {
        if (script.octet() % 2 == 0)
            changePayload(object.get(), &model, script);
        else
            changeMetadata(object.get(), &model, script);
        checkLists(object.get(), model);
    }
    checkRoundTrip(object.get());
    return 0;
}
