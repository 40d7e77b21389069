// Makes signed manifests and their chains of certificates for every trust profile, sound ones and broken ones, from a
// domain that scripts/make-trust-domain has made. Certificates are put together field by field, so that a test can
// change any of them and still have the whole signed.
#ifndef VELTRA_TOOLS_MAKERS_SIGNEDMANIFESTMAKER_H
#define VELTRA_TOOLS_MAKERS_SIGNEDMANIFESTMAKER_H

#include "img4/Img4Trust.h"
#include "tools/makers/Img4Maker.h"

#include <memory>
#include <string>

#include <openssl/evp.h>

namespace signedmanifest {

using img4maker::Bytes;
using img4maker::List;
using Key = std::shared_ptr<EVP_PKEY>;

Key readKey(const std::string& pemFile);
Key makeRSAKey(unsigned bits);
// Of three primes, found sooner than two. The public exponent is big-endian.
Key makeMultiPrimeRSAKey(unsigned bits, const Bytes& exponent = {0x01, 0x00, 0x01});
Key makeECKey(const char* curve);
Bytes readFile(const std::string& path);

// The key as certificates carry it (SubjectPublicKeyInfo), and the bits inside, as signature verifiers take them.
Bytes publicKeyInfo(const Key& key);
Bytes publicKeyBits(const Key& key);

// A signature over `message` with the digest of that many octets.
Bytes sign(const Key& key, std::uint64_t digestLength, const Bytes& message);

// `unusedBits` is only claimed: all octets are kept.
Bytes bitString(const Bytes& octets, std::uint8_t unusedBits = 0);
Bytes algorithm(const Bytes& oid, const Bytes& parameters = {});
Bytes oid(const DERItem& content);
Bytes distinguishedName(std::string_view commonName, DERTag type = 0x13);

// The subject of a certificate, a whole encoding.
Bytes subjectOf(const Bytes& certificate);

// A constraint or property whose value only says that a property must, or must not, be there.
Bytes mustBePresent(std::string_view name);
Bytes mustBeAbsent(std::string_view name);

// One Extension, and the field [3] with a list of them.
Bytes extension(const DERItem& id, const Bytes& value);
Bytes extensions(const List& list);

// The fields of a certificate, each a whole encoding; `extensions` is left out when empty.
struct Certificate {
    Bytes signatureAlgorithm;
    Bytes innerAlgorithm; // that of the to-be-signed part, when it is another
    Bytes issuer;
    Bytes subject;
    Bytes publicKeyInfo;
    Bytes extensions;
    std::uint8_t unusedBits = 0;    // of the signature
    std::uint64_t digestLength = 0; // of the digest that is signed; 0 for the profile's
};

// Signs for one profile of a domain.
class Signer {
public:
    Signer(const std::string& domainFolder, const Img4TrustProfileEntry& entry);

    // The chain as the domain's folder holds it, without the root. Its leaf has constraints, which standardManifest
    // meets.
    List standardChain() const;

    // The keys that sign the leaf and the manifest. With three certificates the first is the middle one's.
    const Key& issuerKey() const { return intermediateKey_ ? intermediateKey_ : rootKey_; }
    const Key& rootKey() const { return rootKey_; }
    const Key& leafKey() const { return leafKey_; }

    // A leaf with these constraints, the elements of the SET. Change it at will, then issue it.
    Certificate leaf(const List& constraints = {}) const;
    Bytes issue(const Certificate& fields) const { return issue(fields, issuerKey()); }
    Bytes issue(const Certificate& fields, const Key& issuer) const;

    // The chain with that leaf.
    List chainWith(const Bytes& leaf) const;

    Bytes manifest(img4maker::Manifest fields, const List& chain) const;
    Bytes manifest(img4maker::Manifest fields, const List& chain, const Key& key) const;

private:
    const Img4TrustProfileEntry& entry_;
    Key rootKey_;
    Key intermediateKey_; // none where the chain has two certificates
    Key leafKey_;
    Bytes intermediate_;
    Bytes leaf_;
    Bytes issuerName_;
};

// A manifest with a few properties, and the object that has some too.
constexpr std::string_view standardObject = "sepi";
img4maker::Manifest standardManifest();

} // namespace signedmanifest

#endif
