// What the files of trust evaluation share.
#ifndef VELTRA_IMG4_TRUST_INTERNAL_H
#define VELTRA_IMG4_TRUST_INTERNAL_H

#include "img4/Img4Internal.h"
#include "img4/Img4Trust.h"
#include "platform/Crypto.h"

struct Img4DigestImplementation {
    crypto::Digest algorithm;
    uint64_t size; // octets
};

// The built-in domain, made from the DER files of its folder when the library is built.
extern "C" {
#define PROFILE(name, verifier, kind, length, root) extern const DERItem root;
#include "img4/Img4TrustProfileList.h"
}

namespace img4 {

inline crypto::Bytes bytesOf(const DERItem& item) {
    return {item.data, static_cast<std::size_t>(item.length)};
}

// True when `encoding` is one item of the tag `tag` and nothing else; *content is then its content.
bool isWholeItem(const DERItem& encoding, DERTag tag, DERItem* content);

// The digest of `profile`, or null when it has none that makes `length` octets.
const Img4DigestImplementation* digestOf(const Img4TrustProfile* profile, uint64_t length);

// sha1_digest as a callback.
DERReturn hashWithSHA1(const uint8_t* data, uint64_t length, uint8_t* out, void* context);

struct NamedCurve {
    const DERItem* oid;
    crypto::Curve curve;
    uint64_t coordinateLength; // octets, also of the order
    uint64_t pointLength;      // of the uncompressed form
};

// The curve whose points have that length, or null.
const NamedCurve* curveOfPoint(uint64_t length);

extern const DERItem oidEcPubKey;

enum class KeyKind {
    RSA,
    EC
};

// What tells the chain verifiers apart besides the root.
struct ChainRules {
    uint32_t length;
    KeyKind key;
    bool authority; // whether the middle certificate must carry the authority's name
};

constexpr uint32_t longestChain = 3;

struct ChainArguments {
    const DERItem* certChain;
    DERItem* leafKey;
    DERItem* certProperties;
    const Img4TrustProfile* profile;
};

// With `why`, says there too where the chain is refused and what is wrong with a signature or an encoding.
Img4ChainRefusal verifyChain(const ChainRules& rules, const DERItem& root, const Img4TrustDomain& domain,
                             const ChainArguments& arguments, Img4TrustRefusal* why = nullptr);

// The profile's own verifyChain and verifySignature. With `why`, those of this library say what is wrong.
DERReturn verifyChainOf(const ChainArguments& arguments, Img4TrustRefusal* why);
DERReturn verifySignatureOf(const Img4TrustProfile& profile, const DERItem& key, const DERItem& signature,
                            const uint8_t* digest, Img4TrustRefusal* why);

// As Img4DecodeEvaluateCertificateProperties; with `refusal`, what is refused first.
DERReturn checkConstraints(const Img4Record& record, Img4Refusal* refusal);

} // namespace img4

#endif
