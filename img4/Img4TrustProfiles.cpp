#include "img4/Img4TrustInternal.h"

using namespace img4;

namespace {

constexpr uint8_t sha1RsaOctets[] = {0x2A, 0x86, 0x48, 0x86, 0xF7, 0x0D, 0x01, 0x01, 0x05};
constexpr uint8_t sha384RsaOctets[] = {0x2A, 0x86, 0x48, 0x86, 0xF7, 0x0D, 0x01, 0x01, 0x0C};
constexpr uint8_t sha256EcdsaOctets[] = {0x2A, 0x86, 0x48, 0xCE, 0x3D, 0x04, 0x03, 0x02};
constexpr uint8_t sha384EcdsaOctets[] = {0x2A, 0x86, 0x48, 0xCE, 0x3D, 0x04, 0x03, 0x03};
constexpr uint8_t rsaOctets[] = {0x2A, 0x86, 0x48, 0x86, 0xF7, 0x0D, 0x01, 0x01, 0x01};
constexpr uint8_t ecPubKeyOctets[] = {0x2A, 0x86, 0x48, 0xCE, 0x3D, 0x02, 0x01};
constexpr uint8_t prime256v1Octets[] = {0x2A, 0x86, 0x48, 0xCE, 0x3D, 0x03, 0x01, 0x07};
constexpr uint8_t ansip384r1Octets[] = {0x2B, 0x81, 0x04, 0x00, 0x22};

// What the profiles of one kind have in common.
struct Kind {
    KeyKind key;
    decltype(Img4TrustProfile::verifySignature) verifySignature;
    const Img4DigestInfo* digest;
    const DERItem* signatureAlgorithm;
    const DERItem* keyAlgorithm;
};

constexpr Kind Rsa1k = {KeyKind::RSA, verify_signature_rsa, &kQDSupportDigestInfoSha1, &oidSha1Rsa, &oidRsa};
constexpr Kind Rsa3k = {KeyKind::RSA, verify_signature_rsa3k, &kQDSupportDigestInfoSha384, &oidSha384Rsa, &oidRsa};
constexpr Kind Rsa4k = {KeyKind::RSA, verify_signature_rsa, &kQDSupportDigestInfoSha384, &oidSha384Rsa, &oidRsa};
constexpr Kind Ec256 = {KeyKind::EC, verify_signature_ecdsa, &kQDSupportDigestInfoSha256, &oidSha256Ecdsa,
                        &oidEcPrime256v1};
constexpr Kind Ec384 = {KeyKind::EC, verify_signature_ecdsa, &kQDSupportDigestInfoSha384, &oidSha384Ecdsa,
                        &oidAnsip384r1};

// Only long chains of RSA certificates lead through the secure-boot authority.
constexpr ChainRules rulesOf(KeyKind key, uint32_t length) {
    return {length, key, key == KeyKind::RSA && length == longestChain};
}

DERReturn statusOf(const Img4ChainRefusal& refusal) {
    return refusal.fault == Img4ChainSound ? DERSuccess : Img4Failure;
}

} // namespace

const DERItem oidSha1Rsa = {sha1RsaOctets, sizeof sha1RsaOctets};
const DERItem oidSha384Rsa = {sha384RsaOctets, sizeof sha384RsaOctets};
const DERItem oidSha256Ecdsa = {sha256EcdsaOctets, sizeof sha256EcdsaOctets};
const DERItem oidSha384Ecdsa = {sha384EcdsaOctets, sizeof sha384EcdsaOctets};
const DERItem oidRsa = {rsaOctets, sizeof rsaOctets};
const DERItem oidEcPrime256v1 = {prime256v1Octets, sizeof prime256v1Octets};
const DERItem oidAnsip384r1 = {ansip384r1Octets, sizeof ansip384r1Octets};
const DERItem img4::oidEcPubKey = {ecPubKeyOctets, sizeof ecPubKeyOctets};

