#include "platform/linux/services/OrloTrustObject.h"

#include <cerrno>
#include <cstring>
#include <utility>

#include <fcntl.h>

#include "platform/linux/system/DeviceRoot.h"
#include "platform/linux/system/NewFile.h"

namespace {

constexpr std::size_t newSize = 64;
constexpr std::size_t maximumSize = std::size_t{1} << 20;

[[noreturn]] void fail(const std::string& reason) {
    throw OrloStoreFailure(QDOrloErrorStorage, "The trust object " + reason);
}

[[noreturn]] void failWithErrno(const std::string& what) {
    fail(what + ": " + std::strerror(errno));
}

bool isSame(const timespec& one, const timespec& other) {
    return one.tv_sec == other.tv_sec && one.tv_nsec == other.tv_nsec;
}

bool isSame(const struct stat& one, const struct stat& other) {
    return one.st_dev == other.st_dev && one.st_ino == other.st_ino && one.st_size == other.st_size &&
           isSame(one.st_mtim, other.st_mtim) && isSame(one.st_ctim, other.st_ctim);
}

void make(const FileDescriptor& directory, const std::string& name) {
    Value::Data contents(newSize);
    if (!crypto::randomBytes(contents.data(), contents.size()))
        fail("cannot be made: there is no randomness");
    NewFile file(directory);
    if (!file || !file.fill(contents) || (!file.placeAt(name) && errno != EEXIST))
        failWithErrno("cannot be made");
}

} // namespace

Value::Data OrloTrustObject::read() {
    struct stat file;
    return read(&file);
}

OrloStoreBackend::Digest OrloTrustObject::digest() {
    struct stat now;
    if (known_ && ::fstatat(directory_.get(), name_.c_str(), &now, AT_SYMLINK_NOFOLLOW) == 0 &&
        isSame(now, known_->file))
        return known_->digest;
    Known found;
    const Value::Data contents = read(&found.file);
    if (!crypto::sha256(contents.data(), contents.size(), found.digest.data()))
        fail("cannot be digested");
    known_ = found;
    return found.digest;
}

Value::Data OrloTrustObject::read(struct stat* file) {
    const FileDescriptor opened = open();
    if (::fstat(opened.get(), file) != 0)
        failWithErrno("cannot be read");
    std::optional<Value::Data> contents = readRegularFile(opened, maximumSize);
    if (!contents || contents->empty())
        fail("is damaged: it is empty, no regular file, or larger than 1 MiB");
    return std::move(*contents);
}

FileDescriptor OrloTrustObject::open() {
    constexpr int flags = O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC;
    FileDescriptor file(::openat(directory_.get(), name_.c_str(), flags));
    if (!file && errno == ENOENT) {
        make(directory_, name_);
        file = FileDescriptor(::openat(directory_.get(), name_.c_str(), flags));
    }
    if (!file)
        failWithErrno("cannot be opened");
    return file;
}
