// Files of the device. Every path is resolved below the device root and cannot leave it, neither through ".." nor
// through a symbolic link; a relative path counts from the root. All operations may be called from any thread.
#ifndef VELTRA_PLATFORM_FILES_H
#define VELTRA_PLATFORM_FILES_H

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Error.h"
#include "platform/Value.h"

namespace files {

// The largest file that readWhole reads unless the caller says otherwise.
constexpr std::size_t maximumSize = std::size_t{256} << 20;

// The whole contents of the regular file at `path`, or nothing when it is missing, unreadable, no regular file (a FIFO
// or device is never waited for) or larger than `maximum`. *error, when `error` is given, then says why.
std::optional<Value::Data> readWhole(std::string_view path, std::size_t maximum = maximumSize,
                                     std::optional<Error>* error = nullptr);

// What there is at `path`; a symbolic link counts as what it leads to.
enum class Kind {
    Nothing,
    Directory,
    Other,
};
Kind kindOf(std::string_view path);

// The names of the entries of the directory at `path`, in the file system's order and without "." and ".."; none when
// it cannot be listed.
std::vector<std::string> list(std::string_view path);

// Makes `contents` the whole contents of the file at `path`: a new file of mode 0600 in the same directory, flushed to
// the disk and then renamed over the target. A symbolic link at the end is not followed. Returns false, and leaves
// everything as it was, when the directory is missing or the target exists and is no regular file. The same goes for a
// new file that was made but could not be filled or moved to its place; *writeError, when given, is then set and says
// why.
bool replace(std::string_view path, std::span<const std::uint8_t> contents, std::optional<Error>* writeError = nullptr);

// Removes the regular file at `path`; a symbolic link or anything else that stands there stays.
void remove(std::string_view path);

// Appends `text` to the file at `path` with one write; the file is created with mode 0640 when it is missing, keeps the
// mode that it has otherwise, and is closed again at the end. A symbolic link or anything but a regular file is not
// opened. False when the text could not be written.
bool append(std::string_view path, std::string_view text);

} // namespace files

#endif
