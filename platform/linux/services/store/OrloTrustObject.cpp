#include "platform/linux/services/store/OrloTrustObject.h"

#include <cerrno>
#include <cstring>
#include <optional>
#include <utility>

#include <fcntl.h>

#include "platform/Crypto.h"
#include "platform/DeviceRoot.h"
#include "platform/linux/services/store/OrloStoreBackend.h"
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

FileDescriptor open(const FileDescriptor& directory, const std::string& name) {
    FileDescriptor file = openIn(directory, name, O_RDONLY);
    if (!file && errno == ENOENT) {
        make(directory, name);
        file = openIn(directory, name, O_RDONLY);
    }
    if (!file && errno != ENXIO) // what is neither a file nor a link is not opened
        failWithErrno("cannot be opened");
    return file;
}

} // namespace

Value::Data readTrustObject(const FileDescriptor& directory, const std::string& name) {
    const FileDescriptor file = open(directory, name);
    std::optional<Value::Data> contents = file ? readRegularFile(file, maximumSize) : std::nullopt;
    if (!contents || contents->empty())
        fail("is damaged: it is empty, no regular file, or larger than 1 MiB");
    return std::move(*contents);
}
