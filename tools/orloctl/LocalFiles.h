// Files of this machine, not of the device, that the command line names.
#ifndef VELTRA_TOOLS_ORLOCTL_LOCALFILES_H
#define VELTRA_TOOLS_ORLOCTL_LOCALFILES_H

#include <functional>
#include <stdexcept>
#include <string>

#include "platform/Value.h"
#include "platform/linux/system/NewFile.h"

// The command line asks for what cannot be done; what() says so in a sentence without a full stop.
class UsageError : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

// The contents of a file, for "-" of standard input. Raises UsageError when it cannot be read or is larger than 256
// MiB.
Value::Data readLocalFile(const std::string& path);

// Makes a new file of mode 0600, which `fill` writes, the file `name` in `directory`, in place of a regular file that
// may be there. The reason of a failure, or an empty text.
std::string replaceFile(const FileDescriptor& directory, const std::string& name,
                        const std::function<bool(const NewFile&)>& fill, bool isFirst = true);

// Makes `contents` the contents of a new file of mode 0600 in place of a regular file that may be there. No link at the
// path's end is followed. For "-", writes to standard output. Raises UsageError when the file cannot be written.
void writeLocalFile(const std::string& path, const Value::Data& contents);

#endif
