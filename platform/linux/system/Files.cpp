#include "platform/Files.h"

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <memory>
#include <string>

#include <dirent.h>
#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/random.h>
#include <sys/stat.h>

#include "platform/linux/system/DeviceRoot.h"

namespace files {

namespace {

constexpr mode_t privateMode = 0600;
constexpr mode_t logMode = 0640;

// Says in *error, when it is given, what errno holds.
void explain(Error* error) {
    if (error)
        *error = {"POSIXErrorDomain", errno, std::strerror(errno)};
}

bool isRegular(const FileDescriptor& file) {
    struct stat status;
    return ::fstat(file.get(), &status) == 0 && S_ISREG(status.st_mode);
}

bool writeAll(const FileDescriptor& file, const Value::Data& contents) {
    std::size_t written = 0;
    while (written < contents.size()) {
        const ssize_t count = ::write(file.get(), contents.data() + written, contents.size() - written);
        if (count < 0 && errno == EINTR)
            continue;
        if (count <= 0)
            return false;
        written += static_cast<std::size_t>(count);
    }
    return true;
}

bool flush(const FileDescriptor& file) {
    int result;
    do
        result = ::fsync(file.get());
    while (result != 0 && errno == EINTR);
    return result == 0;
}

// A new file of a random name in a directory. It is removed again unless it was moved to its place.
class NewFile {
public:
    explicit NewFile(const FileDescriptor& directory) : directory_(directory) {
        std::uint64_t random;
        if (::getrandom(&random, sizeof random, 0) != static_cast<ssize_t>(sizeof random))
            return;
        name_ = ".new-" + std::to_string(random);
        file_ = FileDescriptor(::openat(directory.get(), name_.c_str(),
                                        O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, privateMode));
        remove_ = static_cast<bool>(file_);
    }
    NewFile(const NewFile&) = delete;
    NewFile& operator=(const NewFile&) = delete;
    ~NewFile() {
        if (remove_)
            ::unlinkat(directory_.get(), name_.c_str(), 0);
    }

    // The mode is set once more, since the umask may have taken bits from it.
    bool fill(const Value::Data& contents) const {
        return file_ && ::fchmod(file_.get(), privateMode) == 0 && writeAll(file_, contents) && flush(file_);
    }

    bool moveTo(const std::string& name) {
        if (::renameat(directory_.get(), name_.c_str(), directory_.get(), name.c_str()) != 0)
            return false;
        remove_ = false;
        return true;
    }

private:
    const FileDescriptor& directory_;
    std::string name_;
    FileDescriptor file_;
    bool remove_ = false;
};

// Whether `name` is free or a regular file.
bool mayBeReplaced(const FileDescriptor& directory, const std::string& name) {
    struct stat status;
    if (::fstatat(directory.get(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0)
        return errno == ENOENT;
    return S_ISREG(status.st_mode);
}

} // namespace

std::optional<Value::Data> readWhole(std::string_view path, std::size_t maximum, Error* error) {
    const FileDescriptor file = openInRoot(path, O_RDONLY | O_NONBLOCK);
    std::optional<Value::Data> contents = file ? readRegularFile(file, maximum) : std::nullopt;
    if (!contents)
        explain(error);
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
    std::vector<std::string> names;
    FileDescriptor file = openDirectoryInRoot(path);
    const std::unique_ptr<DIR, int (*)(DIR*)> directory(file ? ::fdopendir(file.get()) : nullptr, ::closedir);
    if (!directory)
        return names;
    file.release(); // the stream closes it
    while (const dirent* entry = ::readdir(directory.get())) {
        const std::string_view name = entry->d_name;
        if (name != "." && name != "..")
            names.emplace_back(name);
    }
    return names;
}

Value attributes(std::string_view path, Error* error) {
    const FileDescriptor file = openInRoot(path, O_PATH);
    struct stat status;
    if (!file || ::fstat(file.get(), &status) != 0) {
        explain(error);
        return {};
    }
    Value::Dictionary found;
    if (S_ISREG(status.st_mode) || S_ISDIR(status.st_mode))
        found["Size"] = std::int64_t{status.st_size};
    return found;
}

bool replace(std::string_view path, const Value::Data& contents) {
    const std::size_t slash = path.rfind('/');
    const std::string name(slash == std::string_view::npos ? path : path.substr(slash + 1));
    if (name.empty() || name == "." || name == ".." || name.find('\0') != std::string::npos)
        return false;
    const std::string_view parent = slash == std::string_view::npos ? "/" : path.substr(0, slash + 1);
    const FileDescriptor directory = openDirectoryInRoot(parent, RESOLVE_NO_SYMLINKS);
    if (!directory || !mayBeReplaced(directory, name))
        return false;
    NewFile file(directory);
    if (!file.fill(contents) || !file.moveTo(name))
        return false;
    // The new contents are in place whatever this says; it only makes the rename itself outlast a power cut.
    flush(directory);
    return true;
}

bool append(std::string_view path, std::string_view text) {
    const FileDescriptor file = openInRoot(path, O_WRONLY | O_APPEND | O_CREAT | O_NOFOLLOW | O_NONBLOCK, logMode);
    if (!file || !isRegular(file))
        return false;
    ssize_t count;
    do
        count = ::write(file.get(), text.data(), text.size());
    while (count < 0 && errno == EINTR);
    return count >= 0 && static_cast<std::size_t>(count) == text.size();
}

} // namespace files
