// Every part is measured first. Then the blob is written front to back into a buffer of exactly its size, straight from
// the object, so that nothing but the blob itself is ever allocated.
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

constexpr DERItemSpec DEREncodeSysConfig3PayloadDataItemSpecs[] = {
    {offsetof(PayloadItems, key), DERTagInteger, 0},
    {offsetof(PayloadItems, comment), DERTagIA5String, 0},
    {offsetof(PayloadItems, value), DERTagOctetString, 0},
};
constexpr std::uint16_t DEREncodeSysConfig3PayloadDataItemSpecs_count =
    std::size(DEREncodeSysConfig3PayloadDataItemSpecs);

constexpr DERItemSpec DEREncodeSysConfig3PayloadStringItemSpecs[] = {
    {offsetof(PayloadItems, key), DERTagInteger, 0},
    {offsetof(PayloadItems, comment), DERTagIA5String, 0},
    {offsetof(PayloadItems, value), DERTagIA5String, 0},
};
constexpr std::uint16_t DEREncodeSysConfig3PayloadStringItemSpecs_count =
    std::size(DEREncodeSysConfig3PayloadStringItemSpecs);

constexpr DERItemSpec DEREncodeSysConfig3PayloadDeletedItemSpecs[] = {
    {offsetof(PayloadItems, key), DERTagInteger, 0},
    {offsetof(PayloadItems, comment), DERTagIA5String, 0},
    {offsetof(PayloadItems, value), DERTagBoolean, 0},
};
constexpr std::uint16_t DEREncodeSysConfig3PayloadDeletedItemSpecs_count =
    std::size(DEREncodeSysConfig3PayloadDeletedItemSpecs);

constexpr DERItemSpec DEREncodeSysConfig3MetadataDataItemSpecs[] = {
    {offsetof(MetadataItems, key), DERTagIA5String, 0},
    {offsetof(MetadataItems, value), DERTagOctetString, 0},
};
constexpr std::uint16_t DEREncodeSysConfig3MetadataDataItemSpecs_count =
    std::size(DEREncodeSysConfig3MetadataDataItemSpecs);

constexpr DERItemSpec DEREncodeSysConfig3MetadataStringItemSpecs[] = {
    {offsetof(MetadataItems, key), DERTagIA5String, 0},
    {offsetof(MetadataItems, value), DERTagIA5String, 0},
};
constexpr std::uint16_t DEREncodeSysConfig3MetadataStringItemSpecs_count =
    std::size(DEREncodeSysConfig3MetadataStringItemSpecs);

constexpr DERItemSpec DEREncodeSysConfig3ManifestItemSpecs[] = {
    {offsetof(ManifestItems, payloadHMAC), DERTagOctetString, 0},
    {offsetof(ManifestItems, metadataHMAC), DERTagOctetString, 0},
    {offsetof(ManifestItems, fullHMAC), DERTagOctetString, 0},
};
constexpr std::uint16_t DEREncodeSysConfig3ManifestItemSpecs_count = std::size(DEREncodeSysConfig3ManifestItemSpecs);

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

// One entry as the items of a SEQUENCE: views of the entry, and of `key`, in a record of the kind that `specs` reads.
struct PayloadRecord {
    Octets4 key;
    PayloadItems items;
    const DERItemSpec* specs;
    std::uint16_t count;

    explicit PayloadRecord(const __SysConfig3PayloadEntry& entry)
        : key(octetsOf(entry.key)), items{itemOf(key), itemOf(commentOf(entry)), {}} {
        if (entry.dataLength != 0) {
            items.value = itemOf(dataOf(entry));
            specs = DEREncodeSysConfig3PayloadDataItemSpecs;
            count = DEREncodeSysConfig3PayloadDataItemSpecs_count;
        } else if (entry.stringLength != noString) {
            items.value = itemOf(stringOf(entry));
            specs = DEREncodeSysConfig3PayloadStringItemSpecs;
            count = DEREncodeSysConfig3PayloadStringItemSpecs_count;
        } else {
            items.value = {&entry.deleted, sizeof entry.deleted};
            specs = DEREncodeSysConfig3PayloadDeletedItemSpecs;
            count = DEREncodeSysConfig3PayloadDeletedItemSpecs_count;
        }
    }
    // `items` views `key`.
    PayloadRecord(const PayloadRecord&) = delete;
    PayloadRecord& operator=(const PayloadRecord&) = delete;
};

