// Every part is measured first. Then the blob is written front to back into a buffer of exactly its size, straight from
// the object, so that nothing but the blob itself is ever allocated.
#include <array>

#include "der/DEREncode.h"
#include "sysconfig/SysConfig3Internal.h"
#include "sysconfig/SysConfig3Ptr.h"
#include "sysconfig/SysConfig3Wire.h"

namespace {

using namespace sysconfig;

struct PayloadItems {
    DERItem key;
    DERItem comment;
    DERItem value;
};

struct MetadataItems {
    DERItem key;
    DERItem value;
};

// The rows of an entry whose value has the tag `value`.
constexpr std::array<DERItemSpec, 3> payloadRows(DERTag value) {
    return {{{offsetof(PayloadItems, key), DERTagInteger, 0},
             {offsetof(PayloadItems, comment), DERTagIA5String, 0},
             {offsetof(PayloadItems, value), value, 0}}};
}

constexpr std::array<DERItemSpec, 2> metadataRows(DERTag value) {
    return {{{offsetof(MetadataItems, key), DERTagIA5String, 0}, {offsetof(MetadataItems, value), value, 0}}};
}

constexpr auto DEREncodeSysConfig3PayloadDataItemSpecs = payloadRows(DERTagOctetString);
constexpr auto DEREncodeSysConfig3PayloadStringItemSpecs = payloadRows(DERTagIA5String);
constexpr auto DEREncodeSysConfig3PayloadDeletedItemSpecs = payloadRows(DERTagBoolean);
constexpr auto DEREncodeSysConfig3MetadataDataItemSpecs = metadataRows(DERTagOctetString);
constexpr auto DEREncodeSysConfig3MetadataStringItemSpecs = metadataRows(DERTagIA5String);

DERItem itemOf(std::string_view text) {
    return {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()};
}

DERItem itemOf(Bytes bytes) {
    return {bytes.data, bytes.length};
}

DERItem itemOf(const SysConfigData& data) {
    return {data.data, data.length};
}

DERItem itemOf(const Octets4& octets) {
    return {octets.octets, sizeof octets.octets};
}

// Calls `job` with the items of a SEQUENCE, views of the entry, and the rows that they go by.
template <typename Job>
DERReturn withItems(const __SysConfig3PayloadEntry& entry, const Job& job) {
    const Octets4 key = octetsOf(entry.key);
    PayloadItems items = {itemOf(key), itemOf(leadOf(entry)), {&entry.deleted, sizeof entry.deleted}};
    if (entry.dataLength == 0 && entry.stringLength == noString)
        return job(items, DEREncodeSysConfig3PayloadDeletedItemSpecs);
    items.value = entry.dataLength != 0 ? itemOf(dataOf(entry)) : itemOf(stringOf(entry));
    return job(items, entry.dataLength != 0 ? DEREncodeSysConfig3PayloadDataItemSpecs
                                            : DEREncodeSysConfig3PayloadStringItemSpecs);
}

template <typename Job>
DERReturn withItems(const __SysConfig3MetadataEntry& entry, const Job& job) {
    const DERItem key = itemOf(leadOf(entry));
    if (entry.dataLength != 0)
        return job(MetadataItems{key, itemOf(dataOf(entry))}, DEREncodeSysConfig3MetadataDataItemSpecs);
    return job(MetadataItems{key, itemOf(stringOf(entry))}, DEREncodeSysConfig3MetadataStringItemSpecs);
}

ManifestItems itemsOf(const __SysConfig3ManifestEntry& manifest) {
    return {itemOf(manifest.payloadHMAC), itemOf(manifest.metadataHMAC), itemOf(manifest.fullHMAC)};
}

// What is left of the blob's buffer, which is filled from the front.
struct Output {
    std::uint8_t* next;
    std::uint64_t left;

