#include "img4/Img4TrustInternal.h"

#include <cstring>

using namespace img4;

namespace {

constexpr uint8_t sha1Octets[] = {0x2B, 0x0E, 0x03, 0x02, 0x1A};
constexpr uint8_t sha256Octets[] = {0x60, 0x86, 0x48, 0x01, 0x65, 0x03, 0x04, 0x02, 0x01};
constexpr uint8_t sha384Octets[] = {0x60, 0x86, 0x48, 0x01, 0x65, 0x03, 0x04, 0x02, 0x02};
constexpr uint8_t sha512Octets[] = {0x60, 0x86, 0x48, 0x01, 0x65, 0x03, 0x04, 0x02, 0x03};

constexpr DERItem oidSha1 = {sha1Octets, sizeof sha1Octets};
constexpr DERItem oidSha256 = {sha256Octets, sizeof sha256Octets};
constexpr DERItem oidSha384 = {sha384Octets, sizeof sha384Octets};
constexpr DERItem oidSha512 = {sha512Octets, sizeof sha512Octets};

constexpr Img4DigestImplementation sha1 = {crypto::Digest::SHA1, crypto::sha1Size};
constexpr Img4DigestImplementation sha256 = {crypto::Digest::SHA256, crypto::sha256Size};
constexpr Img4DigestImplementation sha384 = {crypto::Digest::SHA384, crypto::sha384Size};
constexpr Img4DigestImplementation sha512 = {crypto::Digest::SHA512, crypto::sha512Size};

static_assert(Img4HashLength == crypto::sha1Size && Img4MaxDigestLength == crypto::sha384Size &&
              Img4LongestDigest == crypto::sha512Size);

// Null also when the description claims another length than its implementation has: callers size their buffers by it.
const Img4DigestImplementation* digestOf(const Img4TrustProfile* profile) {
    if (profile == nullptr || profile->digestInfo == nullptr)
        return nullptr;
    const Img4DigestImplementation* implementation = profile->digestInfo->implementation;
    return implementation != nullptr && implementation->size == profile->digestInfo->length ? implementation : nullptr;
}

} // namespace

const Img4DigestInfo kQDSupportDigestInfoSha1 = {crypto::sha1Size, &oidSha1, &sha1};
const Img4DigestInfo kQDSupportDigestInfoSha256 = {crypto::sha256Size, &oidSha256, &sha256};
const Img4DigestInfo kQDSupportDigestInfoSha384 = {crypto::sha384Size, &oidSha384, &sha384};
const Img4DigestInfo kQDSupportDigestInfoSha512 = {crypto::sha512Size, &oidSha512, &sha512};

const Img4DigestImplementation* img4::digestOf(const Img4TrustProfile* profile, uint64_t length) {
    const Img4DigestImplementation* implementation = ::digestOf(profile);
    return implementation != nullptr && profile->digestInfo->length == length ? implementation : nullptr;
}

DERReturn sha1_digest(const uint8_t* data, uint64_t length, uint8_t* out) {
    if (data == nullptr || out == nullptr)
        return DERParamError;
    return crypto::sha1(data, static_cast<std::size_t>(length), out) ? DERSuccess : Img4Failure;
}

DERReturn img4::hashWithSHA1(const uint8_t* data, uint64_t length, uint8_t* out, void* /*context*/) {
    return sha1_digest(data, length, out);
}

DERReturn Img4DecodeComputeDigest(const DERItem* data, uint8_t* out, uint64_t length, const Img4TrustProfile* profile) {
    const Img4DigestImplementation* implementation = ::digestOf(profile);
    if (data == nullptr || !isPresent(*data) || out == nullptr || implementation == nullptr)
        return DERParamError;
    if (length != profile->digestInfo->length)
        return DERBufferOverflow;
    return crypto::digest(implementation->algorithm, bytesOf(*data), out) ? DERSuccess : Img4Failure;
}

DERReturn Img4DecodeDigestInit(Img4DigestState* state, const Img4TrustProfile* profile) {
    const Img4DigestImplementation* implementation = ::digestOf(profile);
    if (state == nullptr)
        return DERParamError;
    *state = Img4DigestState{};
    if (implementation == nullptr)
        return DERParamError;
    state->running = crypto::startDigest(implementation->algorithm);
    if (state->running == nullptr)
        return Img4Failure;
    state->hashLength = implementation->size;
    return DERSuccess;
}

DERReturn Img4DecodeDigestUpdate(Img4DigestState* state, const DERItem* data, const Img4TrustProfile* profile) {
    if (state == nullptr || state->running == nullptr || data == nullptr ||
        img4::digestOf(profile, state->hashLength) == nullptr)
        return DERParamError;
    crypto::RunningDigest* running = static_cast<crypto::RunningDigest*>(state->running);
    if (data->length == 0 || crypto::updateDigest(running, bytesOf(*data)))
        return DERSuccess;
    // A digest of some of the pieces must not be taken for that of all.
    crypto::finishDigest(running, state->hash);
    *state = Img4DigestState{};
    return Img4Failure;
}

DERReturn Img4DecodeDigestFinal(Img4DigestState* state, const Img4TrustProfile* profile) {
    if (state == nullptr || state->running == nullptr)
        return DERParamError;
    const bool done = crypto::finishDigest(static_cast<crypto::RunningDigest*>(state->running), state->hash);
    state->running = nullptr;
    const bool isOfProfile = img4::digestOf(profile, state->hashLength) != nullptr;
    if (!done || !isOfProfile)
        *state = Img4DigestState{};
    if (!isOfProfile)
        return DERParamError;
    return done ? DERSuccess : Img4Failure;
}

DERReturn Img4DecodeDigestReturnHash(const Img4DigestState* state, uint8_t* out, uint64_t length,
                                     const Img4TrustProfile* profile) {
    if (state == nullptr || state->running != nullptr || state->hashLength == 0 || out == nullptr ||
        img4::digestOf(profile, state->hashLength) == nullptr)
        return DERParamError;
    if (length < state->hashLength)
        return DERBufferOverflow;
    std::memcpy(out, state->hash, static_cast<std::size_t>(state->hashLength));
    return DERSuccess;
}
