#ifndef VELTRA_PLATFORM_FILE_DESCRIPTOR_H
#define VELTRA_PLATFORM_FILE_DESCRIPTOR_H

#include <utility>

#include <unistd.h>

// Owns an open file descriptor; -1 is none.
class FileDescriptor {
public:
    FileDescriptor() = default;
    explicit FileDescriptor(int number) : number_(number) {}
    FileDescriptor(FileDescriptor&& other) noexcept : number_(std::exchange(other.number_, -1)) {}
    FileDescriptor& operator=(FileDescriptor&& other) noexcept {
        std::swap(number_, other.number_);
        return *this;
    }
    FileDescriptor(const FileDescriptor&) = delete;
    FileDescriptor& operator=(const FileDescriptor&) = delete;
    ~FileDescriptor() {
        if (number_ >= 0)
            ::close(number_);
    }

    explicit operator bool() const { return number_ >= 0; }
    int get() const { return number_; }

    // Hands the number over to the caller, who closes it.
    int release() { return std::exchange(number_, -1); }

private:
    int number_ = -1;
};

#endif
