#include <vector>

#include "fuzz/Seeds.h"
#include "tools/makers/SignedManifestMaker.h"

namespace {

using namespace signedmanifest;
using namespace img4maker;

// For each profile a sound manifest and container, and a manifest whose leaf constrains in every way.
std::vector<Bytes> seeds() {
    std::vector<Bytes> all;
    for (unsigned i = 0; i < Img4NumTrustProfiles; ++i) {
        const Signer signer(TEST_TRUST_DOMAIN, Img4TrustProfiles[i]);
        const List constraints = {object("MANP", {mustBePresent("ABCD"), mustBeAbsent("NONE")}),
                                  object("OBJP", {property("eksp", boolean(true))}), object("manx", {})};
        all.push_back(signer.manifest(standardManifest(), signer.standardChain()));
        all.push_back(container(payload({}), all.back(), {}));
        all.push_back(signer.manifest(standardManifest(), signer.chainWith(signer.issue(signer.leaf(constraints)))));
    }
    return all;
}

} // namespace

int main(int argc, char** argv) {
    return writeSeeds(argc, argv, seeds());
}
