// make-signed-manifests DOMAIN FOLDER: writes, for each profile of the domain that scripts/make-trust-domain made, a
// signed manifest (<profile>.im4m) and a container with it and a payload (<profile>.img4). The object is "sepi".
#include <filesystem>
#include <iostream>

#include "tools/makers/SignedManifestMaker.h"

using namespace img4maker;
using namespace signedmanifest;

int main(int count, char** arguments) {
    if (count != 3) {
        std::cerr << "usage: make-signed-manifests DOMAIN FOLDER\n";
        return 2;
    }
    const std::filesystem::path folder = arguments[2];
    try {
        for (unsigned i = 0; i < Img4NumTrustProfiles; ++i) {
            const Img4TrustProfileEntry& entry = Img4TrustProfiles[i];
            const Signer signer(arguments[1], entry);
            const Bytes manifest = signer.manifest(standardManifest(), signer.standardChain());
            writeFile(folder / (std::string(entry.name) + ".im4m"), manifest);
            writeFile(folder / (std::string(entry.name) + ".img4"), container(payload({}), manifest, {}));
        }
    } catch (const std::exception& error) {
        std::cerr << error.what() << "\n";
        return 1;
    }
    return 0;
}
