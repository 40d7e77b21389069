#ifndef VELTRA_TOOLS_ORLOCTL_CRASH_LOG_REPORT_H
#define VELTRA_TOOLS_ORLOCTL_CRASH_LOG_REPORT_H

#include <string>

#include "tools/orloctl/Report.h"

// Lists the crash and panic logs below the device root, newest first, with their dates (UTC) and sizes. What cannot be
// looked at is listed under "missed" with a note that says why, and the report is not ok. With a directory, which is
// made when it is missing, each file is copied there, for its owner alone (mode 0600), since it may hold what only root
// could read on the device. One is copied at a time, piece by piece, and keeps its time of modification. A copy has the
// log's own name, behind a number when two have the same, and shortened to what a file name may hold. It replaces a
// file of that name, but neither follows a symbolic link nor writes to anything else. A log that cannot be copied is
// listed with a note that says why, the others are copied all the same, and the report is not ok. Raises UsageError
// when there is no device root, or no directory to copy to.
Report collectCrashLogs(const std::string& copyDirectory);

#endif
