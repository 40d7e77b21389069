#include "tools/orloctl/LocalFiles.h"

#include <cerrno>
#include <cstring>
#include <fstream>

#include "platform/Files.h"

Value::Data readLocalFile(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    Value::Data contents;
    char piece[65536];
    while (file.read(piece, sizeof piece) || file.gcount() > 0) {
        contents.insert(contents.end(), piece, piece + file.gcount());
        if (contents.size() > files::maximumSize)
            throw UsageError(path + " is larger than 256 MiB");
    }
    if (!file.eof())
        throw UsageError("Cannot read " + path + ": " + std::strerror(errno));
    return contents;
}

void writeLocalFile(const std::string& path, const Value::Data& contents) {
    std::ofstream file(path, std::ios::binary | std::ios::trunc);
    file.write(reinterpret_cast<const char*>(contents.data()), static_cast<std::streamsize>(contents.size()));
    file.close();
    if (!file)
        throw UsageError("Cannot write " + path + ": " + std::strerror(errno));
}