#define PROFILE(name, verifier, kind, length, root)                                                                    \
    DERReturn verify_chain_img4_##verifier(const DERItem* certChain, DERItem* leafKey, DERItem* certProperties,        \
                                           const Img4TrustProfile* profile) {                                          \
        return statusOf(verifyChain(rulesOf(kind.key, length), root, Img4BuiltInTrustDomain,                           \
                                    {certChain, leafKey, certProperties, profile}));                                   \
    }                                                                                                                  \
    const Img4TrustProfile kImg4Decode##name = {Img4DecodeComputeDigest,                                               \
                                                verify_chain_img4_##verifier,                                          \
                                                kind.verifySignature,                                                  \
                                                Img4DecodeEvaluateCertificateProperties,                               \
                                                kind.digest,                                                           \
                                                kind.signatureAlgorithm,                                               \
                                                kind.keyAlgorithm};
#include "img4/Img4TrustProfileList.h"

const Img4TrustProfileEntry Img4TrustProfiles[] = {
#define PROFILE(name, verifier, kind, length, root) {"kImg4Decode" #name, &kImg4Decode##name, #root, &(root), length},
#include "img4/Img4TrustProfileList.h"
};
const uint16_t Img4NumTrustProfiles = std::size(Img4TrustProfiles);

namespace {

// Verifies a chain with the rules, the root and the domain of a profile that Img4DecodeMakeDomainProfile has made,
// whose first member `arguments` has.
DERReturn verifyInDomain(const ChainArguments& arguments, Img4TrustRefusal* why) {
    const auto& domainProfile = *reinterpret_cast<const Img4DomainProfile*>(arguments.profile);
    const bool isRSA = DEROidCompare(arguments.profile->keyAlgorithmOid, &oidRsa);
    const ChainRules rules =
        rulesOf(isRSA ? KeyKind::RSA : KeyKind::EC, domainProfile.chainLength == 2 ? 2 : longestChain);
    const Img4ChainRefusal refusal = verifyChain(rules, domainProfile.root, domainProfile.domain, arguments, why);
    if (domainProfile.refusal != nullptr)
        *domainProfile.refusal = refusal;
    return statusOf(refusal);
}

DERReturn verifyDomainChain(const DERItem* certChain, DERItem* leafKey, DERItem* certProperties,
                            const Img4TrustProfile* profile) {
    return profile != nullptr ? verifyInDomain({certChain, leafKey, certProperties, profile}, nullptr) : Img4Failure;
}

} // namespace

DERReturn img4::verifyChainOf(const ChainArguments& arguments, Img4TrustRefusal* why) {
    const auto verify = arguments.profile->verifyChain;
    if (verify == verifyDomainChain)
        return verifyInDomain(arguments, why);
    const Img4TrustProfileEntry* const end = Img4TrustProfiles + Img4NumTrustProfiles;
    for (const Img4TrustProfileEntry* entry = Img4TrustProfiles; why != nullptr && entry != end; ++entry) {
        Img4DomainProfile made;
        if (verify != entry->profile->verifyChain)
            continue;
        Img4DecodeMakeDomainProfile(entry, entry->root, &Img4BuiltInTrustDomain, &made);
        made.profile = *arguments.profile;
        return verifyInDomain({arguments.certChain, arguments.leafKey, arguments.certProperties, &made.profile}, why);
    }
    return verify(arguments.certChain, arguments.leafKey, arguments.certProperties, arguments.profile);
}

DERReturn Img4DecodeMakeDomainProfile(const Img4TrustProfileEntry* entry, const DERItem* root,
                                      const Img4TrustDomain* domain, Img4DomainProfile* out) {
    if (entry == nullptr || entry->profile == nullptr || root == nullptr || domain == nullptr || out == nullptr)
        return DERParamError;
    *out = {*entry->profile, *domain, *root, entry->chainLength, nullptr};
    out->profile.verifyChain = verifyDomainChain;
    return DERSuccess;
}
