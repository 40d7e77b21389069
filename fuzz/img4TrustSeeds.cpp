#include <string>

#include "fuzz/SeedFile.h"
#include "tests/support/SignedManifestMaker.h"

namespace {

using namespace signedmanifest;

// A sound manifest and container of the profile, and a manifest whose leaf constrains in every way.
bool writeSeeds(const std::string& folder, const Img4TrustProfileEntry& entry) {
    using namespace img4maker;
    const Signer signer(TEST_TRUST_DOMAIN, entry);
    const Bytes manifest = signer.manifest(standardManifest(), signer.standardChain());
    const Bytes leaf =
        signer.issue(signer.leaf({object("MANP", {mustBePresent("brdI"), mustBeAbsent("xxxx")}),
                                  object("OBJP", {property("eksp", boolean(true))}), object("manx", {})}));
    return writeSeed(folder, std::string("manifest-") + entry.name, manifest) &&
           writeSeed(folder, std::string("container-") + entry.name, container(payload({}), manifest, {})) &&
           writeSeed(folder, std::string("constrained-") + entry.name,
                     signer.manifest(standardManifest(), signer.chainWith(leaf)));
}

} // namespace

int main(int argc, char** argv) {
    if (argc != 2)
        return 1;
    for (const Img4TrustProfileEntry* entry = Img4TrustProfiles; entry != Img4TrustProfiles + Img4NumTrustProfiles;
         ++entry)
        if (!writeSeeds(argv[1], *entry))
            return 1;
    return 0;
}
