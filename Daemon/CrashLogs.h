// Collects the crash and diagnostic logs that a device keeps, for its host.
#ifndef VELTRA_DAEMON_CRASH_LOGS_H
#define VELTRA_DAEMON_CRASH_LOGS_H

#include <string_view>

#include "platform/Value.h"

// Reads the files whose names end in ".ips" or ".log" in /private/var/logs and then in
// /private/var/mobile/Library/Logs/Varrow, not in directories below, into *response:
//   "Status"  0 when there is at least one, 45 when there is none
//   "Error"   the empty text
//   "Data"    only with status 0: an array with a dictionary for each file, in the order in which they were found
//     "isPanic"      "YES" for a panic report, a file whose name begins with "panic", otherwise "NO"
//     "LogFileName"  the device path; U+FFFD stands for what is no UTF-8 in it
//     "LogFileSize"  the size in bytes that the file system states
//     "LogFileData"  the whole contents, whatever their size
// A panic report is left out unless check_panic_version holds for it. A directory or file that cannot be read is a line
// in the log and left out. Returns the status.
int get_ramdisk_logs(Value* response);

// Whether the panic report at the device path `path` was written by the operating-system build that is running: the
// file is ASCII text, its first line is a JSON object, and the text under "os_version" in it contains
// "ProductBuildVersion" of /System/Library/Quennel/SystemVersion.plist.
bool check_panic_version(std::string_view path);

#endif
