#include "tools/orloctl/LocalFiles.h"

#include <cerrno>
#include <cstring>
#include <fstream>
#include <iostream>

#include <fcntl.h>
#include <sys/stat.h>

#include "platform/Files.h"
#include "platform/linux/system/NewFile.h"

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

// The reason of a failure, or an empty text.
std::string replaceFile(const std::string& path, const Value::Data& contents) {
    const std::size_t slash = path.rfind('/');
    const std::string folder = slash == std::string::npos ? "." : path.substr(0, slash + 1);
    const std::string name = path.substr(slash == std::string::npos ? 0 : slash + 1);
    const FileDescriptor directory(::open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!directory)
        return std::strerror(errno);
    struct stat status;
    if (::fstatat(directory.get(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 && !S_ISREG(status.st_mode))
        return "what stands there is no file";
    NewFile file(directory);
    return file && file.fill(contents) && file.replace(name) ? "" : std::strerror(errno);
}

} // namespace

Value::Data readLocalFile(const std::string& path) {
    if (path == standardStream)
        return readAll(std::cin, "standard input");
    std::ifstream file(path, std::ios::binary);
    return readAll(file, path);
}

void writeLocalFile(const std::string& path, const Value::Data& contents) {
    if (path == standardStream)
        std::cout.write(reinterpret_cast<const char*>(contents.data()), static_cast<std::streamsize>(contents.size()));
    else if (const std::string problem = replaceFile(path, contents); !problem.empty())
        throw UsageError("Cannot write " + path + ": " + problem);
}
