#include "platform/Files.h"

#include <cerrno>
#include <cstring>
#include <string>

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>

#include "platform/linux/system/DeviceRoot.h"
#include "platform/linux/system/NewFile.h"

namespace files {

namespace {

constexpr mode_t logMode = 0640;

// Whether `name` is free or a regular file.
bool mayBeReplaced(const FileDescriptor& directory, const std::string& name) {
    struct stat status;
    if (::fstatat(directory.get(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0)
        return errno == ENOENT;
    return S_ISREG(status.st_mode);
}

} // namespace

std::optional<Value::Data> readWhole(std::string_view path) {
    const FileDescriptor file = openInRoot(path, O_RDONLY | O_NONBLOCK);
    return file ? readRegularFile(file, maximumSize) : std::nullopt;
}

bool exists(std::string_view path) {
    return static_cast<bool>(openInRoot(path, O_PATH));
}

bool replace(std::string_view path, const Value::Data& contents, std::optional<Error>* writeError) {
    const std::optional<DevicePath> parts = splitDevicePath(path);
    if (!parts)
        return false;
    const FileDescriptor directory = openDirectoryInRoot(parts->parent, RESOLVE_NO_SYMLINKS);
    if (!directory || !mayBeReplaced(directory, parts->name))
        return false;
    NewFile file(directory);
    if (!file)
        return false;
    if (!file.fill(contents) || !file.replace(parts->name)) {
        if (writeError)
            *writeError = Error{"FileErrorDomain", errno, std::strerror(errno)};
        return false;
    }
    return true;
}

bool append(std::string_view path, std::string_view text) {
    const FileDescriptor file = openInRoot(path, O_WRONLY | O_APPEND | O_CREAT | O_NOFOLLOW | O_NONBLOCK, logMode);
    struct stat status;
    if (!file || ::fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode))
        return false;
    // A new file has the mode that it should have, whatever bits the umask took.
    if (status.st_size == 0 && (status.st_mode & 07777) != logMode && ::fchmod(file.get(), logMode) != 0)
        return false;
    ssize_t count;
    do
        count = ::write(file.get(), text.data(), text.size());
    while (count < 0 && errno == EINTR);
    return count >= 0 && static_cast<std::size_t>(count) == text.size();
}

} // namespace files
