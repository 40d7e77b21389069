// Collects the crash and diagnostic logs that a device keeps, for its host.
#ifndef VELTRA_DAEMON_CRASH_LOGS_H
#define VELTRA_DAEMON_CRASH_LOGS_H

#include <functional>
#include <string>
#include <string_view>

#include <sys/stat.h>

#include "platform/FileDescriptor.h"
#include "platform/Value.h"

struct CrashLog {
    std::string path;     // the device path, as the file system has it
    bool isPanic = false; // a panic report, a file whose name begins with "panic"
    struct stat status;
    FileDescriptor file; // open for reading, at its start
};

struct CrashLogVisitor {
    std::function<void(const CrashLog&)> found;
    std::function<void(std::string_view path, std::string_view reason)> missed; // a file or directory
};

// Finds the files whose names end in ".ips" or ".log" in /private/var/logs and then in
// /private/var/mobile/Library/Logs/Varrow, not in directories below, one at a time and without holding their contents.
// Users may write there, so neither a directory on the way nor a file may be a symbolic link, and nothing but a regular
// file is opened. What cannot be looked at is a line in the log and missed; a directory that does not exist is only a
// line. A panic report is passed over unless check_panic_version holds for it, and missed when that cannot be told: it
// cannot be read as text, or the running build is unknown.
void visitCrashLogs(const CrashLogVisitor& visitor);

// Reads the files that visitCrashLogs finds into *response:
//   "Status"  0 when there is at least one, 45 when there is none
//   "Error"   the empty text
//   "Data"    only with status 0: an array with a dictionary for each file, in the order in which they were found
//     "isPanic"      "YES" for a panic report, otherwise "NO"
//     "LogFileName"  the device path; U+FFFD stands for what is no UTF-8 in it
//     "LogFileSize"  the size in bytes that the file system states
//     "LogFileData"  the whole contents, whatever their size
// What cannot be read is a line in the log and left out. Returns the status.
int get_ramdisk_logs(Value* response);

// Whether the panic report at the device path `path` was written by the operating-system build that is running: the
// file is ASCII text, its first line is a JSON object of at most 16 MiB, no link leads there, and the text under
// "os_version" in it contains "ProductBuildVersion" of /System/Library/Quennel/SystemVersion.plist.
bool check_panic_version(std::string_view path);

#endif
