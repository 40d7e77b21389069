// The arguments of a request, as they stand on the command line.
#ifndef VELTRA_TOOLS_ORLOCTL_ARGUMENTS_H
#define VELTRA_TOOLS_ORLOCTL_ARGUMENTS_H

#include <string>
#include <vector>

#include "platform/Value.h"

// The message dictionary of KEY=TEXT, KEY:=JSON and KEY@=FILE words. FILE's contents become data. Raises UsageError for
// a word of another form, a key given twice, malformed JSON and a file that cannot be read.
Value::Dictionary parseArguments(const std::vector<std::string>& words);

#endif
