// Manifests of every profile, signed in the tests' domain, whose roots have the names of those that are built in; and
// leaves with constraints of every kind, met and broken.
#include <vector>

#include "fuzz/Seeds.h"
#include "tools/makers/SignedManifestMaker.h"

namespace {

using namespace signedmanifest;
using namespace img4maker;

Bytes constrained(const Signer& signer, const List& constraints) {
    return signer.manifest(standardManifest(), signer.chainWith(signer.issue(signer.leaf(constraints))));
}

std::vector<Bytes> seeds() {
    std::vector<Bytes> all;
    for (unsigned i = 0; i < Img4NumTrustProfiles; ++i) {
        const Signer signer(TEST_TRUST_DOMAIN, Img4TrustProfiles[i]);
        all.push_back(signer.manifest(standardManifest(), signer.standardChain()));
    }
    const Signer signer(TEST_TRUST_DOMAIN, Img4TrustProfiles[Img4NumTrustProfiles - 1]);
    const List met = {property("ABCD", integer(7)), mustBePresent("TEXT"), mustBeAbsent("NONE")};
    all.push_back(constrained(signer, {object("MANP", met), object("manx", met)}));
    all.push_back(constrained(signer, {object("OBJP", met)})); // broken
    all.push_back(constrained(signer, {}));
    all.push_back(container(payload({}), constrained(signer, {}), {}));
    return all;
}

} // namespace

int main(int argc, char** argv) {
    return writeSeeds(argc, argv, seeds());
}
