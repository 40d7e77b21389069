// Makes signed manifests and their chains of certificates for every trust profile, sound ones and broken ones, from a
// domain that scripts/make-trust-domain has made.
#ifndef VELTRA_TOOLS_MAKERS_SIGNEDMANIFESTMAKER_H
#define VELTRA_TOOLS_MAKERS_SIGNEDMANIFESTMAKER_H

#include "img4/Img4Trust.h"
#include "tools/makers/CertificateMaker.h"

#include <string>

namespace signedmanifest {

using namespace certificatemaker;

Bytes oid(const DERItem& content);

// A constraint or property whose value only says that a property must, or must not, be there.
Bytes mustBePresent(std::string_view name);
Bytes mustBeAbsent(std::string_view name);

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
    Bytes issue(const Certificate& fields) const { return certificatemaker::issue(fields, issuerKey()); }

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
