// The test domain's signers, one for each profile that the linked decoder has.
#ifndef VELTRA_TESTS_IMG4_TRUST_DOMAIN_H
#define VELTRA_TESTS_IMG4_TRUST_DOMAIN_H

#include "tests/der/Bytes.h"
#include "tools/makers/SignedManifestMaker.h"

#include <cstring>
#include <map>
#include <span>
#include <string>
#include <vector>

inline std::span<const Img4TrustProfileEntry> allProfiles() {
    return {Img4TrustProfiles, Img4NumTrustProfiles};
}

inline const signedmanifest::Signer& signerOf(const Img4TrustProfileEntry& entry) {
    static std::map<std::string, signedmanifest::Signer> signers;
    return signers.try_emplace(entry.name, TEST_TRUST_DOMAIN, entry).first->second;
}

inline const Img4TrustProfileEntry& entryOf(const Img4TrustProfile& profile) {
    for (const Img4TrustProfileEntry& entry : allProfiles())
        if (entry.profile == &profile)
            return entry;
    std::abort();
}

// One of each kind: RSA and EC, in chains of two and of three certificates.
inline std::vector<const Img4TrustProfileEntry*> kindsOfProfile() {
    return {&entryOf(kImg4DecodeSecureBootRsa1kSha1), &entryOf(kImg4DecodeSecureBootRsa4kSha384),
            &entryOf(kImg4DecodeSecureBootEc256Sha256), &entryOf(kImg4DecodeLocalPolicyEc384Sha384)};
}

inline bool isEC(const Img4TrustProfileEntry& entry) {
    return entry.profile->verifySignature == verify_signature_ecdsa;
}

// `bytes` with bits of the last octet changed.
inline img4maker::Bytes lastChanged(img4maker::Bytes bytes, std::uint8_t bits = 0x01) {
    bytes.at(bytes.size() - 1) ^= bits;
    return bytes;
}

#endif
