#include "platform/linux/system/NewFile.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <string_view>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/DeviceRoot.h"
#include "platform/Value.h"

namespace {

constexpr mode_t privateMode = 0600;
constexpr std::string_view prefix = ".new-";

bool writeAll(const FileDescriptor& file, const std::uint8_t* bytes, std::size_t size) {
    std::size_t written = 0;
    while (written < size) {
        const ssize_t count = TEMP_FAILURE_RETRY(::write(file.get(), bytes + written, size - written));
        if (count < 0)
            return false;
        written += static_cast<std::size_t>(count);
    }
    return true;
}

bool flush(const FileDescriptor& file) {
    return TEMP_FAILURE_RETRY(::fsync(file.get())) == 0;
}

bool lock(const FileDescriptor& file, int operation) {
    return TEMP_FAILURE_RETRY(::flock(file.get(), operation)) == 0;
}

bool isOwnFile(const struct stat& status) {
    return S_ISREG(status.st_mode) && status.st_nlink == 1 && status.st_uid == ::geteuid();
}

// A writer holds a lock on its file. Anyone may give a file such a name, so only those count that nobody else can have
// put there, neither as the owner nor as a further link to something; nor something else, at which opening may wait,
// after the file was looked at.
void removeLeftovers(const FileDescriptor& directory) {
    for (const std::string& name : namesIn(directory).value_or(std::vector<std::string>())) {
        struct stat status;
        if (!name.starts_with(prefix) || name.size() == prefix.size() ||
            name.find_first_not_of("0123456789", prefix.size()) != std::string::npos ||
            ::fstatat(directory.get(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0 || !isOwnFile(status))
            continue;
        const FileDescriptor file(
            ::openat(directory.get(), name.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
        struct stat opened;
        if (file && ::fstat(file.get(), &opened) == 0 && isOwnFile(opened) && opened.st_dev == status.st_dev &&
            opened.st_ino == status.st_ino && lock(file, LOCK_EX | LOCK_NB))
            ::unlinkat(directory.get(), name.c_str(), 0);
    }
}

} // namespace

NewFile::NewFile(const FileDescriptor& directory, bool isFirst) : directory_(directory) {
    if (isFirst)
        removeLeftovers(directory);
    // Until it is locked another writer may take the file for a leftover.
    struct stat status;
    do {
        std::uint64_t random;
        if (::getrandom(&random, sizeof random, 0) != static_cast<ssize_t>(sizeof random))
            return;
        name_ = prefix;
        name_ += std::to_string(random);
        file_ = FileDescriptor(::openat(directory.get(), name_.c_str(),
                                        O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, privateMode));
        remove_ = static_cast<bool>(file_);
    } while (file_ && lock(file_, LOCK_EX) && ::fstat(file_.get(), &status) == 0 && status.st_nlink == 0);
}

NewFile::~NewFile() {
    const int error = errno;
    if (remove_)
        ::unlinkat(directory_.get(), name_.c_str(), 0);
    errno = error;
}

// The mode is set once more, since the umask may have taken bits from it.
bool NewFile::fill(std::span<const std::uint8_t> contents) const {
    return ::fchmod(file_.get(), privateMode) == 0 && writeAll(file_, contents.data(), contents.size()) && flush(file_);
}

bool NewFile::fillFrom(const FileDescriptor& source) const {
    struct stat status;
    if (::fstat(source.get(), &status) != 0)
        return false;
    const off_t size = status.st_size;
    Value::Data piece(std::size_t{1} << 16);
    for (off_t position = 0; position < size;) {
        const off_t data = ::lseek(source.get(), position, SEEK_DATA);
        if (data >= size || (data < 0 && errno == ENXIO))
            break; // nothing but a hole is left
        position = std::max(position, data);
        const off_t hole = ::lseek(source.get(), position, SEEK_HOLE);
        const off_t left = (hole > position ? std::min(hole, size) : size) - position;
        const ssize_t count =
            ::pread(source.get(), piece.data(), std::min(piece.size(), static_cast<std::size_t>(left)), position);
        if (count == 0)
            break;
        if (count < 0 && errno == EINTR)
            continue;
        if (count < 0 || ::lseek(file_.get(), position, SEEK_SET) < 0 ||
            !writeAll(file_, piece.data(), static_cast<std::size_t>(count)))
            return false;
        position += count;
    }
    if (::fstat(source.get(), &status) != 0 || ::ftruncate(file_.get(), std::min(size, status.st_size)) != 0)
        return false;
    const timespec times[] = {status.st_mtim, status.st_mtim};
    return ::futimens(file_.get(), times) == 0 && fill({});
}

bool NewFile::placeAt(const std::string& name) {
    return moveTo(name, RENAME_NOREPLACE);
}

bool NewFile::moveTo(const std::string& name, unsigned flags) {
    if (::renameat2(directory_.get(), name_.c_str(), directory_.get(), name.c_str(), flags) != 0)
        return false;
    remove_ = false;
    // The new file is in place whatever this says; it only makes the move itself outlast a power cut.
    flush(directory_);
    return true;
}
