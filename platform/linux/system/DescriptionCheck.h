// What is wrong with a device description, for the log of the service and for those who write one.
#ifndef VELTRA_PLATFORM_LINUX_DESCRIPTION_CHECK_H
#define VELTRA_PLATFORM_LINUX_DESCRIPTION_CHECK_H

#include <string>
#include <vector>

#include "platform/Value.h"

// One sentence, on one line, for each key that nobody reads, each value of another kind than its readers take, and each
// file that is named and has to be there but is not. Files below the device root are looked at, never opened for
// reading. After the first twenty sentences one says how many more there are. Raises only std::bad_alloc.
std::vector<std::string> descriptionFaults(const Value& description);

#endif
