#include "platform/linux/services/OrloTrustObject.h"

#include <cerrno>
#include <cstring>
#include <optional>
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
    std::optional<Value::Data> contents = readRegularFile(open(), maximumSize);
    if (!contents || contents->empty())
        fail("is damaged: it is empty, no regular file, or larger than 1 MiB");
    OrloStoreBackend::Digest digest;
    if (!crypto::sha256(contents->data(), contents->size(), digest.data()))
        fail("cannot be digested");
    digest_ = digest;
    return std::move(*contents);
}

const OrloStoreBackend::Digest& OrloTrustObject::digest() {
    if (!digest_)
        read();
    return *digest_;
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
