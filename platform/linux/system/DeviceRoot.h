// The device root: the directory below which every path of the device is resolved, whether it is fixed in the program
// or named in a request. It is the value of the environment variable VELTRA_DEVICE_ROOT, "/" when that is not set or
// empty, and is read at every call.
//
// The kernel resolves the paths (openat2 with RESOLVE_IN_ROOT), so that neither "..", nor an absolute symbolic link,
// nor a link swapped in meanwhile leads out of the root. Magic links of /proc are never followed. Code that needs more
// than one operation on a place opens the directory once and goes on with the *at system calls.
#ifndef VELTRA_PLATFORM_LINUX_DEVICE_ROOT_H
#define VELTRA_PLATFORM_LINUX_DEVICE_ROOT_H

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include <sys/types.h>

#include "platform/Value.h"
#include "platform/linux/system/FileDescriptor.h"

// The device root as the environment names it.
std::string deviceRootPath();

// Opens the device root itself, for the *at system calls. None, with errno set, when it is missing or no directory.
FileDescriptor openDeviceRoot();

// Opens the device path `path` with the flags of open(2); O_CLOEXEC and O_NOCTTY are always added. `mode` is the mode
// of a file that O_CREAT makes. `resolve` adds RESOLVE_ flags of openat2(2), such as RESOLVE_NO_SYMLINKS. A relative
// path counts from the root. None, with errno set, on failure; an empty path is ENOENT and one that holds a NUL EINVAL.
FileDescriptor openInRoot(std::string_view path, int flags, mode_t mode = 0, std::uint64_t resolve = 0);

// Opens the directory at the device path `path` for reading and for the *at system calls.
FileDescriptor openDirectoryInRoot(std::string_view path, std::uint64_t resolve = 0);

// Opens the directory at the device path `path`, which is made first when it is missing: with mode `mode`, and those
// above it with mode 0755. What is made outlasts a power cut.
FileDescriptor makeDirectoryInRoot(std::string_view path, mode_t mode);

// A device path taken apart at its last slash.
struct DevicePath {
    std::string_view parent; // "/" when the path has no other slash
    std::string name;        // neither empty nor "." or ".."; without slash and NUL
};

// The parts of `path`, or none when it does not end in a name.
std::optional<DevicePath> splitDevicePath(std::string_view path);

// The rest of the open file from its position on; nothing, with errno set, when it is no regular file, cannot be read,
// or holds more than `maximum` bytes. What counts are the bytes that come, not the size that the file system states:
// the nodes of /sys and /proc state one that is not theirs, and a file may grow while it is read.
std::optional<Value::Data> readRegularFile(const FileDescriptor& file, std::size_t maximum);

#endif
