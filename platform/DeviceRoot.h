// The device root: the directory below which every path of the device is resolved, whether it is fixed in the program
// or named in a request. It is the value of the environment variable VELTRA_DEVICE_ROOT, "/" when that is not set or
// empty, and is read at every call.
//
// A path is walked name by name, each looked up in a directory that is held open, so that neither "..", nor an absolute
// symbolic link, nor anything that is renamed or swapped in meanwhile leads out of the root; a link of /proc counts as
// the path that it shows. The kernel is asked for a path without links in one call (openat2); an old kernel, a
// system-call filter or an emulator that lacks it costs time and nothing else.
// Code that needs more than one operation on a place opens the directory once and goes on with the *at system calls.
#ifndef VELTRA_PLATFORM_DEVICE_ROOT_H
#define VELTRA_PLATFORM_DEVICE_ROOT_H

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <sys/types.h>

#include "platform/FileDescriptor.h"
#include "platform/Value.h"

// The device root as the environment names it.
std::string deviceRootPath();

// Opens the device root itself, for the *at system calls. None, with errno set, when it is missing or no directory.
FileDescriptor openDeviceRoot();

// Whether symbolic links on the way and at the end of a path are followed, or end it with ELOOP.
enum class Links {
    Followed,
    Refused,
};

// Opens what the device path `path` names with the flags of open(2), but never makes it; O_CLOEXEC is always added, and
// with O_NOFOLLOW a link at the end is not followed. Its kind is looked at first: without O_PATH only a regular file or
// a directory is opened, anything else is ENXIO and not touched. A relative path counts from the root. None, with errno
// set, on failure; an empty path is ENOENT, one that holds a NUL EINVAL, and one that leads through more than 128
// directories ENAMETOOLONG.
FileDescriptor openInRoot(std::string_view path, int flags, Links links = Links::Followed);

// Opens what the entry `name` of the open directory is, in the same way: only a regular file or a directory, and no
// link.
FileDescriptor openIn(const FileDescriptor& directory, const std::string& name, int flags);

// Opens the directory at the device path `path` for reading and for the *at system calls.
FileDescriptor openDirectoryInRoot(std::string_view path, Links links = Links::Followed);

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

// The names of the entries of the open directory, in the file system's order and without "." and ".."; nothing, with
// errno set, when they cannot be read.
std::optional<std::vector<std::string>> namesIn(const FileDescriptor& directory);

// The rest of the open file from its position on; nothing, with errno set, when it is no regular file, cannot be read,
// or holds more than `maximum` bytes. What counts are the bytes that come, not the size that the file system states:
// the nodes of /sys and /proc state one that is not theirs, and a file may grow while it is read.
std::optional<Value::Data> readRegularFile(const FileDescriptor& file, std::size_t maximum);

#endif
