// make-tickets FOLDER: writes the example device's boot ticket and an example container below a device root.
#include <filesystem>
#include <fstream>

#include "tools/makers/Img4Maker.h"

namespace {

void write(const std::filesystem::path& path, const img4maker::Bytes& bytes) {
    std::filesystem::create_directories(path.parent_path());
    std::ofstream file(path, std::ios::binary);
    file.exceptions(std::ios::failbit | std::ios::badbit);
    file.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
}

} // namespace

int main(int count, char** arguments) {
    if (count != 2)
        return 2;
    const std::filesystem::path root = arguments[1];
    write(root / "System/Library/Caches/apticket.der", img4maker::exampleTicket());
    write(root / "images/container.img4", img4maker::exampleContainer());
    return 0;
}
