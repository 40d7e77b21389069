#include "platform/Files.h"

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <string>

#include <fcntl.h>
#include <sys/stat.h>

#include "platform/DeviceRoot.h"
#include "platform/linux/system/NewFile.h"

namespace files {

namespace {

constexpr mode_t logMode = 0640;

// Says in *error, when it is given, what errno holds.
void explain(const char* domain, std::optional<Error>* error) {
    if (error)
        *error = Error{domain, errno, std::strerror(errno)};
}

// Whether `name` is free or a regular file.
bool mayBeReplaced(const FileDescriptor& directory, const std::string& name) {
    struct stat status;
    if (::fstatat(directory.get(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0)
        return errno == ENOENT;
    return S_ISREG(status.st_mode);
}

// Makes the log file, with the mode that it should have whatever bits the umask takes; or opens the one that another
// process has made meanwhile.
FileDescriptor makeLog(std::string_view path) {
    const std::optional<DevicePath> parts = splitDevicePath(path);
    const FileDescriptor directory = parts ? openDirectoryInRoot(parts->parent) : FileDescriptor();
    if (!directory)
        return {};
    FileDescriptor file(
        ::openat(directory.get(), parts->name.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_EXCL | O_CLOEXEC, logMode));
    if (!file)
        return errno == EEXIST ? openInRoot(path, O_WRONLY | O_APPEND | O_NOFOLLOW) : FileDescriptor();
    ::fchmod(file.get(), logMode);
    return file;
}

} // namespace

std::optional<Value::Data> readWhole(std::string_view path, std::size_t maximum, std::optional<Error>* error) {
    const FileDescriptor file = openInRoot(path, O_RDONLY);
    std::optional<Value::Data> contents = file ? readRegularFile(file, maximum) : std::nullopt;
    if (!contents)
        explain("POSIXErrorDomain", error);
    return contents;
}

Kind kindOf(std::string_view path) {
    const FileDescriptor file = openInRoot(path, O_PATH);
    struct stat status;
    if (!file || ::fstat(file.get(), &status) != 0)
        return Kind::Nothing;
    return S_ISDIR(status.st_mode) ? Kind::Directory : Kind::Other;
}

std::vector<std::string> list(std::string_view path) {
    return namesIn(openDirectoryInRoot(path)).value_or(std::vector<std::string>());
}

bool replace(std::string_view path, std::span<const std::uint8_t> contents, std::optional<Error>* writeError) {
    const std::optional<DevicePath> parts = splitDevicePath(path);
    if (!parts)
        return false;
    const FileDescriptor directory = openDirectoryInRoot(parts->parent);
    if (!directory || !mayBeReplaced(directory, parts->name))
        return false;
    NewFile file(directory);
    if (!file)
        return false;
    if (!file.fill(contents) || !file.replace(parts->name)) {
        explain("FileErrorDomain", writeError);
        return false;
    }
    return true;
}

void remove(std::string_view path) {
    const std::optional<DevicePath> parts = splitDevicePath(path);
    const FileDescriptor directory = parts ? openDirectoryInRoot(parts->parent) : FileDescriptor();
    if (directory && mayBeReplaced(directory, parts->name))
        ::unlinkat(directory.get(), parts->name.c_str(), 0);
}

bool append(std::string_view path, std::string_view text) {
    FileDescriptor file = openInRoot(path, O_WRONLY | O_APPEND | O_NOFOLLOW);
    if (!file && errno == ENOENT)
        file = makeLog(path);
    if (!file)
        return false;
    const ssize_t count = TEMP_FAILURE_RETRY(::write(file.get(), text.data(), text.size()));
    return count >= 0 && static_cast<std::size_t>(count) == text.size();
}

} // namespace files
