#ifndef VELTRA_TOOLS_ORLOCTL_CRASH_LOG_REPORT_H
#define VELTRA_TOOLS_ORLOCTL_CRASH_LOG_REPORT_H

#include <string>

#include "tools/orloctl/Report.h"

// Collects the crash and panic logs below the device root and lists them. With a directory, which is made when it is
// missing, each file is copied there under its own name, or under that name behind a number when two have the same.
// Raises UsageError when a copy cannot be written.
Report collectCrashLogs(const std::string& copyDirectory);

#endif
