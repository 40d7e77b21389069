#include "tools/orloctl/LocalFiles.h"

#include <cerrno>
#include <cstring>
#include <fstream>
#include <iostream>

#include <fcntl.h>
#include <sys/stat.h>

#include "platform/Files.h"

namespace {

constexpr const char* standardStream = "-";

Value::Data readAll(std::istream& file, const std::string& name) {
    Value::Data contents;
    char piece[65536];
    while (file.read(piece, sizeof piece) || file.gcount() > 0) {
        contents.insert(contents.end(), piece, piece + file.gcount());
        if (contents.size() > files::maximumSize)
            throw UsageError(name + " is larger than 256 MiB");
    }
    if (!file.eof())
        throw UsageError("Cannot read " + name + ": " + std::strerror(errno));
    return contents;
}

} // namespace

Value::Data readLocalFile(const std::string& path) {
    if (path == standardStream)
        return readAll(std::cin, "standard input");
    std::ifstream file(path, std::ios::binary);
    return readAll(file, path);
}

std::string replaceFile(const FileDescriptor& directory, const std::string& name,
                        const std::function<bool(const NewFile&)>& fill, bool isFirst) {
    struct stat status;
    if (::fstatat(directory.get(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 && !S_ISREG(status.st_mode))
        return "what stands there is no file";
    NewFile file(directory, isFirst);
    return file && fill(file) && file.replace(name) ? "" : std::strerror(errno);
}

void writeLocalFile(const std::string& path, const Value::Data& contents) {
    if (path == standardStream) {
        std::cout.write(reinterpret_cast<const char*>(contents.data()), static_cast<std::streamsize>(contents.size()));
        return;
    }
    const std::size_t name = path.rfind('/') + 1; // 0 without one
    const std::string folder = name == 0 ? "." : path.substr(0, name);
    const FileDescriptor directory(::open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    const std::string problem =
        directory ? replaceFile(directory, path.substr(name), [&](const NewFile& file) { return file.fill(contents); })
                  : std::strerror(errno);
    if (!problem.empty())
        throw UsageError("Cannot write " + path + ": " + problem);
}
