#include "der/DERDecode.h"
#include "tests/img4/TrustDomain.h"
#include "tests/support/MissingArguments.h"

#include <string_view>
#include <vector>

#include <gtest/gtest.h>

namespace {

using namespace img4maker;
using namespace signedmanifest;

constexpr std::size_t largestCertificate = 131071;

const Bytes otherOid = item(DERTagObjectIdentifier, {0x88, 0x37, 0x05});
const Bytes null = {0x05, 0x00};
const Bytes ecPublicKey = item(DERTagObjectIdentifier, {0x2A, 0x86, 0x48, 0xCE, 0x3D, 0x02, 0x01});

Bytes keyInfo(const Bytes& keyAlgorithm, const Bytes& bits, std::uint8_t unusedBits = 0) {
    return sequence({keyAlgorithm, bitString(bits, unusedBits)});
}

Bytes attribute(std::string_view commonName) {
    return sequence(
        {item(DERTagObjectIdentifier, {0x55, 0x04, 0x03}), item(0x13, Bytes(commonName.begin(), commonName.end()))});
}

struct ChainCase {
    const char* name;
    Img4ChainFault fault;
    Bytes chain;
    std::uint32_t certificate = 1; // the one at fault, counted from the end of the verifier's chain
    bool isConstrained = true;
};
using Cases = std::vector<ChainCase>;

// Chains that are sound, whose leaf has a field changed before it is signed, or that were changed afterwards.
Cases leafCases(const Img4TrustProfileEntry& entry) {
    const Signer& signer = signerOf(entry);
    const Certificate sound = signer.leaf();
    const auto with = [&](Bytes Certificate::*field, const Bytes& value) {
        Certificate made = sound;
        made.*field = value;
        return join(signer.chainWith(signer.issue(made)));
    };
    const auto withExtensions = [&](const Bytes& value) { return with(&Certificate::extensions, value); };
    const auto withKey = [&](const Bytes& value) { return with(&Certificate::publicKeyInfo, value); };
    const auto withAlgorithm = [&](const Bytes& value) { return with(&Certificate::signatureAlgorithm, value); };
    const auto constraints = [](const Bytes& value) { return extension(oid(oidTevariImg4ManifestCertSpec), value); };
    const Bytes none = constraints(set({})), otherExtension = sequence({otherOid, boolean(true), octets({})});
    const Bytes algorithmOid = oid(*entry.profile->signatureAlgorithmOid);
    const Bytes otherAlgorithm = algorithm(lastChanged(algorithmOid), isEC(entry) ? Bytes{} : null);
    const Bytes bits = publicKeyBits(signer.leafKey());
    Certificate noBitString = sound;
    noBitString.unusedBits = 8;
    const List standard = signer.standardChain();
    const Bytes chain = join(standard), leaf = signer.issue(sound);
    const auto endingIn = [&](const Bytes& last) { return join(signer.chainWith(last)); };
    Bytes changed = leaf;
    changed.at(20) ^= 1; // of the serial number
    Cases rows = {
        {"as the domain's folder has it", Img4ChainSound, chain, 0},
        {"one certificate too many", Img4ChainLength, join({chain, leaf}), 0},
        {"one certificate too few", Img4ChainLength, join(List(standard.begin(), standard.end() - 1))},
        {"octets behind the chain", Img4ChainEncoding, join({chain, Bytes{0x00}}), 0},
        {"leaf cut short", Img4ChainEncoding, Bytes(chain.begin(), chain.end() - 1)},
        {"leaf signed with its own key", Img4ChainSignature, endingIn(issue(sound, signer.leafKey()))},
        {"octet of the to-be-signed part changed", Img4ChainSignature, endingIn(changed)},
        {"largest item, which is no certificate", Img4ChainEncoding, endingIn(octets(Bytes(largestCertificate - 5)))},
        {"too large a certificate", Img4ChainCertificateSize, endingIn(octets(Bytes(largestCertificate - 4)))},
        {"no extensions", Img4ChainSound, withExtensions({}), 0, false},
        {"other extensions in front", Img4ChainSound, withExtensions(extensions({otherExtension, none})), 0},
        {"empty list of extensions", Img4ChainExtensions, withExtensions(extensions({}))},
        {"extensions that are no list", Img4ChainExtensions, withExtensions(context(3, set({none})))},
        {"no value", Img4ChainExtensions, withExtensions(extensions({none, sequence({otherOid})}))},
        {"constraints twice", Img4ChainExtensions, withExtensions(extensions({none, none}))},
        {"constraints in a SEQUENCE", Img4ChainExtensions, withExtensions(extensions({constraints(sequence({}))}))},
        {"octets behind the constraints", Img4ChainExtensions,
         withExtensions(extensions({constraints(join({set({}), null}))}))},
        {"issuer that differs in an octet", Img4ChainIssuer, with(&Certificate::issuer, lastChanged(sound.issuer))},
        {"other signature algorithm", Img4ChainSignatureAlgorithm, withAlgorithm(otherAlgorithm)},
        {"the same inside, which nobody asks for", Img4ChainSound, with(&Certificate::innerAlgorithm, otherAlgorithm),
         0},
        {"signature that is no BIT STRING", Img4ChainSignature, endingIn(signer.issue(noBitString))},
        {"key of another algorithm", Img4ChainKey, withKey(keyInfo(algorithm(otherOid), bits))},
    };
    const auto add = [&](const Cases& more) { rows.insert(rows.end(), more.begin(), more.end()); };
    if (isEC(entry)) {
        const bool is256 = bits.size() == 65;
        const Bytes curve = oid(is256 ? oidEcPrime256v1 : oidAnsip384r1);
        const Key other = makeECKey(is256 ? "P-384" : "P-256");
        const auto withPoint = [&](const Bytes& point) {
            return withKey(keyInfo(algorithm(ecPublicKey, curve), point));
        };
        add({
            {"algorithm with parameters", Img4ChainSound, withAlgorithm(algorithm(algorithmOid, octets({}))), 0},
            {"key without a curve", Img4ChainKey, withKey(keyInfo(algorithm(ecPublicKey), bits))},
            {"key on another curve", Img4ChainSound, withKey(publicKeyInfo(other)), 0},
            {"point of another curve's length", Img4ChainKey, withPoint(publicKeyBits(other))},
            {"point that lacks an octet", Img4ChainKey, withPoint(Bytes(bits.begin(), bits.end() - 1))},
        });
        return rows;
    }
    const Bytes rsa = oid(oidRsa);
    add({
        {"algorithm without NULL", Img4ChainSound, withAlgorithm(algorithm(algorithmOid)), 0},
        {"algorithm with parameters", Img4ChainSignatureAlgorithm, withAlgorithm(algorithm(algorithmOid, octets({})))},
        {"key without NULL", Img4ChainSound, withKey(keyInfo(algorithm(rsa), bits)), 0},
        {"key with parameters", Img4ChainKey, withKey(keyInfo(algorithm(rsa, octets({})), bits))},
        {"unused bits in the key", Img4ChainKey, withKey(keyInfo(algorithm(rsa, null), Bytes(270, 0xF0), 1))},
        {"no bits in the key", Img4ChainKey, withKey(keyInfo(algorithm(rsa, null), {}))},
    });
    return rows;
}

// Chains of three with another certificate in the middle, which in those of RSA belongs to the authority.
Cases middleCases(const Img4TrustProfileEntry& entry) {
    constexpr const char* authority = "Tevari Secure Boot Certification Authority";
    const Signer& signer = signerOf(entry);
    const Bytes sound = distinguishedName(authority);
    const Img4ChainFault other = isEC(entry) ? Img4ChainSound : Img4ChainAuthority;
    const auto with = [&](const Bytes& subject, const Key& key, std::uint8_t keyChange = 0) {
        Certificate middle = signer.leaf(), leaf = signer.leaf();
        middle.issuer = subjectOf(bytesOf(*entry.root));
        middle.subject = leaf.issuer = subject;
        middle.publicKeyInfo = lastChanged(publicKeyInfo(signer.issuerKey()), keyChange);
        return join({issue(middle, key), signer.issue(leaf)});
    };
    const auto named = [&](const Bytes& subject) { return with(subject, signer.rootKey()); };
    const Bytes another = attribute("Other");
    const Bytes behindAnother = sequence({set({sequence({otherOid, octets({})}), attribute(authority)})});
    return {
        {"authority", Img4ChainSound, named(sound), 0},
        {"authority that signs itself", Img4ChainSignature, with(sound, signer.issuerKey()), 2},
        // The point leaves its curve, or the exponent becomes even, which shows at the leaf.
        {"unsound key", Img4ChainSignature, with(sound, signer.rootKey(), 1)},
        {"name that differs in a letter", other, named(distinguishedName("Tevari Secure Boot Certification authority")),
         2},
        {"name in UTF-8", other, named(distinguishedName(authority, 0x0C)), 2},
        {"first of two names", Img4ChainSound, named(sequence({set({attribute(authority)}), set({another})})), 0},
        {"second of two names", other, named(sequence({set({another}), set({attribute(authority)})})), 2},
        {"name behind another attribute", Img4ChainSound, named(behindAnother), 0},
        {"no name", other, named(sequence({})), 2},
        {"name that is no attribute", other, named(sequence({set({null})})), 2},
        {"name in a SEQUENCE", other, named(sequence({sequence({attribute(authority)})})), 2},
    };
}

// Where the certificate of that number begins. The root, which is the first, is not in the chain.
const std::uint8_t* startOf(const DERItem& chain, std::uint32_t certificate) {
    DERSequence rest;
    DERDecodedInfo item;
    DERDecodeSeqContentInit(&chain, &rest);
    for (std::uint32_t i = 1; i < certificate; ++i)
        DERDecodeSeqNext(&rest, &item);
    return rest.next;
}

void check(const Img4TrustProfileEntry& entry, const ChainCase& row) {
    const Img4TrustCallbacks callbacks = {[](auto...) { return DERSuccess; }, nullptr, nullptr};
    const DERItem view = itemOf(row.chain);
    const std::uint8_t stale = 0;
    const bool isSound = row.fault == Img4ChainSound;
    Img4Record record = {};
    Img4TrustRefusal why;
    record.manifestRaw = {&stale, 1};
    record.manifest.certChain = view;
    Img4DecodePerformTrustEvaluationExplained(nullptr, &record, &callbacks, entry.profile, nullptr, &why);
    EXPECT_EQ(why.chain.fault, row.fault);
    EXPECT_EQ(why.signature.fault != Img4SignatureSound, row.fault == Img4ChainSignature);
    if (!isSound) {
        const DERRefusal& encoding = why.refusal.encoding;
        const std::uint8_t* const start = startOf(view, why.chain.certificate);
        EXPECT_EQ(why.chain.certificate, entry.chainLength - row.certificate);
        EXPECT_EQ(encoding.fault == DERFaultNone ? why.refusal.place : encoding.item, start);
        EXPECT_EQ(encoding.fault == DERFaultNone ? start : encoding.place, why.refusal.place);
    }
    DERItem leafKey = {&stale, 1}, certProperties = {&stale, 1};
    EXPECT_EQ(entry.profile->verifyChain(&view, &leafKey, &certProperties, entry.profile),
              isSound ? DERSuccess : Img4Failure);
    EXPECT_EQ(leafKey.length > 1, isSound);
    EXPECT_EQ(certProperties.length > 1, isSound && row.isConstrained);
}

TEST(Img4Chain, holdsTogetherOrIsRefused) {
    for (const Img4TrustProfileEntry* entry : kindsOfProfile())
        for (const Cases& cases : {leafCases(*entry), entry->chainLength == 3 ? middleCases(*entry) : Cases()})
            for (const ChainCase& row : cases) {
                SCOPED_TRACE(std::string(entry->name) + ", " + row.name);
                check(*entry, row);
            }
}

TEST(Img4Chain, needsItsArgumentsAndEndsInTheRootOfADomainGivenAtRunTime) {
    const Img4TrustProfileEntry& entry = entryOf(kImg4DecodeSecureBootEc384Sha384);
    const Bytes chain = join(signerOf(entry).standardChain());
    const DERItem view = itemOf(chain), none = {};
    const Bytes otherOidContent(otherOid.begin() + 2, otherOid.end());
    const Img4TrustDomain otherDomain = {{}, itemOf(otherOidContent)};
    DERItem leafKey, certProperties;
    Img4ChainRefusal refusal;
    Img4DomainProfile made;
    const auto verify = [&](const DERItem* root, const Img4TrustDomain& domain) {
        EXPECT_EQ(Img4DecodeMakeDomainProfile(&entry, root, &domain, &made), DERSuccess);
        made.refusal = &refusal;
        return made.profile.verifyChain(&view, &leafKey, &certProperties, &made.profile);
    };
    Img4TrustProfile incomplete = *entry.profile;
    incomplete.digestInfo = nullptr;
    expectNeedsAll(DERParamError, Img4DecodeMakeDomainProfile, &entry, entry.root, &Img4BuiltInTrustDomain, &made);
    expectNeedsAll(Img4Failure, entry.profile->verifyChain, &view, &leafKey, &certProperties, entry.profile);
    EXPECT_EQ(entry.profile->verifyChain(&view, &leafKey, &certProperties, &incomplete), Img4Failure);
    EXPECT_EQ(entry.profile->verifyChain(&none, &leafKey, &certProperties, entry.profile), Img4Failure);
    EXPECT_EQ(verify(entryOf(kImg4DecodeLocalPolicyEc384Sha384).root, Img4BuiltInTrustDomain), Img4Failure);
    EXPECT_EQ(refusal.fault, Img4ChainIssuer);
    EXPECT_EQ(verify(&none, Img4BuiltInTrustDomain), Img4Failure);
    EXPECT_EQ(refusal.fault, Img4ChainEncoding);
    EXPECT_EQ(refusal.certificate, 0U);
    EXPECT_EQ(verify(entry.root, otherDomain), DERSuccess);
    EXPECT_EQ(certProperties.data, nullptr) << "constraints under another object identifier";

    Certificate leaf = signerOf(entry).leaf();
    leaf.digestLength = kQDSupportDigestInfoSha512.length;
    const Bytes longChain = signerOf(entry).issue(leaf);
    const DERItem longView = itemOf(longChain);
    made.profile.digestInfo = &kQDSupportDigestInfoSha512;
    EXPECT_EQ(made.profile.verifyChain(&longView, &leafKey, &certProperties, &made.profile), DERSuccess)
        << "the longest digest there is";
}

} // namespace
