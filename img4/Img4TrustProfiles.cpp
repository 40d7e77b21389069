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

constexpr ChainRules twoRSA = {2, KeyKind::RSA, false};
constexpr ChainRules threeRSA = {3, KeyKind::RSA, true};
constexpr ChainRules twoEC = {2, KeyKind::EC, false};
constexpr ChainRules threeEC = {3, KeyKind::EC, false};

DERReturn statusOf(const Img4ChainRefusal& refusal) {
    return refusal.fault == Img4ChainSound ? DERSuccess : Img4Failure;
}

// The routines that the chain verifiers share; each verifier supplies its root.

DERReturn verify_chain_img4_rsa(const DERItem& root, const ChainArguments& arguments) {
    return statusOf(verifyChain(twoRSA, root, Img4BuiltInTrustDomain, arguments));
}

DERReturn verify_chain_img4_ec(const DERItem& root, const ChainArguments& arguments) {
    return statusOf(verifyChain(twoEC, root, Img4BuiltInTrustDomain, arguments));
}

DERReturn verify_chain_img4_ec_v1(const DERItem& root, const ChainArguments& arguments) {
    return statusOf(verifyChain(threeEC, root, Img4BuiltInTrustDomain, arguments));
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

DERReturn verify_chain_img4_v1(const DERItem* certChain, DERItem* leafKey, DERItem* certProperties,
                               const Img4TrustProfile* profile) {
    return statusOf(verifyChain(threeRSA, ROOT_CA_CERTIFICATE, Img4BuiltInTrustDomain,
                                {certChain, leafKey, certProperties, profile}));
}

DERReturn verify_chain_img4_v2(const DERItem* certChain, DERItem* leafKey, DERItem* certProperties,
                               const Img4TrustProfile* profile) {
    return verify_chain_img4_rsa(RSA4K_SHA384_ROOT_CA_CERTIFICATE, {certChain, leafKey, certProperties, profile});
}

DERReturn verify_chain_img4_v2_rsa3k(const DERItem* certChain, DERItem* leafKey, DERItem* certProperties,
                                     const Img4TrustProfile* profile) {
    return verify_chain_img4_rsa(RSA3K_SHA384_ROOT_CA_CERTIFICATE, {certChain, leafKey, certProperties, profile});
}

DERReturn verify_chain_img4_v2_BRX1(const DERItem* certChain, DERItem* leafKey, DERItem* certProperties,
                                    const Img4TrustProfile* profile) {
    return verify_chain_img4_rsa(RSA4K_SHA384_ROOT_CA_CERTIFICATE_BRX1, {certChain, leafKey, certProperties, profile});
}

DERReturn verify_chain_img4_x86(const DERItem* certChain, DERItem* leafKey, DERItem* certProperties,
                                const Img4TrustProfile* profile) {
    return verify_chain_img4_rsa(RSA4K_SHA384_X86_ROOT_CA_CERTIFICATE, {certChain, leafKey, certProperties, profile});
}

DERReturn verify_chain_img4_ddi(const DERItem* certChain, DERItem* leafKey, DERItem* certProperties,
                                const Img4TrustProfile* profile) {
    return verify_chain_img4_rsa(RSA4K_SHA384_DDI_ROOT_CA_CERTIFICATE, {certChain, leafKey, certProperties, profile});
}

DERReturn verify_chain_img4_ddi_global(const DERItem* certChain, DERItem* leafKey, DERItem* certProperties,
                                       const Img4TrustProfile* profile) {
    return verify_chain_img4_rsa(RSA4K_SHA384_DDI_GLOBAL_ROOT_CA_CERTIFICATE,
                                 {certChain, leafKey, certProperties, profile});
}

DERReturn verify_chain_img4_ddi_fake(const DERItem* certChain, DERItem* leafKey, DERItem* certProperties,
                                     const Img4TrustProfile* profile) {
    return verify_chain_img4_rsa(RSA4K_SHA384_DDI_FAKE_ROOT_CA_CERTIFICATE,
                                 {certChain, leafKey, certProperties, profile});
}

DERReturn verify_chain_img4_ddi_fake_global(const DERItem* certChain, DERItem* leafKey, DERItem* certProperties,
                                            const Img4TrustProfile* profile) {
    return verify_chain_img4_rsa(RSA4K_SHA384_DDI_FAKE_GLOBAL_ROOT_CA_CERTIFICATE,
                                 {certChain, leafKey, certProperties, profile});
}

DERReturn verify_chain_img4_marda_local_policy(const DERItem* certChain, DERItem* leafKey, DERItem* certProperties,
                                               const Img4TrustProfile* profile) {
    return verify_chain_img4_rsa(RSA4K_SHA384_LP_ROOT_CA_CERTIFICATE, {certChain, leafKey, certProperties, profile});
}

DERReturn verify_chain_img4_ecdsa256(const DERItem* certChain, DERItem* leafKey, DERItem* certProperties,
                                     const Img4TrustProfile* profile) {
    return verify_chain_img4_ec(LOCAL_EC256_SHA256_ROOT_CA_CERTIFICATE, {certChain, leafKey, certProperties, profile});
}

DERReturn verify_chain_img4_ecdsa384(const DERItem* certChain, DERItem* leafKey, DERItem* certProperties,
                                     const Img4TrustProfile* profile) {
    return verify_chain_img4_ec(LOCAL_EC384_SHA384_ROOT_CA_CERTIFICATE, {certChain, leafKey, certProperties, profile});
}

DERReturn verify_chain_img4_ecdsa384_local_policy(const DERItem* certChain, DERItem* leafKey, DERItem* certProperties,
                                                  const Img4TrustProfile* profile) {
    return verify_chain_img4_ec_v1(EC384_SHA384_LP_ROOT_CA_CERTIFICATE, {certChain, leafKey, certProperties, profile});
}

DERReturn verify_chain_img4_ecdsa384_qa(const DERItem* certChain, DERItem* leafKey, DERItem* certProperties,
                                        const Img4TrustProfile* profile) {
    return verify_chain_img4_ec_v1(QA_EC384_SHA384_ROOT_CA_CERTIFICATE, {certChain, leafKey, certProperties, profile});
}

namespace {

constexpr Img4TrustProfile makeProfile(decltype(Img4TrustProfile::verifyChain) chain,
                                       decltype(Img4TrustProfile::verifySignature) signature,
                                       const Img4DigestInfo& digest, const DERItem& signatureAlgorithm,
                                       const DERItem& keyAlgorithm) {
    return {Img4DecodeComputeDigest, chain,        signature, Img4DecodeEvaluateCertificateProperties, &digest,
            &signatureAlgorithm,     &keyAlgorithm};
}

constexpr Img4TrustProfile makeRSA4kProfile(decltype(Img4TrustProfile::verifyChain) chain) {
    return makeProfile(chain, verify_signature_rsa, kQDSupportDigestInfoSha384, oidSha384Rsa, oidRsa);
}

constexpr Img4TrustProfile makeEC384Profile(decltype(Img4TrustProfile::verifyChain) chain) {
    return makeProfile(chain, verify_signature_ecdsa, kQDSupportDigestInfoSha384, oidSha384Ecdsa, oidAnsip384r1);
}

} // namespace

const Img4TrustProfile kImg4DecodeSecureBootRsa1kSha1 =
    makeProfile(verify_chain_img4_v1, verify_signature_rsa, kQDSupportDigestInfoSha1, oidSha1Rsa, oidRsa);
const Img4TrustProfile kImg4DecodeSecureBootRsa3kSha384 =
    makeProfile(verify_chain_img4_v2_rsa3k, verify_signature_rsa3k, kQDSupportDigestInfoSha384, oidSha384Rsa, oidRsa);
const Img4TrustProfile kImg4DecodeSecureBootRsa4kSha384 = makeRSA4kProfile(verify_chain_img4_v2);
const Img4TrustProfile kImg4DecodeSecureBootRsa4kSha384BRX1 = makeRSA4kProfile(verify_chain_img4_v2_BRX1);
const Img4TrustProfile kImg4DecodeSecureBootRsa4kSha384X86 = makeRSA4kProfile(verify_chain_img4_x86);
const Img4TrustProfile kImg4DecodeSecureBootRsa4kSha384DDI = makeRSA4kProfile(verify_chain_img4_ddi);
const Img4TrustProfile kImg4DecodeSecureBootRsa4kSha384DDIGlobal = makeRSA4kProfile(verify_chain_img4_ddi_global);
const Img4TrustProfile kImg4DecodeSecureBootRsa4kSha384DDIFake = makeRSA4kProfile(verify_chain_img4_ddi_fake);
const Img4TrustProfile kImg4DecodeSecureBootRsa4kSha384DDIFakeGlobal =
    makeRSA4kProfile(verify_chain_img4_ddi_fake_global);
const Img4TrustProfile kImg4DecodeLocalPolicyRsa4kSha384 = makeRSA4kProfile(verify_chain_img4_marda_local_policy);
const Img4TrustProfile kImg4DecodeLocalPolicyEc384Sha384 = makeEC384Profile(verify_chain_img4_ecdsa384_local_policy);
const Img4TrustProfile kImg4DecodeLocalPolicyEc384Sha384QA = makeEC384Profile(verify_chain_img4_ecdsa384_qa);
const Img4TrustProfile kImg4DecodeSecureBootEc256Sha256 = makeProfile(
    verify_chain_img4_ecdsa256, verify_signature_ecdsa, kQDSupportDigestInfoSha256, oidSha256Ecdsa, oidEcPrime256v1);
const Img4TrustProfile kImg4DecodeSecureBootEc384Sha384 = makeEC384Profile(verify_chain_img4_ecdsa384);

#define ENTRY(profile, root, chainLength)                                                                              \
    { #profile, &(profile), #root, &(root), chainLength }

const Img4TrustProfileEntry Img4TrustProfiles[] = {
    ENTRY(kImg4DecodeSecureBootRsa1kSha1, ROOT_CA_CERTIFICATE, 3),
    ENTRY(kImg4DecodeSecureBootRsa3kSha384, RSA3K_SHA384_ROOT_CA_CERTIFICATE, 2),
    ENTRY(kImg4DecodeSecureBootRsa4kSha384, RSA4K_SHA384_ROOT_CA_CERTIFICATE, 2),
    ENTRY(kImg4DecodeSecureBootRsa4kSha384BRX1, RSA4K_SHA384_ROOT_CA_CERTIFICATE_BRX1, 2),
    ENTRY(kImg4DecodeSecureBootRsa4kSha384X86, RSA4K_SHA384_X86_ROOT_CA_CERTIFICATE, 2),
    ENTRY(kImg4DecodeSecureBootRsa4kSha384DDI, RSA4K_SHA384_DDI_ROOT_CA_CERTIFICATE, 2),
    ENTRY(kImg4DecodeSecureBootRsa4kSha384DDIGlobal, RSA4K_SHA384_DDI_GLOBAL_ROOT_CA_CERTIFICATE, 2),
    ENTRY(kImg4DecodeSecureBootRsa4kSha384DDIFake, RSA4K_SHA384_DDI_FAKE_ROOT_CA_CERTIFICATE, 2),
    ENTRY(kImg4DecodeSecureBootRsa4kSha384DDIFakeGlobal, RSA4K_SHA384_DDI_FAKE_GLOBAL_ROOT_CA_CERTIFICATE, 2),
    ENTRY(kImg4DecodeLocalPolicyRsa4kSha384, RSA4K_SHA384_LP_ROOT_CA_CERTIFICATE, 2),
    ENTRY(kImg4DecodeLocalPolicyEc384Sha384, EC384_SHA384_LP_ROOT_CA_CERTIFICATE, 3),
    ENTRY(kImg4DecodeLocalPolicyEc384Sha384QA, QA_EC384_SHA384_ROOT_CA_CERTIFICATE, 3),
    ENTRY(kImg4DecodeSecureBootEc256Sha256, LOCAL_EC256_SHA256_ROOT_CA_CERTIFICATE, 2),
    ENTRY(kImg4DecodeSecureBootEc384Sha384, LOCAL_EC384_SHA384_ROOT_CA_CERTIFICATE, 2),
};
const uint16_t Img4NumTrustProfiles = std::size(Img4TrustProfiles);

namespace {

// Verifies a chain with the rules, the root and the domain of a profile that Img4DecodeMakeDomainProfile has made,
// whose first member `arguments` has.
DERReturn verifyInDomain(const ChainArguments& arguments, Img4TrustRefusal* why) {
    const auto& domainProfile = *reinterpret_cast<const Img4DomainProfile*>(arguments.profile);
    const bool isRSA = DEROidCompare(arguments.profile->keyAlgorithmOid, &oidRsa);
    const ChainRules& rules =
        domainProfile.chainLength == twoRSA.length ? (isRSA ? twoRSA : twoEC) : (isRSA ? threeRSA : threeEC);
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
