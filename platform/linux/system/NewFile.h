// A file that comes into being as a whole: it is filled under a random name and then moved to its place.
#ifndef VELTRA_PLATFORM_LINUX_NEW_FILE_H
#define VELTRA_PLATFORM_LINUX_NEW_FILE_H

#include <cstdint>
#include <span>
#include <string>

#include "platform/FileDescriptor.h"

// Every operation returns false, with errno set, on failure. The file is removed again unless it was moved; what a
// writer that was killed has left is removed by the next one in that directory.
class NewFile {
public:
    // Makes an empty file of mode 0600 in `directory`, which must outlive this. False as a whole when that failed. A
    // writer of many files says which is its first there: the directory is searched for what others left then alone.
    explicit NewFile(const FileDescriptor& directory, bool isFirst = true);
    NewFile(const NewFile&) = delete;
    NewFile& operator=(const NewFile&) = delete;
    ~NewFile();

    explicit operator bool() const { return static_cast<bool>(file_); }

    // Writes the contents and flushes them to the disk.
    bool fill(std::span<const std::uint8_t> contents) const;

    // The same with the whole of the regular file `source`, piece by piece, and with its time of modification. Holes
    // stay holes, and what is appended meanwhile is left out. Moves the position of `source`.
    bool fillFrom(const FileDescriptor& source) const;

    // Moves the file to `name`, in place of what is there.
    bool replace(const std::string& name) { return moveTo(name, 0); }

    // Moves the file to `name` unless something is there; errno is then EEXIST.
    bool placeAt(const std::string& name);

private:
    bool moveTo(const std::string& name, unsigned flags);

    const FileDescriptor& directory_;
    std::string name_;
    FileDescriptor file_;
    bool remove_ = false;
};

#endif
