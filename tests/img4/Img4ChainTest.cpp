#include "der/DERDecode.h"
#include "tests/img4/TrustDomain.h"
#include "tests/support/MissingArguments.h"

#include <algorithm>
#include <initializer_list>
#include <iterator>
#include <string_view>
#include <vector>

#include <gtest/gtest.h>

namespace {

using namespace img4maker;
using namespace signedmanifest;

constexpr std::size_t largestCertificate = 131071;

// What the profile said of a chain, and why it is refused.
struct Verdict {
    DERReturn status;
    Img4ChainRefusal refusal;
    DERItem leafKey;
    DERItem certProperties;
};

// Where the certificate of that number begins. The root, which is the first, is not in the chain.
const std::uint8_t* startOf(const DERItem& chain, std::uint32_t certificate) {
    DERSequence rest;
    DERDecodedInfo item;
    DERDecodeSeqContentInit(&chain, &rest);
    for (std::uint32_t i = 1; i < certificate; ++i)
        DERDecodeSeqNext(&rest, &item);
    return rest.next;
}

Verdict verify(const Img4TrustProfileEntry& entry, const Bytes& chain) {
    const Img4TrustCallbacks callbacks = {[](auto...) { return DERSuccess; }, nullptr, nullptr};
    const DERItem view = itemOf(chain);
    const std::uint8_t stale = 0;
    Img4Record record = {};
    Img4TrustRefusal why;
    record.manifestRaw = {&stale, 1};
    record.manifest.certChain = view;
    Img4DecodePerformTrustEvaluationExplained(nullptr, &record, &callbacks, entry.profile, nullptr, &why);
    Verdict verdict = {DERSuccess, why.chain, {&stale, 1}, {&stale, 1}};
    verdict.status = entry.profile->verifyChain(&view, &verdict.leafKey, &verdict.certProperties, entry.profile);
    EXPECT_EQ(verdict.status == DERSuccess, why.chain.fault == Img4ChainSound);
    EXPECT_EQ(why.signature.fault != Img4SignatureSound, why.chain.fault == Img4ChainSignature);
    if (why.chain.fault != Img4ChainSound) {
        const DERRefusal& encoding = why.refusal.encoding;
        const std::uint8_t* const start = startOf(view, why.chain.certificate);
        EXPECT_EQ(why.refusal.subject, Img4SubjectChain);
        EXPECT_EQ(encoding.fault == DERFaultNone ? why.refusal.place : encoding.item, start);
        EXPECT_EQ(encoding.fault == DERFaultNone ? start : encoding.place, why.refusal.place);
    }
    return verdict;
}

const Bytes otherOid = item(DERTagObjectIdentifier, {0x88, 0x37, 0x05});
const Bytes null = {0x05, 0x00};
const Bytes ecPublicKey = item(DERTagObjectIdentifier, {0x2A, 0x86, 0x48, 0xCE, 0x3D, 0x02, 0x01});

Bytes keyInfo(const Bytes& keyAlgorithm, const Bytes& bits, std::uint8_t unusedBits = 0) {
    return sequence({keyAlgorithm, bitString(bits, unusedBits)});
}

// One attribute, and the name that has several after one another.
Bytes attribute(std::string_view commonName) {
    const Bytes type = item(DERTagObjectIdentifier, {0x55, 0x04, 0x03});
    return sequence({type, item(0x13, Bytes(commonName.begin(), commonName.end()))});
}

Bytes names(std::initializer_list<std::string_view> commonNames) {
    List list;
    for (const std::string_view commonName : commonNames)
        list.push_back(set({attribute(commonName)}));
    return sequence(list);
}

// A leaf with a field changed before it is signed.
struct LeafCase {
    const char* name;
    Img4ChainFault fault;
    Bytes Certificate::*field;
    Bytes value;
    std::uint64_t digestLength = 0; // of the digest that is signed; 0 for the profile's
};

std::vector<LeafCase> leafCases(const Img4TrustProfileEntry& entry) {
    const Signer& signer = signerOf(entry);
    const auto extension = &Certificate::extensions;
    const auto issuer = &Certificate::issuer;
    const auto signature = &Certificate::signatureAlgorithm;
    const auto key = &Certificate::publicKeyInfo;
    const auto constraints = [](const Bytes& value) {
        return signedmanifest::extension(oid(oidTevariImg4ManifestCertSpec), value);
    };
    const Bytes none = constraints(set({}));
    const Certificate sound = signer.leaf();
    const Bytes otherExtension = sequence({otherOid, boolean(true), octets({})});
    const Bytes algorithmOid = oid(*entry.profile->signatureAlgorithmOid);
    const Bytes otherAlgorithm = algorithm(lastChanged(algorithmOid), isEC(entry) ? Bytes{} : null);
    const Bytes bits = publicKeyBits(signer.leafKey());
    std::vector<LeafCase> rows = {
        {"nothing changed", Img4ChainSound, extension, sound.extensions},
        {"no extensions", Img4ChainSound, extension, {}},
        {"other extensions before the constraints", Img4ChainSound, extension, extensions({otherExtension, none})},
        {"empty list of extensions", Img4ChainExtensions, extension, extensions({})},
        {"extensions that are no list", Img4ChainExtensions, extension, context(3, set({none}))},
        {"octets behind the list of extensions", Img4ChainExtensions, extension,
         context(3, join({sequence({none}), null}))},
        {"extension without a value", Img4ChainExtensions, extension, extensions({none, sequence({otherOid})})},
        {"constraints twice", Img4ChainExtensions, extension, extensions({none, none})},
        {"constraints in a SEQUENCE", Img4ChainExtensions, extension, extensions({constraints(sequence({}))})},
        {"constraints cut short", Img4ChainExtensions, extension, extensions({constraints({0x31, 0x01})})},
        {"octets behind the constraints", Img4ChainExtensions, extension,
         extensions({constraints(join({set({}), null}))})},
        {"issuer that differs in an octet", Img4ChainIssuer, issuer, lastChanged(sound.issuer)},
        {"issuer cut short", Img4ChainIssuer, issuer, sequence({})},
        {"other signature algorithm", Img4ChainSignatureAlgorithm, signature, otherAlgorithm},
        {"other algorithm's digest", Img4ChainSignature, signature, sound.signatureAlgorithm, 64},
        {"other signature algorithm inside, which nobody asks for", Img4ChainSound, &Certificate::innerAlgorithm,
         otherAlgorithm},
        {"key of another algorithm", Img4ChainKey, key, keyInfo(algorithm(otherOid), bits)},
    };
    if (isEC(entry)) {
        const bool is256 = bits.size() == 65;
        const Bytes curve = oid(is256 ? oidEcPrime256v1 : oidAnsip384r1);
        const Key other = makeECKey(is256 ? "P-384" : "P-256");
        const Bytes shorter(bits.begin(), bits.end() - 1);
        const LeafCase more[] = {
            {"signature algorithm with NULL", Img4ChainSound, signature, algorithm(algorithmOid, null)},
            {"signature algorithm with other parameters", Img4ChainSound, signature,
             algorithm(algorithmOid, octets({}))},
            {"key of another algorithm with a curve", Img4ChainKey, key, keyInfo(algorithm(otherOid, curve), bits)},
            {"RSA key", Img4ChainKey, key, keyInfo(algorithm(oid(oidRsa), null), bits)},
            {"key without a curve", Img4ChainKey, key, keyInfo(algorithm(ecPublicKey), bits)},
            {"key on another curve", Img4ChainSound, key, publicKeyInfo(other)},
            {"point of another curve's length", Img4ChainKey, key,
             keyInfo(algorithm(ecPublicKey, curve), publicKeyBits(other))},
            {"point that lacks an octet", Img4ChainKey, key, keyInfo(algorithm(ecPublicKey, curve), shorter)},
            {"P-521", Img4ChainKey, key, publicKeyInfo(makeECKey("P-521"))},
        };
        rows.insert(rows.end(), std::begin(more), std::end(more));
        return rows;
    }
    Bytes zeroBit = bits;
    zeroBit.back() &= 0xFE;
    const LeafCase more[] = {
        {"signature algorithm without parameters", Img4ChainSound, signature, algorithm(algorithmOid)},
        {"signature algorithm with parameters", Img4ChainSignatureAlgorithm, signature,
         algorithm(algorithmOid, octets({}))},
        {"key without parameters", Img4ChainSound, key, keyInfo(algorithm(oid(oidRsa)), bits)},
        {"key with parameters", Img4ChainKey, key, keyInfo(algorithm(oid(oidRsa), octets({})), bits)},
        {"unused bits in the key", Img4ChainKey, key, keyInfo(algorithm(oid(oidRsa), null), zeroBit, 1)},
        {"no bits in the key", Img4ChainKey, key, keyInfo(algorithm(oid(oidRsa), null), {})},
    };
    rows.insert(rows.end(), std::begin(more), std::end(more));
    return rows;
}

TEST(Img4Chain, leavesAreJudgedByTheirFields) {
    for (const Img4TrustProfileEntry* entry : kindsOfProfile()) {
        const Signer& signer = signerOf(*entry);
        for (const LeafCase& row : leafCases(*entry)) {
            SCOPED_TRACE(std::string(entry->name) + ", " + row.name);
            Certificate leaf = signer.leaf();
            leaf.*row.field = row.value;
            if (row.digestLength != 0)
                leaf.digestLength = row.digestLength;
            const Bytes chain = join(signer.chainWith(signer.issue(leaf)));
            const Verdict verdict = verify(*entry, chain);
            const bool isSound = row.fault == Img4ChainSound;
            EXPECT_EQ(verdict.status, isSound ? DERSuccess : Img4Failure);
            EXPECT_EQ(verdict.refusal.fault, row.fault);
            EXPECT_EQ(verdict.refusal.certificate, isSound ? 0 : entry->chainLength - 1);
            const Bytes key = bytesOf(verdict.leafKey);
            const Bytes info = bitString(key);
            EXPECT_EQ(!key.empty() && std::equal(info.rbegin(), info.rend() - 4, leaf.publicKeyInfo.rbegin()), isSound);
            EXPECT_EQ(verdict.certProperties.length, isSound && !leaf.extensions.empty() ? set({}).size() : 0U);
        }
    }
}

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

// Chains whose leaf is sound but for what happens after it was made.
struct ChainCase {
    const char* name;
    Img4ChainFault fault;
    std::uint32_t certificate; // counted from the end of the verifier's chain
    Bytes chain;
};

std::vector<ChainCase> chainCases(const Signer& s) {
    const List standard = s.standardChain();
    const Bytes chain = join(standard), leaf = s.issue(s.leaf());
    Certificate named = s.leaf();
    named.subject = distinguishedName("Here");
    Bytes renamed = s.issue(named);
    const std::string_view name = "Here";
    *std::search(renamed.begin(), renamed.end(), name.begin(), name.end()) = 'T';
    const auto with = [&s](const Bytes& last) { return join(s.chainWith(last)); };
    return {
        {"as the domain's folder has it", Img4ChainSound, 1, chain},
        {"one certificate too many", Img4ChainLength, 0, join({chain, leaf})},
        {"one certificate too few", Img4ChainLength, 1, join(List(standard.begin(), standard.end() - 1))},
        {"octets behind the chain", Img4ChainEncoding, 0, join({chain, Bytes{0x00}})},
        {"leaf cut short", Img4ChainEncoding, 1, Bytes(chain.begin(), chain.end() - 1)},
        {"fourth element", Img4ChainEncoding, 1, with(sequence({Bytes(leaf.begin() + 4, leaf.end()), null}))},
        {"leaf that is no certificate", Img4ChainEncoding, 1, with(sequence({integer(1), null}))},
        {"leaf signed with its own key", Img4ChainSignature, 1, with(issue(s.leaf(), s.leafKey()))},
        {"octet of the to-be-signed part changed", Img4ChainSignature, 1, with(renamed)},
        {"octet of the signature changed", Img4ChainSignature, 1, with(lastChanged(leaf))},
        {"unused bits in the signature", Img4ChainSignature, 1, with(unusedBitsIn(s))},
        {"largest certificate", Img4ChainSound, 1, with(leafOfSize(s, largestCertificate))},
        {"too large a certificate", Img4ChainCertificateSize, 1, with(leafOfSize(s, largestCertificate + 1))},
    };
}

TEST(Img4Chain, holdsTogetherOrIsRefused) {
    for (const Img4TrustProfileEntry* entry : kindsOfProfile()) {
        for (const ChainCase& row : chainCases(signerOf(*entry))) {
            SCOPED_TRACE(std::string(entry->name) + ", " + row.name);
            const Verdict verdict = verify(*entry, row.chain);
            EXPECT_EQ(verdict.status, row.fault == Img4ChainSound ? DERSuccess : Img4Failure);
            EXPECT_EQ(verdict.refusal.fault, row.fault);
            EXPECT_EQ(verdict.refusal.certificate,
                      row.fault == Img4ChainSound ? 0 : entry->chainLength - row.certificate);
            EXPECT_EQ(verdict.leafKey.data != nullptr, row.fault == Img4ChainSound);
        }
    }
}

struct MiddleCase {
    const char* name;
    Bytes subject;
    Img4ChainFault ofRSA;
    Img4ChainFault ofEC = Img4ChainSound;
    bool signedByRoot = true;
    std::uint8_t keyChange = 0; // of the last octet of its key, whose fault then shows at the leaf
};

constexpr const char* authority = "Tevari Secure Boot Certification Authority";

const MiddleCase middleCases[] = {
    {"authority", distinguishedName(authority), Img4ChainSound},
    {"authority that signs itself", distinguishedName(authority), Img4ChainSignature, Img4ChainSignature, false},
    // The point leaves its curve; the exponent becomes even.
    {"unsound key", distinguishedName(authority), Img4ChainSignature, Img4ChainSignature, true, 0x01},
    {"name that differs in a character", distinguishedName("Tevari Secure Boot Certification authority"),
     Img4ChainAuthority},
    {"name with a character more", distinguishedName(std::string(authority) + " "), Img4ChainAuthority},
    {"name in UTF-8", distinguishedName(authority, 0x0C), Img4ChainAuthority},
    {"first of two names", names({authority, "Other"}), Img4ChainSound},
    {"second of two names", names({"Other", authority}), Img4ChainAuthority},
    {"name behind another attribute", sequence({set({sequence({otherOid, octets({})}), attribute(authority)})}),
     Img4ChainSound},
    {"no name", sequence({}), Img4ChainAuthority},
    {"name that is no attribute", sequence({set({null})}), Img4ChainAuthority},
    {"name in a SEQUENCE", sequence({sequence({attribute(authority)})}), Img4ChainAuthority},
};

TEST(Img4Chain, middleCertificateOfTheRSAChainBelongsToTheAuthority) {
    for (const Img4TrustProfileEntry* entry : kindsOfProfile()) {
        if (entry->chainLength != 3)
            continue;
        const Signer& signer = signerOf(*entry);
        const Bytes root = bytesOf(*entry->root);
        for (const MiddleCase& row : middleCases) {
            SCOPED_TRACE(std::string(entry->name) + ", " + row.name);
            Certificate middle = signer.leaf();
            middle.issuer = subjectOf(root);
            middle.subject = row.subject;
            middle.publicKeyInfo = lastChanged(publicKeyInfo(signer.issuerKey()), row.keyChange);
            Certificate leaf = signer.leaf();
            leaf.issuer = row.subject;
            const Bytes issued = issue(middle, row.signedByRoot ? signer.rootKey() : signer.issuerKey());
            const Verdict verdict = verify(*entry, join({issued, signer.issue(leaf)}));
            const Img4ChainFault fault = isEC(*entry) ? row.ofEC : row.ofRSA;
            EXPECT_EQ(verdict.refusal.fault, fault);
            EXPECT_EQ(verdict.refusal.certificate, fault == Img4ChainSound ? 0U : row.keyChange != 0 ? 2U : 1U);
            EXPECT_EQ(verdict.status, fault == Img4ChainSound ? DERSuccess : Img4Failure);
        }
    }
}

TEST(Img4Chain, endsInTheRootOfADomainGivenAtRunTime) {
    const Img4TrustProfileEntry& first = entryOf(kImg4DecodeSecureBootEc384Sha384);
    const Img4TrustProfileEntry& other = entryOf(kImg4DecodeLocalPolicyEc384Sha384);
    const Bytes chain = join(signerOf(first).standardChain());
    const DERItem view = itemOf(chain);
    const Bytes otherOidContent(otherOid.begin() + 2, otherOid.end());
    const Img4TrustDomain otherDomain = {{}, itemOf(otherOidContent)};
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

    Certificate leaf = signerOf(first).leaf();
    leaf.digestLength = made.profile.digestInfo->length + 16;
    const Bytes longChain = signerOf(first).issue(leaf);
    const DERItem longView = itemOf(longChain);
    made.profile.digestInfo = &kQDSupportDigestInfoSha512;
    EXPECT_EQ(made.profile.verifyChain(&longView, &leafKey, &certProperties, &made.profile), DERSuccess)
        << "the longest digest there is";

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
    const DERItem view = itemOf(chain);
    const DERItem none = {};
    DERItem item;
    Img4DomainProfile made;
    Img4TrustProfile incomplete = *entry.profile;
    incomplete.digestInfo = nullptr;
    expectNeedsAll(Img4Failure, entry.profile->verifyChain, &view, &item, &item, entry.profile);
    EXPECT_EQ(entry.profile->verifyChain(&view, &item, &item, &incomplete), Img4Failure);
    EXPECT_EQ(entry.profile->verifyChain(&none, &item, &item, entry.profile), Img4Failure);
    expectNeedsAll(DERParamError, Img4DecodeMakeDomainProfile, &entry, entry.root, &Img4BuiltInTrustDomain, &made);
}

} // namespace