    // Passes on the result of an encoder that has written that many octets.
    DERReturn advance(std::uint64_t written, DERReturn result) {
        next += written;
        left -= written;
        return result;
    }
};

template <typename Items, std::size_t count>
DERReturn measure(const Items& items, const std::array<DERItemSpec, count>& rows, std::uint64_t* length) {
    return DERLengthOfEncodedSequenceFromObject(DERTagSequence, &items, sizeof items, count, rows.data(), length);
}

template <typename Items, std::size_t count>
DERReturn write(const Items& items, const std::array<DERItemSpec, count>& rows, Output* output) {
    std::uint64_t written = 0;
    const DERReturn result = DEREncodeSequenceFromObject(DERTagSequence, &items, sizeof items, count, rows.data(),
                                                         output->next, output->left, &written);
    return output->advance(written, result);
}

DERReturn writeInteger(std::uint32_t value, Output* output) {
    const Octets4 content = octetsOf(value);
    std::uint64_t written = 0;
    const DERReturn result =
        DEREncodeItemSized(DERTagInteger, sizeof content.octets, content.octets, output->next, output->left, &written);
    return output->advance(written, result);
}

DERReturn writeHeader(DERTag tag, std::uint64_t contentLength, Output* output) {
    std::uint64_t written = 0;
    const DERReturn result = DEREncodeHeaderSized(tag, contentLength, output->next, output->left, &written);
    return output->advance(written, result);
}

// What the two lists differ in is how they are reported.

// Whether the entry has a value to write. Reports an entry that the operations of the library never make.
bool hasValue(const __SysConfig3PayloadEntry& entry) {
    constexpr char creation[] = "DEREncodeSysConfig3Payload_t *__single_createDEREncodeSysConfigPayloadEntries(const "
                                "struct __SysConfig3PayloadEntry *__single)";
    constexpr char release[] = "void _freeDEREncodeSysConfigPayloadEntries(DEREncodeSysConfig3Payload_t *__single)";
    const int kinds =
        int{entry.dataLength != 0} + int{entry.stringLength != noString} + int{entry.deleted != falseOctet};
    if (kinds == 1)
        return true;
    exceptionHook()("%s sysconfig payload entry must have exactly one of data/string/deleted set. data: %p string: %p "
                    "deleted: %d",
                    creation, static_cast<const void*>(dataOf(entry).data),
                    static_cast<const void*>(stringOf(entry).data()), entry.deleted);
    if (kinds > 1)
        return true;
    exceptionHook()("%s should not have happened!", creation);
    logHook()(messageLevel, "%s DERPayload is NULL", release);
    return false;
}

bool hasValue(const __SysConfig3MetadataEntry& entry) {
    constexpr char creation[] = "DEREncodeSysConfig3Metadata_t *__single_createDEREncodeSysConfigMetadataEntries(const "
                                "struct __SysConfig3MetadataEntry *__single)";
    constexpr char release[] = "void _freeDEREncodeSysConfigMetadataEntries(DEREncodeSysConfig3Metadata_t *__single)";
    const bool hasData = entry.dataLength != 0;
    const bool hasString = entry.stringLength != noString;
    if (hasData != hasString)
        return true;
    if (hasData)
        exceptionHook()("%s sysconfig metadata entry cannot have both string and data fields populated!", creation);
    else
        exceptionHook()("%s sysconfig metadata entry must have EITHER string OR data fields populated!", creation);
    logHook()(messageLevel, "%s DERMetadata is NULL", release);
    return false;
}

constexpr char wholeFailure[] = "Failed to encode sequence with return: %d";
constexpr char payloadFailure[] = "Failed to encode payload sequence with return: %d";
constexpr char manifestFailure[] = "Failed to encode manifest sequence with return: %d";

const char* failureOf(const __SysConfig3PayloadEntry&) {
    return "Failed to encode payload entry sequence with return: %d";
}

const char* failureOf(const __SysConfig3MetadataEntry&) {
    return "Failed to encode metadata entry sequence with return: %d";
}

// Whether the result is success. Reports another one.
bool succeeded(DERReturn result, const char* failure) {
    if (result != DERSuccess)
        logHook()(messageLevel, failure, static_cast<int>(result));
    return result == DERSuccess;
}

// Adds up the encodings of a list's entries, all of them even when one fails. False, after reporting it, when an entry
// cannot be written.
template <typename Entry>
bool measureEntries(const Entry* first, std::uint64_t* contentLength) {
    bool complete = true;
    for (const Entry* entry = first; entry != nullptr; entry = entry->next) {
        if (!hasValue(*entry))
            return false;
        std::uint64_t length = 0;
        const auto job = [&](const auto& items, const auto& rows) { return measure(items, rows, &length); };
        complete = succeeded(withItems(*entry, job), failureOf(*entry)) && complete;
        *contentLength += length;
    }
    return complete;
}

template <typename Entry>
bool writeEntries(const Entry* first, Output* output) {
    const auto job = [&](const auto& items, const auto& rows) { return write(items, rows, output); };
    bool complete = true;
    for (const Entry* entry = first; entry != nullptr; entry = entry->next)
        complete = succeeded(withItems(*entry, job), failureOf(*entry)) && complete;
    return complete;
}

// The sizes of a blob's parts, from the inside out.
struct Sizes {
    std::uint64_t payloadEntries = 0;
    std::uint64_t payloadSet = 0;
    std::uint64_t metadataEntries = 0;
    std::uint64_t metadataSet = 0;
    std::uint64_t manifestSequence = 0;
    std::uint64_t content = 0;
    std::uint64_t whole = 0;
};

bool measureBlob(const __SysConfig3& object, Sizes* sizes) {
    if (!measureEntries(object.payload.first, &sizes->payloadEntries) ||
        !measureEntries(object.metadata.first, &sizes->metadataEntries) ||
        !succeeded(measure(itemsOf(*object.manifest), manifestRows, &sizes->manifestSequence), manifestFailure))
        return false;
    sizes->payloadSet = DERLengthOfItem(DERTagSet, sizes->payloadEntries);
    sizes->metadataSet = DERLengthOfItem(DERTagSet, sizes->metadataEntries);
    sizes->content = 2 * DERLengthOfItem(DERTagInteger, sizeof(Octets4)) +
                     DERLengthOfItem(payloadTag, sizes->payloadSet) + DERLengthOfItem(metadataTag, sizes->metadataSet) +
                     DERLengthOfItem(manifestTag, sizes->manifestSequence);
    sizes->whole = DERLengthOfItem(DERTagSequence, sizes->content);
    return succeeded(sizes->whole <= UINT32_MAX ? DERSuccess : DERBufferOverflow, wholeFailure);
}

bool writeBlob(const __SysConfig3& object, const Sizes& sizes, Output* output) {
    return succeeded(writeHeader(DERTagSequence, sizes.content, output), wholeFailure) &&
           succeeded(writeInteger(object.magic, output), wholeFailure) &&
           succeeded(writeInteger(object.version, output), wholeFailure) &&
           succeeded(writeHeader(payloadTag, sizes.payloadSet, output), wholeFailure) &&
           succeeded(writeHeader(DERTagSet, sizes.payloadEntries, output), payloadFailure) &&
           writeEntries(object.payload.first, output) &&
           succeeded(writeHeader(metadataTag, sizes.metadataSet, output), wholeFailure) &&
           writeHeader(DERTagSet, sizes.metadataEntries, output) == DERSuccess &&
           writeEntries(object.metadata.first, output) &&
           succeeded(writeHeader(manifestTag, sizes.manifestSequence, output), wholeFailure) &&
           succeeded(write(itemsOf(*object.manifest), manifestRows, output), manifestFailure);
}

} // namespace

bool encodeSysConfig3(const __SysConfig3* object, SysConfigData* out) {
    constexpr char operation[] = "bool encodeSysConfig3(const struct __SysConfig3 *__single, SysConfigData *__single)";
    if (object == nullptr || out == nullptr) {
        logHook()(messageLevel, "%s Invalid arguments. sysconfig = %p, sData = %p", operation,
                  static_cast<const void*>(object), static_cast<const void*>(out));
        return false;
    }
    Sizes sizes;
    if (!hasNoStaleHMAC(object, operation) || !measureBlob(*object, &sizes))
        return false;
    BytesPtr blob(static_cast<std::uint8_t*>(std::malloc(static_cast<std::size_t>(sizes.whole))));
    if (blob == nullptr)
        return logHook()(messageLevel, "%s malloc failed.", operation), false;
    Output output = {blob.get(), sizes.whole};
    if (!writeBlob(*object, sizes, &output))
        return false;
    *out = {blob.release(), static_cast<std::uint32_t>(sizes.whole)};
    return true;
}
