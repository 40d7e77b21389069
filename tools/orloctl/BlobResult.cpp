#include "tools/orloctl/BlobResult.h"

#include <cerrno>
#include <cstring>

#include <fcntl.h>

#include "platform/DeviceRoot.h"
#include "platform/Files.h"
#include "platform/Json.h"
#include "platform/linux/system/DescribedValue.h"
#include "sysconfig/SysConfig3Ptr.h"

namespace {

using sysconfig::SysConfig3Ptr;

constexpr std::uint32_t keyWCh0 = 0x57436830;
constexpr std::uint32_t keyMiGB = 0x4D694742;

std::optional<struct stat> statusOf(const FileDescriptor& file) {
    struct stat status;
    return file && ::fstat(file.get(), &status) == 0 ? std::optional(status) : std::nullopt;
}

bool isSame(const struct stat& one, const struct stat& other) {
    return one.st_dev == other.st_dev && one.st_ino == other.st_ino && one.st_ctim.tv_sec == other.st_ctim.tv_sec &&
           one.st_ctim.tv_nsec == other.st_ctim.tv_nsec;
}

SysConfig3Ptr decoded(const Value::Data& blob) {
    return SysConfig3Ptr(decodeSysConfig3(blob.data(), static_cast<std::uint32_t>(blob.size())));
}

// Why the service makes nothing of the blob at `devicePath`.
std::string whyEmpty(const std::string& devicePath) {
    std::optional<Error> error;
    const auto blob = files::readWhole(devicePath, files::maximumSize, &error);
    if (!blob)
        return error->code == ENOENT ? devicePath + " is missing on the device"
                                     : devicePath + " cannot be read on the device: " + error->text;
    const SysConfig3Ptr object = decoded(*blob);
    if (!object)
        return devicePath + " is no configuration blob";
    if (sysConfig3HMACIsSupported(sysConfig3GetVersion(object.get())))
        return devicePath + " needs a key: its version protects the entries with HMACs";
    return "the service could not rewrite " + devicePath;
}

// The hardware model that the device description names; empty when there is none.
std::string hardwareModel() {
    const auto contents = files::readWhole("/etc/veltra/device.json");
    const auto description =
        contents ? jsonToValue({reinterpret_cast<const char*>(contents->data()), contents->size()}) : std::nullopt;
    const Value model = description ? resolveDescribed((*description)["answers"]["HWModelStr"]) : Value();
    return model.text() ? *model.text() : "";
}

// A model has a WCh0 payload when its name contains one of two family names.
bool hasWCh0(const std::string& model) {
    return model.find("M11") != std::string::npos || model.find("M12") != std::string::npos;
}

void judgeContents(JudgedBlob& result, const std::string& devicePath) {
    const SysConfig3Ptr object = decoded(result.contents);
    const std::string model = hardwareModel();
    const auto has = [&](std::uint32_t key) { return sysConfig3GetPayloadEntryForKey(object.get(), key) != nullptr; };
    if (result.contents.empty())
        result.problem = "is empty: " + whyEmpty(devicePath);
    else if (!object)
        result.problem = "is no configuration blob";
    else if (!has(keyMiGB))
        result.problem = "has no MiGB entry";
    else if (hasWCh0(model) && !has(keyWCh0))
        result.problem = "has no WCh0 entry, and model " + model + " has one";
    else if (!hasWCh0(model))
        result.note = (model.empty() ? "a device without a model" : "model " + model) +
                      " has no WCh0, so that only MiGB was written";
}

} // namespace

BlobResult::BlobResult() : earlier_(statusOf(openInRoot(blobResultPath, O_PATH | O_NOFOLLOW))) {}

JudgedBlob BlobResult::read(uid_t serviceUser, const std::string& devicePath) const {
    JudgedBlob result;
    // Nothing is opened for reading before it is known to be a file.
    auto status = statusOf(openInRoot(blobResultPath, O_PATH | O_NOFOLLOW));
    const bool isFile = status && S_ISREG(status->st_mode);
    const FileDescriptor file = isFile ? openInRoot(blobResultPath, O_RDONLY | O_NOFOLLOW) : FileDescriptor();
    const int error = errno;
    if (file)
        status = statusOf(file);
    if (!status)
        result.problem = "is missing: the service could not write it, or has another device root";
    else if (!isFile || !S_ISREG(status->st_mode))
        result.problem = "is no regular file, and the service replaces nothing else";
    else if (status->st_uid != serviceUser)
        result.problem = "belongs to another user than the service";
    else if (status->st_nlink != 1)
        result.problem = "has a second name, which the service's own files have not";
    else if (earlier_ && isSame(*earlier_, *status))
        result.problem = "is that of an earlier request: the service could not write, or has another device root";
    else if (!file)
        result.problem = std::string("cannot be read: ") + std::strerror(error);
    else if (auto contents = readRegularFile(file, files::maximumSize)) {
        result.contents = std::move(*contents);
        judgeContents(result, devicePath);
    } else
        result.problem = std::string("cannot be read: ") + std::strerror(errno);
    if (!result.problem.empty())
        result.problem = std::string("The result, ") + blobResultPath + " on the device, " + result.problem + ".";
    return result;
}
