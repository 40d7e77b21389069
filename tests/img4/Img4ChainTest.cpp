#include "tests/img4/TrustDomain.h"

#include <functional>

#include <gtest/gtest.h>

namespace {

using namespace img4maker;
using namespace signedmanifest;

constexpr std::size_t largestCertificate = 131071;

// What chain verification said: through the profile and through a domain profile made of it, which tells why.
struct Verdict {
    DERReturn status;
    Img4ChainRefusal refusal;
    DERItem leafKey;
    DERItem certProperties;
};

Verdict verify(const Img4TrustProfileEntry& entry, const Bytes& chain) {
    const DERItem view = viewOf(chain);
    Verdict verdict = {};
    Img4DomainProfile domainProfile;
    EXPECT_EQ(Img4DecodeMakeDomainProfile(&entry, entry.root, &Img4BuiltInTrustDomain, &domainProfile), DERSuccess);
    domainProfile.refusal = &verdict.refusal;
    const DERReturn withReason =
        domainProfile.profile.verifyChain(&view, &verdict.leafKey, &verdict.certProperties, &domainProfile.profile);
    const std::uint8_t stale = 0;
    verdict.leafKey = verdict.certProperties = {&stale, 1};
    verdict.status = entry.profile->verifyChain(&view, &verdict.leafKey, &verdict.certProperties, entry.profile);
    EXPECT_EQ(verdict.status, withReason);
    return verdict;
}

Bytes changed(Bytes bytes, std::size_t place, std::uint8_t mask = 0x01) {
    bytes.at(place) ^= mask;
    return bytes;
}

enum Applies {
    ToAll,
    ToRSA,
    ToEC
};

// A change of the leaf's fields before it is signed.
struct LeafCase {
    const char* name;
    Img4ChainFault fault;
    std::function<void(Certificate&, const Signer&)> change;
    Applies applies = ToAll;
};

const Bytes sha512Rsa = {0x2A, 0x86, 0x48, 0x86, 0xF7, 0x0D, 0x01, 0x01, 0x0D};
const Bytes sha512Ecdsa = {0x2A, 0x86, 0x48, 0xCE, 0x3D, 0x04, 0x03, 0x04};
const Bytes otherOid = item(DERTagObjectIdentifier, {0x88, 0x37, 0x05});
const Bytes null = {0x05, 0x00};
const Bytes ecPublicKey = item(DERTagObjectIdentifier, {0x2A, 0x86, 0x48, 0xCE, 0x3D, 0x02, 0x01});

Bytes constraintsExtension(const Bytes& value) {
    return extension(oidTevariImg4ManifestCertSpec, value);
}

Bytes curveOf(const Signer& signer) {
    return oid(publicKeyBits(signer.leafKey()).size() == 65 ? oidEcPrime256v1 : oidAnsip384r1);
}

Bytes keyInfo(const Bytes& keyAlgorithm, const Bytes& bits, std::uint8_t unusedBits = 0) {
    return sequence({keyAlgorithm, bitString(bits, unusedBits)});
}

const LeafCase leafCases[] = {
    {"nothing changed", Img4ChainSound, [](Certificate&, const Signer&) {}},
    {"no extensions", Img4ChainSound, [](Certificate& leaf, const Signer&) { leaf.extensions = {}; }},
    {"other extensions before the constraints", Img4ChainSound,
     [](Certificate& leaf, const Signer&) {
         leaf.extensions = extensions({sequence({otherOid, boolean(true), octets({})}), constraintsExtension(set({}))});
     }},
    {"empty list of extensions", Img4ChainExtensions,
     [](Certificate& leaf, const Signer&) { leaf.extensions = extensions({}); }},
    {"extensions that are no list", Img4ChainExtensions,
     [](Certificate& leaf, const Signer&) { leaf.extensions = context(3, set({constraintsExtension(set({}))})); }},
    {"octets behind the list of extensions", Img4ChainExtensions,
     [](Certificate& leaf, const Signer&) {
         leaf.extensions = context(3, join({sequence({constraintsExtension(set({}))}), null}));
     }},
    {"extension without a value behind the constraints", Img4ChainExtensions,
     [](Certificate& leaf, const Signer&) {
         leaf.extensions = extensions({constraintsExtension(set({})), sequence({otherOid})});
     }},
    {"constraints twice", Img4ChainExtensions,
     [](Certificate& leaf, const Signer&) {
         leaf.extensions = extensions({constraintsExtension(set({})), constraintsExtension(set({}))});
     }},
    {"constraints in a SEQUENCE", Img4ChainExtensions,
     [](Certificate& leaf, const Signer&) { leaf.extensions = extensions({constraintsExtension(sequence({}))}); }},
    {"constraints cut short", Img4ChainExtensions,
     [](Certificate& leaf, const Signer&) {
         leaf.extensions = extensions({constraintsExtension({0x31, 0x01})});
     }},
    {"octets behind the constraints", Img4ChainExtensions,
     [](Certificate& leaf, const Signer&) {
         leaf.extensions = extensions({constraintsExtension(join({set({}), null}))});
     }},
    {"issuer that differs in an octet", Img4ChainIssuer,
     [](Certificate& leaf, const Signer&) { leaf.issuer = changed(leaf.issuer, leaf.issuer.size() - 1); }},
    {"issuer cut short", Img4ChainIssuer, [](Certificate& leaf, const Signer&) { leaf.issuer = sequence({}); }},
    {"other signature algorithm", Img4ChainSignatureAlgorithm,
     [](Certificate& leaf, const Signer&) {
         leaf.signatureAlgorithm = algorithm(item(DERTagObjectIdentifier, sha512Rsa), null);
         leaf.digestLength = 64;
     }},
    {"signature over the digest of another algorithm", Img4ChainSignature,
     [](Certificate& leaf, const Signer&) { leaf.digestLength = 64; }},
    {"signature algorithm of another curve's digest", Img4ChainSignatureAlgorithm,
     [](Certificate& leaf, const Signer&) {
         leaf.signatureAlgorithm = algorithm(item(DERTagObjectIdentifier, sha512Ecdsa));
     }},
    {"signature algorithm without parameters", Img4ChainSound,
     [](Certificate& leaf, const Signer& signer) {
         leaf.signatureAlgorithm.resize(leaf.signatureAlgorithm.size() -
                                        (EVP_PKEY_is_a(signer.leafKey().get(), "EC") == 1 ? 0 : null.size()));
         leaf.signatureAlgorithm[1] = static_cast<std::uint8_t>(leaf.signatureAlgorithm.size() - 2);
     }},
    {"signature algorithm with parameters", Img4ChainSignatureAlgorithm,
     [](Certificate& leaf, const Signer&) { leaf.signatureAlgorithm = algorithm(oid(oidSha384Rsa), octets({})); },
     ToRSA},
    {"EC signature algorithm with parameters", Img4ChainSound,
     [](Certificate& leaf, const Signer& signer) {
         const bool is256 = publicKeyBits(signer.leafKey()).size() == 65;
         leaf.signatureAlgorithm = algorithm(oid(is256 ? oidSha256Ecdsa : oidSha384Ecdsa), null);
     },
     ToEC},
    {"RSA key without parameters", Img4ChainSound,
     [](Certificate& leaf, const Signer& signer) {
         leaf.publicKeyInfo = keyInfo(algorithm(oid(oidRsa)), publicKeyBits(signer.leafKey()));
     },
     ToRSA},
    {"RSA key with parameters", Img4ChainKey,
     [](Certificate& leaf, const Signer& signer) {
         leaf.publicKeyInfo = keyInfo(algorithm(oid(oidRsa), octets({})), publicKeyBits(signer.leafKey()));
     },
     ToRSA},
    {"key of another algorithm", Img4ChainKey,
     [](Certificate& leaf, const Signer& signer) {
         leaf.publicKeyInfo = keyInfo(algorithm(otherOid), publicKeyBits(signer.leafKey()));
     }},
    {"RSA in an EC chain", Img4ChainKey,
     [](Certificate& leaf, const Signer& signer) {
         leaf.publicKeyInfo = keyInfo(algorithm(oid(oidRsa), null), publicKeyBits(signer.leafKey()));
     },
     ToEC},
    {"unused bits in the key", Img4ChainKey,
     [](Certificate& leaf, const Signer& signer) {
         Bytes bits = publicKeyBits(signer.leafKey());
         bits.back() &= 0xFE;
         leaf.publicKeyInfo = sequence({algorithm(oid(oidRsa), null), bitString(bits, 1)});
     },
     ToRSA},
    {"no bits in the key", Img4ChainKey,
     [](Certificate& leaf, const Signer&) { leaf.publicKeyInfo = keyInfo(algorithm(oid(oidRsa), null), {}); }, ToRSA},
    {"EC key without a curve", Img4ChainKey,
     [](Certificate& leaf, const Signer& signer) {
         leaf.publicKeyInfo = keyInfo(algorithm(ecPublicKey), publicKeyBits(signer.leafKey()));
     },
     ToEC},
    {"EC key on another curve", Img4ChainKey,
     [](Certificate& leaf, const Signer& signer) {
         const bool is256 = publicKeyBits(signer.leafKey()).size() == 65;
         leaf.publicKeyInfo = publicKeyInfo(makeECKey(is256 ? "P-384" : "P-256"));
     },
     ToEC},
    {"point of another curve's length", Img4ChainKey,
     [](Certificate& leaf, const Signer& signer) {
         const bool is256 = publicKeyBits(signer.leafKey()).size() == 65;
         leaf.publicKeyInfo =
             keyInfo(algorithm(ecPublicKey, curveOf(signer)), publicKeyBits(makeECKey(is256 ? "P-384" : "P-256")));
     },
     ToEC},
    {"point that lacks an octet", Img4ChainKey,
     [](Certificate& leaf, const Signer& signer) {
         Bytes bits = publicKeyBits(signer.leafKey());
         bits.pop_back();
         leaf.publicKeyInfo = keyInfo(algorithm(ecPublicKey, curveOf(signer)), bits);
     },
     ToEC},
    {"P-521", Img4ChainKey,
     [](Certificate& leaf, const Signer&) { leaf.publicKeyInfo = publicKeyInfo(makeECKey("P-521")); }, ToEC},
};

bool applies(Applies to, const Img4TrustProfileEntry& entry) {
    return to == ToAll || (to == ToEC) == isEC(entry);
}

TEST(Img4Chain, leavesAreJudgedByTheirFields) {
    for (const Img4TrustProfileEntry& entry : allProfiles()) {
        const Signer& signer = signerOf(entry);
        for (const LeafCase& row : leafCases) {
            if (!applies(row.applies, entry))
                continue;
            SCOPED_TRACE(std::string(entry.name) + ", " + row.name);
            Certificate leaf = signer.leaf();
            row.change(leaf, signer);
            const Bytes chain = join(signer.chainWith(signer.issue(leaf)));
            const Verdict verdict = verify(entry, chain);
            EXPECT_EQ(verdict.status, row.fault == Img4ChainSound ? DERSuccess : Img4Failure);
            EXPECT_EQ(verdict.refusal.fault, row.fault);
            EXPECT_EQ(verdict.refusal.certificate, entry.chainLength - 1);
            EXPECT_EQ(verdict.leafKey.data != nullptr, row.fault == Img4ChainSound);
            if (row.fault == Img4ChainSound) {
                EXPECT_EQ(Bytes(verdict.leafKey.data, verdict.leafKey.data + verdict.leafKey.length),
                          publicKeyBits(signer.leafKey()));
                EXPECT_EQ(verdict.certProperties.length, leaf.extensions.empty() ? 0U : set({}).size());
            } else {
                EXPECT_EQ(verdict.certProperties.data, nullptr);
            }
        }
    }
}

// Chains whose leaf is sound but for what happens after it was made.
struct ChainCase {
    const char* name;
    Img4ChainFault fault;
    std::uint32_t certificate; // counted from the end of the verifier's chain
    std::function<Bytes(const Signer&)> make;
};

Bytes unusedBitsIn(const Signer& signer) {
    // The last bit must be zero, or the BIT STRING is no DER in the first place.
    for (unsigned i = 0;; ++i) {
        Certificate leaf = signer.leaf();
        leaf.subject = distinguishedName("Leaf " + std::to_string(i));
        leaf.unusedBits = 1;
        Bytes issued = signer.issue(leaf);
        if ((issued.back() & 1) == 0)
            return issued;
    }
}

Bytes leafOfSize(const Signer& signer, std::size_t size) {
    Certificate leaf = signer.leaf();
    std::size_t filling = size - 600;
    Bytes issued;
    // ECDSA signatures vary by an octet or two.
    for (int tries = 0; tries < 200 && issued.size() != size; ++tries) {
        leaf.extensions = extensions({sequence({otherOid, octets(Bytes(filling))})});
        issued = signer.issue(leaf);
        filling += size - issued.size();
    }
    EXPECT_EQ(issued.size(), size);
    return issued;
}

const ChainCase chainCases[] = {
    {"as the domain's folder has it", Img4ChainSound, 1, [](const Signer& s) { return join(s.standardChain()); }},
    {"one certificate too many", Img4ChainLength, 0,
     [](const Signer& s) {
         return join({join(s.standardChain()), s.issue(s.leaf())});
     }},
    {"one certificate too few", Img4ChainLength, 1,
     [](const Signer& s) {
         List chain = s.standardChain();
         chain.pop_back();
         return join(chain);
     }},
    {"octets behind the chain", Img4ChainEncoding, 0,
     [](const Signer& s) {
         return join({join(s.standardChain()), Bytes{0x00}});
     }},
    {"leaf cut short", Img4ChainEncoding, 1,
     [](const Signer& s) {
         Bytes chain = join(s.standardChain());
         chain.pop_back();
         return chain;
     }},
    {"leaf with a fourth element", Img4ChainEncoding, 1,
     [](const Signer& s) {
         const Bytes leaf = s.issue(s.leaf());
         return join(s.chainWith(sequence({Bytes(leaf.begin() + 4, leaf.end()), null})));
     }},
    {"leaf that is no certificate", Img4ChainEncoding, 1,
     [](const Signer& s) {
         return join(s.chainWith(sequence({integer(1), null})));
     }},
    {"leaf signed with its own key", Img4ChainSignature, 1,
     [](const Signer& s) { return join(s.chainWith(s.issue(s.leaf(), s.leafKey()))); }},
    {"octet of the to-be-signed part changed", Img4ChainSignature, 1,
     [](const Signer& s) {
         Certificate leaf = s.leaf();
         leaf.subject = distinguishedName("Here");
         Bytes chain = join(s.chainWith(s.issue(leaf)));
         const std::string name = "Here";
         *std::search(chain.begin(), chain.end(), name.begin(), name.end()) = 'T';
         return chain;
     }},
    {"octet of the signature changed", Img4ChainSignature, 1,
     [](const Signer& s) {
         const Bytes leaf = s.issue(s.leaf());
         return join(s.chainWith(changed(leaf, leaf.size() - 1)));
     }},
    {"unused bits in the signature", Img4ChainSignature, 1,
     [](const Signer& s) { return join(s.chainWith(unusedBitsIn(s))); }},
    {"largest certificate", Img4ChainSound, 1,
     [](const Signer& s) { return join(s.chainWith(leafOfSize(s, largestCertificate))); }},
    {"too large a certificate", Img4ChainCertificateSize, 1,
     [](const Signer& s) { return join(s.chainWith(leafOfSize(s, largestCertificate + 1))); }},
};

TEST(Img4Chain, holdsTogetherOrIsRefused) {
    for (const Img4TrustProfileEntry& entry : allProfiles()) {
        for (const ChainCase& row : chainCases) {
            SCOPED_TRACE(std::string(entry.name) + ", " + row.name);
            const Verdict verdict = verify(entry, row.make(signerOf(entry)));
            EXPECT_EQ(verdict.status, row.fault == Img4ChainSound ? DERSuccess : Img4Failure);
            EXPECT_EQ(verdict.refusal.fault, row.fault);
            EXPECT_EQ(verdict.refusal.certificate, entry.chainLength - row.certificate);
            EXPECT_EQ(verdict.leafKey.data != nullptr, row.fault == Img4ChainSound);
        }
    }
}

struct MiddleCase {
    const char* name;
    Bytes subject;
    bool signedByRoot = true;
    Img4ChainFault ofRSA;
    Img4ChainFault ofEC;
};

constexpr const char* authority = "Tevari Secure Boot Certification Authority";
const Bytes emptyName = sequence({});

const MiddleCase middleCases[] = {
    {"authority", distinguishedName(authority), true, Img4ChainSound, Img4ChainSound},
    {"authority that signs itself", distinguishedName(authority), false, Img4ChainSignature, Img4ChainSignature},
    {"name that differs in a character", distinguishedName("Tevari Secure Boot Certification authority"), true,
     Img4ChainAuthority, Img4ChainSound},
    {"name with a character more", distinguishedName(std::string(authority) + " "), true, Img4ChainAuthority,
     Img4ChainSound},
    {"name in UTF-8", distinguishedName(authority, 0x0C), true, Img4ChainAuthority, Img4ChainSound},
    {"no name", emptyName, true, Img4ChainAuthority, Img4ChainSound},
    {"name that is no attribute", sequence({set({null})}), true, Img4ChainAuthority, Img4ChainSound},
    {"name in a SEQUENCE", sequence({sequence({null})}), true, Img4ChainAuthority, Img4ChainSound},
};

TEST(Img4Chain, middleCertificateOfTheRSAChainBelongsToTheAuthority) {
    for (const Img4TrustProfileEntry& entry : allProfiles()) {
        if (entry.chainLength != 3)
            continue;
        const Signer& signer = signerOf(entry);
        const Bytes root(entry.root->data, entry.root->data + entry.root->length);
        for (const MiddleCase& row : middleCases) {
            SCOPED_TRACE(std::string(entry.name) + ", " + row.name);
            Certificate middle = signer.leaf();
            middle.issuer = subjectOf(root);
            middle.subject = row.subject;
            middle.publicKeyInfo = publicKeyInfo(signer.issuerKey());
            Certificate leaf = signer.leaf();
            leaf.issuer = row.subject;
            const Verdict verdict =
                verify(entry, join({signer.issue(middle, row.signedByRoot ? signer.rootKey() : signer.issuerKey()),
                                    signer.issue(leaf)}));
            const Img4ChainFault fault = isEC(entry) ? row.ofEC : row.ofRSA;
            EXPECT_EQ(verdict.refusal.fault, fault);
            EXPECT_EQ(verdict.refusal.certificate, fault == Img4ChainSound ? 2U : 1U);
            EXPECT_EQ(verdict.status, fault == Img4ChainSound ? DERSuccess : Img4Failure);
        }
    }
}

TEST(Img4Chain, endsInTheRootOfItsProfileOnly) {
    for (const Img4TrustProfileEntry& entry : allProfiles()) {
        const Bytes chain = join(signerOf(entry).standardChain());
        const DERItem view = viewOf(chain);
        for (const Img4TrustProfileEntry& other : allProfiles()) {
            DERItem leafKey;
            DERItem certProperties;
            EXPECT_EQ(other.profile->verifyChain(&view, &leafKey, &certProperties, other.profile),
                      other.profile == entry.profile ? DERSuccess : Img4Failure)
                << entry.name << " under " << other.name;
        }
    }
}

TEST(Img4Chain, endsInTheRootOfADomainGivenAtRunTime) {
    const Img4TrustProfileEntry& first = entryOf(kImg4DecodeSecureBootEc384Sha384);
    const Img4TrustProfileEntry& other = entryOf(kImg4DecodeLocalPolicyEc384Sha384);
    const Bytes chain = join(signerOf(first).standardChain());
    const DERItem view = viewOf(chain);
    const Bytes otherOidContent(otherOid.begin() + 2, otherOid.end());
    const Img4TrustDomain otherDomain = {{}, viewOf(otherOidContent)};
    DERItem leafKey;
    DERItem certProperties;
    Img4ChainRefusal refusal;
    Img4DomainProfile made;

    ASSERT_EQ(Img4DecodeMakeDomainProfile(&first, other.root, &Img4BuiltInTrustDomain, &made), DERSuccess);
    made.refusal = &refusal;
    EXPECT_EQ(made.profile.verifyChain(&view, &leafKey, &certProperties, &made.profile), Img4Failure);
    EXPECT_EQ(refusal.fault, Img4ChainIssuer);

    ASSERT_EQ(Img4DecodeMakeDomainProfile(&first, first.root, &otherDomain, &made), DERSuccess);
    EXPECT_EQ(made.profile.verifyChain(&view, &leafKey, &certProperties, &made.profile), DERSuccess);
    EXPECT_EQ(certProperties.data, nullptr) << "constraints under another object identifier";

    const DERItem none = {};
    ASSERT_EQ(Img4DecodeMakeDomainProfile(&first, &none, &Img4BuiltInTrustDomain, &made), DERSuccess);
    made.refusal = &refusal;
    EXPECT_EQ(made.profile.verifyChain(&view, &leafKey, &certProperties, &made.profile), Img4Failure);
    EXPECT_EQ(refusal.fault, Img4ChainEncoding);
    EXPECT_EQ(refusal.certificate, 0U);
}

TEST(Img4Chain, needsItsArguments) {
    const Img4TrustProfileEntry& entry = entryOf(kImg4DecodeSecureBootEc256Sha256);
    const Bytes chain = join(signerOf(entry).standardChain());
    const DERItem view = viewOf(chain);
    const DERItem none = {};
    DERItem item;
    Img4TrustProfile incomplete = *entry.profile;
    incomplete.digestInfo = nullptr;
    EXPECT_EQ(verify_chain_img4_ecdsa256(nullptr, &item, &item, entry.profile), Img4Failure);
    EXPECT_EQ(verify_chain_img4_ecdsa256(&view, nullptr, &item, entry.profile), Img4Failure);
    EXPECT_EQ(verify_chain_img4_ecdsa256(&view, &item, nullptr, entry.profile), Img4Failure);
    EXPECT_EQ(verify_chain_img4_ecdsa256(&view, &item, &item, nullptr), Img4Failure);
    EXPECT_EQ(verify_chain_img4_ecdsa256(&view, &item, &item, &incomplete), Img4Failure);
    EXPECT_EQ(verify_chain_img4_ecdsa256(&none, &item, &item, entry.profile), Img4Failure);
}

} // namespace
