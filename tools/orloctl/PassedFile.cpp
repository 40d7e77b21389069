#include "tools/orloctl/PassedFile.h"

#include <cerrno>
#include <cstring>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/Crypto.h"
#include "platform/DeviceRoot.h"
#include "platform/Files.h"
#include "platform/Hexadecimal.h"
#include "tools/orloctl/LocalFiles.h"

namespace {

constexpr const char* parent = "/tmp";
constexpr const char* name = "record";

[[noreturn]] void refuse(const std::string& path, const std::string& why) {
    throw UsageError("Cannot write " + path + " on the device: " + why);
}

} // namespace

PassedFile::PassedFile() : parent_(openDirectoryInRoot(parent)) {
    Value::Data random(8);
    if (!crypto::randomBytes(random.data(), random.size()))
        throw UsageError("There are no random numbers to be had");
    folder_ = "orloctl-" + hexadecimal(random);
    if (parent_ && ::mkdirat(parent_.get(), folder_.c_str(), 0700) == 0)
        directory_ = openIn(parent_, folder_, O_RDONLY | O_DIRECTORY);
    if (!directory_)
        refuse(path(), std::strerror(errno));
}

PassedFile::~PassedFile() {
    ::unlinkat(directory_.get(), name, 0);
    ::unlinkat(parent_.get(), folder_.c_str(), AT_REMOVEDIR);
}

std::string PassedFile::path() const {
    return std::string(parent) + "/" + folder_ + "/" + name;
}

void PassedFile::write(const Value::Data& contents) const {
    const std::string problem =
        replaceFile(directory_, name, [&contents](const NewFile& file) { return file.fill(contents); });
    if (!problem.empty())
        refuse(path(), problem);
}

std::optional<Value::Data> PassedFile::read() const {
    const FileDescriptor file = openIn(directory_, name, O_RDONLY);
    return file ? readRegularFile(file, files::maximumSize) : std::nullopt;
}
