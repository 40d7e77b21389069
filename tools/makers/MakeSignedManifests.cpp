// make-signed-manifests DOMAIN FOLDER: writes, for each profile of the domain that scripts/make-trust-domain made, a
// signed manifest (<profile>.im4m) and a container with it and a payload (<profile>.img4). The object is "sepi".
#include <filesystem>
#include <fstream>
#include <iostream>

#include "tools/makers/SignedManifestMaker.h"

namespace {

using namespace signedmanifest;

void write(const std::filesystem::path& path, const Bytes& bytes) {
    std::ofstream file(path, std::ios::binary);
    file.exceptions(std::ios::failbit | std::ios::badbit);
    file.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
}

} // namespace

int main(int count, char** arguments) {
    if (count != 3) {
        std::cerr << "usage: make-signed-manifests DOMAIN FOLDER\n";
        return 2;
    }
    const std::filesystem::path folder = arguments[2];
    try {
        std::filesystem::create_directories(folder);
        for (unsigned i = 0; i < Img4NumTrustProfiles; ++i) {
            const Img4TrustProfileEntry& entry = Img4TrustProfiles[i];
            const Signer signer(arguments[1], entry);
            const Bytes manifest = signer.manifest(standardManifest(), signer.standardChain());
            write(folder / (std::string(entry.name) + ".im4m"), manifest);
            write(folder / (std::string(entry.name) + ".img4"),
                  img4maker::container(img4maker::payload({}), manifest, {}));
        }
    } catch (const std::exception& error) {
        std::cerr << error.what() << "\n";
        return 1;
    }
    return 0;
}
