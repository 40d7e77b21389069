#include "img4/Img4TrustInternal.h"

#include <cstring>

using namespace img4;

namespace {

// What a digest is taken of: a raw encoding, and the digest of it that the record may hold already.
struct Source {
    const DERItem* raw;
    const uint8_t* stored; // null when the record holds none
};

Source payloadOf(const Img4Record& record) {
    return {hasContent(record.payload.data) ? &record.payloadRaw : nullptr,
            record.payloadHashed != 0 ? record.payload.digest : nullptr};
}

Source manifestOf(const Img4Record& record) {
    return {isPresent(record.manifestRaw) ? &record.manifestRaw : nullptr,
            record.manifestHashed != 0 ? record.manifest.digest : nullptr};
}

// The first octets of the digest that the record holds, or what `compute` makes of the raw encoding.
template <typename Compute>
DERReturn copy(const Source& source, uint8_t* out, uint64_t length, Compute compute) {
    if (source.raw == nullptr)
        return DEREndOfSequence;
    if (source.stored == nullptr)
        return compute(*source.raw);
    std::memcpy(out, source.stored, static_cast<std::size_t>(length));
    return DERSuccess;
}

DERReturn copyHash(const Img4Record* record, Source (*sourceOf)(const Img4Record&), uint8_t* out, uint64_t length,
                   Img4DigestFunction digest, void* context) {
    if (record == nullptr || out == nullptr || digest == nullptr || length != Img4HashLength)
        return DERParamError;
    return copy(sourceOf(*record), out, length,
                [&](const DERItem& raw) { return digest(raw.data, raw.length, out, context); });
}

DERReturn copyDigest(const Img4Record* record, Source (*sourceOf)(const Img4Record&), uint8_t* out, uint64_t length,
                     const Img4TrustProfile* profile) {
    if (record == nullptr || out == nullptr || profile == nullptr || profile->computeDigest == nullptr)
        return DERParamError;
    if (length > Img4MaxDigestLength)
        return DERBufferOverflow;
    return copy(sourceOf(*record), out, length,
                [&](const DERItem& raw) { return profile->computeDigest(&raw, out, length, profile); });
}

} // namespace

DERReturn Img4DecodeCopyPayloadHash(const Img4Record* record, uint8_t* out, uint64_t length) {
    return copyHash(record, payloadOf, out, length, hashWithSHA1, nullptr);
}

DERReturn Img4DecodeCopyManifestHash(const Img4Record* record, uint8_t* out, uint64_t length) {
    return copyHash(record, manifestOf, out, length, hashWithSHA1, nullptr);
}

DERReturn Img4DecodeCopyPayloadHashWithCallback(const Img4Record* record, uint8_t* out, uint64_t length,
                                                Img4DigestFunction digest, void* context) {
    return copyHash(record, payloadOf, out, length, digest, context);
}

DERReturn Img4DecodeCopyManifestHashWithCallback(const Img4Record* record, uint8_t* out, uint64_t length,
                                                 Img4DigestFunction digest, void* context) {
    return copyHash(record, manifestOf, out, length, digest, context);
}

DERReturn Img4DecodeCopyPayloadDigest(const Img4Record* record, uint8_t* out, uint64_t length,
                                      const Img4TrustProfile* profile) {
    return copyDigest(record, payloadOf, out, length, profile);
}

DERReturn Img4DecodeCopyManifestDigest(const Img4Record* record, uint8_t* out, uint64_t length,
                                       const Img4TrustProfile* profile) {
    return copyDigest(record, manifestOf, out, length, profile);
}

DERReturn Img4DecodeCopyPayloadPropertiesDigest(const DERItem* properties, uint8_t* out, uint64_t length,
                                                const Img4TrustProfile* profile) {
    if (properties == nullptr || !isPresent(*properties) || out == nullptr || profile == nullptr ||
        profile->computeDigest == nullptr)
        return DERParamError;
    return length > Img4MaxDigestLength ? DERBufferOverflow : profile->computeDigest(properties, out, length, profile);
}
