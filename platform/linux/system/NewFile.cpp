#include "platform/linux/system/NewFile.h"

#include <cerrno>
#include <cstdint>
#include <cstdio>

#include <fcntl.h>
#include <sys/random.h>
#include <sys/stat.h>

namespace {

constexpr mode_t privateMode = 0600;

bool writeAll(const FileDescriptor& file, const Value::Data& contents) {
    std::size_t written = 0;
    while (written < contents.size()) {
        const ssize_t count = ::write(file.get(), contents.data() + written, contents.size() - written);
        if (count < 0 && errno == EINTR)
            continue;
        if (count < 0)
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

} // namespace

NewFile::NewFile(const FileDescriptor& directory) : directory_(directory) {
    std::uint64_t random;
    if (::getrandom(&random, sizeof random, 0) != static_cast<ssize_t>(sizeof random))
        return;
    name_ = ".new-" + std::to_string(random);
    file_ = FileDescriptor(
        ::openat(directory.get(), name_.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, privateMode));
    remove_ = static_cast<bool>(file_);
}

NewFile::~NewFile() {
    const int error = errno;
    if (remove_)
        ::unlinkat(directory_.get(), name_.c_str(), 0);
    errno = error;
}

// The mode is set once more, since the umask may have taken bits from it.
bool NewFile::fill(const Value::Data& contents) const {
    return ::fchmod(file_.get(), privateMode) == 0 && writeAll(file_, contents) && flush(file_);
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