struct MetadataRecord {
    MetadataItems items;
    const DERItemSpec* specs;
    std::uint16_t count;

    explicit MetadataRecord(const __SysConfig3MetadataEntry& entry) : items{itemOf(keyOf(entry)), {}} {
        if (entry.dataLength != 0) {
            items.value = itemOf(dataOf(entry));
            specs = DEREncodeSysConfig3MetadataDataItemSpecs;
            count = DEREncodeSysConfig3MetadataDataItemSpecs_count;
        } else {
            items.value = itemOf(stringOf(entry));
            specs = DEREncodeSysConfig3MetadataStringItemSpecs;
            count = DEREncodeSysConfig3MetadataStringItemSpecs_count;
        }
    }
};

struct ManifestRecord {
    ManifestItems items;
    static constexpr const DERItemSpec* specs = DEREncodeSysConfig3ManifestItemSpecs;
    static constexpr std::uint16_t count = DEREncodeSysConfig3ManifestItemSpecs_count;

    explicit ManifestRecord(const __SysConfig3ManifestEntry& manifest)
        : items{itemOf(manifest.payloadHMAC), itemOf(manifest.metadataHMAC), itemOf(manifest.fullHMAC)} {}
};

constexpr char encoding[] = "bool encodeSysConfig3(const struct __SysConfig3 *__single, SysConfigData *__single)";

// The buffer of the blob, filled from the front.
struct Output {
    BytesPtr bytes;
    std::uint64_t size = 0;
    std::uint64_t used = 0;

    std::uint8_t* next() const { return bytes.get() + used; }
    std::uint64_t left() const { return size - used; }
};

template <typename Record>
DERReturn measure(const Record& record, std::uint64_t* length) {
    return DERLengthOfEncodedSequenceFromObject(DERTagSequence, &record.items, sizeof record.items, record.count,
                                                record.specs, length);
}

template <typename Record>
DERReturn write(const Record& record, Output* output) {
    std::uint64_t written = 0;
    const DERReturn result =
        DEREncodeSequenceFromObject(DERTagSequence, &record.items, sizeof record.items, record.count, record.specs,
                                    output->next(), output->left(), &written);
    output->used += written;
    return result;
}

DERReturn writeInteger(const Octets4& value, Output* output) {
    std::uint64_t written = 0;
    const DERReturn result =
        DEREncodeItemSized(DERTagInteger, sizeof value.octets, value.octets, output->next(), output->left(), &written);
    output->used += written;
    return result;
}

