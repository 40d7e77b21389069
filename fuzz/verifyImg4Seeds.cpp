// Manifests of every profile, signed in the tests' domain, whose roots have the names of those that are built in; and
// leaves with constraints of every kind, met and broken.
#include "fuzz/SeedFile.h"
#include "tests/support/SignedManifestMaker.h"

namespace {

using namespace signedmanifest;
using namespace img4maker;

Bytes constrained(const Signer& signer, const List& constraints) {
    return signer.manifest(standardManifest(), signer.chainWith(signer.issue(signer.leaf(constraints))));
}

bool writeSeeds(const std::string& folder) {
    bool written = true;
    for (unsigned i = 0; i < Img4NumTrustProfiles; ++i) {
        const Signer signer(TEST_TRUST_DOMAIN, Img4TrustProfiles[i]);
        const std::string name = Img4TrustProfiles[i].name;
        written = written && writeSeed(folder, name, signer.manifest(standardManifest(), signer.standardChain()));
    }
    const Signer signer(TEST_TRUST_DOMAIN, Img4TrustProfiles[Img4NumTrustProfiles - 1]);
    const List met = {property("ABCD", integer(7)), mustBePresent("TEXT"), mustBeAbsent("NONE")};
    return written && writeSeed(folder, "met", constrained(signer, {object("MANP", met), object("manx", met)})) &&
           writeSeed(folder, "broken", constrained(signer, {object("OBJP", met)})) &&
           writeSeed(folder, "none", constrained(signer, {})) &&
           writeSeed(folder, "container", container(payload({}), constrained(signer, {}), {}));
}

} // namespace

int main(int argc, char** argv) {
    return argc == 2 && writeSeeds(argv[1]) ? 0 : 1;
}
