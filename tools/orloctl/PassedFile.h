// A file through which a local one passes to or from the device.
#ifndef VELTRA_TOOLS_ORLOCTL_PASSED_FILE_H
#define VELTRA_TOOLS_ORLOCTL_PASSED_FILE_H

#include <optional>
#include <string>

#include "platform/FileDescriptor.h"
#include "platform/Value.h"

// The file "record" in a new directory in the device's /tmp, which none but its owner and root can open. Both go at the
// end. Raises UsageError when it cannot be made or written.
class PassedFile {
public:
    PassedFile();
    PassedFile(const PassedFile&) = delete;
    PassedFile& operator=(const PassedFile&) = delete;
    ~PassedFile();

    // The path on the device.
    std::string path() const;

    void write(const Value::Data& contents) const;

    // Its contents; none when it is not there.
    std::optional<Value::Data> read() const;

private:
    FileDescriptor parent_;
    std::string folder_;
    FileDescriptor directory_;
};

#endif