DERReturn writeHeader(DERTag tag, std::uint64_t contentLength, Output* output) {
    std::uint64_t written = 0;
    const DERReturn result = DEREncodeHeaderSized(tag, contentLength, output->next(), output->left(), &written);
    output->used += written;
    return result;
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

void reportEntryFailure(const PayloadRecord&, DERReturn result) {
    logHook()(messageLevel, "Failed to encode payload entry sequence with return: %d", static_cast<int>(result));
}

void reportEntryFailure(const MetadataRecord&, DERReturn result) {
    logHook()(messageLevel, "Failed to encode metadata entry sequence with return: %d", static_cast<int>(result));
}

// Adds up the encodings of a list's entries, all of them even when one fails. False, after reporting it, when an entry
// cannot be written.
template <typename Record, typename Entry>
bool measureEntries(const Entry* first, std::uint64_t* contentLength) {
    bool complete = true;
    for (const Entry* entry = first; entry != nullptr; entry = entry->next) {
        if (!hasValue(*entry))
            return false;
        const Record record(*entry);
        std::uint64_t length = 0;
        if (const DERReturn result = measure(record, &length); result != DERSuccess) {
            reportEntryFailure(record, result);
            complete = false;
        }
        *contentLength += length;
    }
    return complete;
}

template <typename Record, typename Entry>
bool writeEntries(const Entry* first, Output* output) {
    bool complete = true;
    for (const Entry* entry = first; entry != nullptr; entry = entry->next) {
        const Record record(*entry);
        if (const DERReturn result = write(record, output); result != DERSuccess) {
            reportEntryFailure(record, result);
            complete = false;
        }
    }
    return complete;
}

bool reportManifest(DERReturn result) {
    if (result != DERSuccess)
        logHook()(messageLevel, "Failed to encode manifest sequence with return: %d", static_cast<int>(result));
    return result == DERSuccess;
}

bool reportPayload(DERReturn result) {
    if (result != DERSuccess)
        logHook()(messageLevel, "Failed to encode payload sequence with return: %d", static_cast<int>(result));
    return result == DERSuccess;
}

bool reportWhole(DERReturn result) {
    if (result != DERSuccess)
        logHook()(messageLevel, "Failed to encode sequence with return: %d", static_cast<int>(result));
    return result == DERSuccess;
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
    if (!measureEntries<PayloadRecord>(object.payload.first, &sizes->payloadEntries) ||
        !measureEntries<MetadataRecord>(object.metadata.first, &sizes->metadataEntries) ||
        !reportManifest(measure(ManifestRecord(*object.manifest), &sizes->manifestSequence)))
        return false;
    sizes->payloadSet = DERLengthOfItem(DERTagSet, sizes->payloadEntries);
    sizes->metadataSet = DERLengthOfItem(DERTagSet, sizes->metadataEntries);
    sizes->content = 2 * DERLengthOfItem(DERTagInteger, sizeof(Octets4)) +
                     DERLengthOfItem(payloadTag, sizes->payloadSet) + DERLengthOfItem(metadataTag, sizes->metadataSet) +
                     DERLengthOfItem(manifestTag, sizes->manifestSequence);
    sizes->whole = DERLengthOfItem(DERTagSequence, sizes->content);
    return reportWhole(sizes->whole <= UINT32_MAX ? DERSuccess : DERBufferOverflow);
}

// The elements of the outer SEQUENCE.

bool writeStart(const __SysConfig3& object, const Sizes& sizes, Output* output) {
    DERReturn result = writeHeader(DERTagSequence, sizes.content, output);
    if (result == DERSuccess)
        result = writeInteger(octetsOf(object.magic), output);
    if (result == DERSuccess)
        result = writeInteger(octetsOf(object.version), output);
    return reportWhole(result);
}

bool writePayload(const __SysConfig3& object, const Sizes& sizes, Output* output) {
    return reportWhole(writeHeader(payloadTag, sizes.payloadSet, output)) &&
           reportPayload(writeHeader(DERTagSet, sizes.payloadEntries, output)) &&
           writeEntries<PayloadRecord>(object.payload.first, output);
}

bool writeMetadata(const __SysConfig3& object, const Sizes& sizes, Output* output) {
    return reportWhole(writeHeader(metadataTag, sizes.metadataSet, output)) &&
           writeHeader(DERTagSet, sizes.metadataEntries, output) == DERSuccess &&
           writeEntries<MetadataRecord>(object.metadata.first, output);
}

bool writeManifest(const __SysConfig3& object, const Sizes& sizes, Output* output) {
    return reportWhole(writeHeader(manifestTag, sizes.manifestSequence, output)) &&
           reportManifest(write(ManifestRecord(*object.manifest), output));
}

} // namespace

bool encodeSysConfig3(const __SysConfig3* object, SysConfigData* out) {
    if (object == nullptr || out == nullptr) {
        logHook()(messageLevel, "%s Invalid arguments. sysconfig = %p, sData = %p", encoding,
                  static_cast<const void*>(object), static_cast<const void*>(out));
        return false;
    }
    if (!hasNoStaleHMAC(object, encoding))
        return false;
    Sizes sizes;
    if (!measureBlob(*object, &sizes))
        return false;
    Output output;
    output.size = sizes.whole;
    output.bytes.reset(static_cast<std::uint8_t*>(std::malloc(static_cast<std::size_t>(output.size))));
    if (output.bytes == nullptr) {
        logHook()(messageLevel, "%s malloc failed.", encoding);
        return false;
    }
    if (!writeStart(*object, sizes, &output) || !writePayload(*object, sizes, &output) ||
        !writeMetadata(*object, sizes, &output) || !writeManifest(*object, sizes, &output))
        return false;
    *out = {output.bytes.release(), static_cast<std::uint32_t>(output.used)};
    return true;
}
