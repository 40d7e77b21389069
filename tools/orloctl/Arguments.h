// The arguments of a request, as they stand on the command line.
#ifndef VELTRA_TOOLS_ORLOCTL_ARGUMENTS_H
#define VELTRA_TOOLS_ORLOCTL_ARGUMENTS_H

#include <optional>
#include <stdexcept>
#include <string>
#include <vector>

#include "platform/Value.h"

class UsageError : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

// The message dictionary of KEY=TEXT, KEY:=JSON and KEY@=FILE words. FILE's contents become data. Raises UsageError for
// a word of another form, a key given twice, malformed JSON and a file that cannot be read.
Value::Dictionary parseArguments(const std::vector<std::string>& words);

// The contents of a file of this machine (not of the device). Raises UsageError when it cannot be read or is larger
// than 256 MiB.
Value::Data readLocalFile(const std::string& path);

// Makes `contents` the contents of a file of this machine. Raises UsageError when it cannot be written.
void writeLocalFile(const std::string& path, const Value::Data& contents);

#endif
