#include "platform/linux/system/DeviceRoot.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <new>
#include <utility>

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/syscall.h>

namespace {

int openat2(int directory, const char* path, const open_how& how) {
    // The kernel gives up with EAGAIN when something on the way was renamed while it looked, which an attacker could
    // go on doing for ever.
    for (int attempts = 0; attempts < 100; ++attempts) {
        const long result = ::syscall(SYS_openat2, directory, path, &how, sizeof how);
        if (result >= 0 || (errno != EINTR && errno != EAGAIN))
            return static_cast<int>(result);
    }
    return -1;
}

std::nullopt_t nothing(int number) {
    errno = number;
    return std::nullopt;
}

} // namespace

std::string deviceRootPath() {
    const char* root = std::getenv("VELTRA_DEVICE_ROOT");
    return root && *root ? root : "/";
}

FileDescriptor openDeviceRoot() {
    return FileDescriptor(::open(deviceRootPath().c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
}

FileDescriptor openInRoot(std::string_view path, int flags, mode_t mode, std::uint64_t resolve) {
    if (path.find('\0') != std::string_view::npos) {
        errno = EINVAL;
        return {};
    }
    const FileDescriptor root = openDeviceRoot();
    if (!root)
        return {};
    open_how how = {};
    how.flags = static_cast<unsigned>(flags | O_CLOEXEC | ((flags & O_PATH) != 0 ? 0 : O_NOCTTY));
    how.mode = mode;
    how.resolve = resolve | RESOLVE_IN_ROOT | RESOLVE_NO_MAGICLINKS;
    return FileDescriptor(openat2(root.get(), std::string(path).c_str(), how));
}

FileDescriptor openDirectoryInRoot(std::string_view path, std::uint64_t resolve) {
    return openInRoot(path, O_RDONLY | O_DIRECTORY, 0, resolve);
}

FileDescriptor makeDirectoryInRoot(std::string_view path, mode_t mode) {
    while (path.size() > 1 && path.ends_with('/'))
        path.remove_suffix(1);
    FileDescriptor directory = openDirectoryInRoot(path);
    if (directory || errno != ENOENT)
        return directory;
    const std::optional<DevicePath> parts = splitDevicePath(path);
    if (!parts)
        return {};
    const FileDescriptor above = makeDirectoryInRoot(parts->parent, 0755);
    if (!above || (::mkdirat(above.get(), parts->name.c_str(), mode) != 0 && errno != EEXIST))
        return {};
    ::fsync(above.get());
    return openDirectoryInRoot(path);
}

std::optional<DevicePath> splitDevicePath(std::string_view path) {
    const std::size_t slash = path.rfind('/');
    std::string name(slash == std::string_view::npos ? path : path.substr(slash + 1));
    if (name.empty() || name == "." || name == ".." || name.find('\0') != std::string::npos)
        return std::nullopt;
    return DevicePath{slash == std::string_view::npos ? "/" : path.substr(0, slash + 1), std::move(name)};
}

std::optional<Value::Data> readRegularFile(const FileDescriptor& file, std::size_t maximum) try {
    struct stat status;
    if (::fstat(file.get(), &status) != 0)
        return std::nullopt;
    if (!S_ISREG(status.st_mode))
        return nothing(S_ISDIR(status.st_mode) ? EISDIR : EINVAL);
    const auto stated = static_cast<std::size_t>(status.st_size);
    if (stated > maximum)
        return nothing(EFBIG);

    // One byte more than stated, so that a file that is as long as it says needs one read for the bytes and one for
    // the end, into the same memory; and at least a page, since a kernel node that states no size may give all it has
    // to the first read only.
    Value::Data contents(std::max<std::size_t>(stated + 1, 4096));
    std::size_t filled = 0;
    while (true) {
        if (filled == contents.size())
            contents.resize(std::min(contents.size() * 2, maximum + 1));
        const ssize_t count = ::read(file.get(), contents.data() + filled, contents.size() - filled);
        if (count < 0 && errno == EINTR)
            continue;
        if (count < 0)
            return std::nullopt;
        if (count == 0)
            break;
        filled += static_cast<std::size_t>(count);
        if (filled > maximum)
            return nothing(EFBIG);
    }
    contents.resize(filled);
    return contents;
} catch (const std::bad_alloc&) {
    return nothing(ENOMEM);
}
