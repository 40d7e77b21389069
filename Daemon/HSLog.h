// The plug-in's trace lines: each goes to the system log and, once logInit was given a name, to the log file
// /private/var/log/<name>.log. The file is opened and closed again for every line, so it may be rotated or removed at
// any time. All operations may be called from any thread; lines of different threads may stand in either order.
#ifndef VELTRA_DAEMON_HS_LOG_H
#define VELTRA_DAEMON_HS_LOG_H

#include <ctime>
#include <initializer_list>
#include <string>
#include <string_view>

#include "platform/Format.h"

enum LogLevel {
    LogLevelDefault = 1,
    LogLevelInfo = 2,
    LogLevelDebug = 3,
    LogLevelError = 4,
};

// Sets up logging under `name` (UTF-8, or null for a log without file). The first call in a process decides; later ones
// do nothing.
void logInit(const char* name);

// Formats the arguments for a log line (platform/Format.h) and writes it, prefixed with the local time (12-hour clock)
// and a hyphen. A level other than 1 to 4 goes to the log file only. Never fails outward: a line that memory does not
// suffice for is lost.
void newLog(int level, std::string_view text, std::initializer_list<FormatArgument> arguments);

// Formats the arguments for a log line and writes it to the system console log. Never fails outward, as newLog.
void consoleLine(std::string_view text, std::initializer_list<FormatArgument> arguments);

// The local time `time` as it stands in front of a line: "yyyy-MM-dd hh:mm:ss" on a 12-hour clock without a marker.
std::string logTimestamp(std::time_t time);

// A format and the line of the source file where it stands.
struct LineFormat {
    LineFormat(const char* words, int sourceLine = __builtin_LINE()) : text(words), line(sourceLine) {}
    const char* text;
    int line;
};

// Writes the lines of one source file, in the form "[file:line] message". A file that logs keeps one of these:
//     constexpr LogSource zplog{"ZPDevice"};
//     zplog.error("Failed to get the chip id");
struct LogSource {
    const char* file; // base name, without directory and extension

    template <class... Arguments>
    void info(LineFormat line, const Arguments&... arguments) const {
        write(LogLevelInfo, line, {FormatArgument(arguments)...});
    }
    template <class... Arguments>
    void error(LineFormat line, const Arguments&... arguments) const {
        write(LogLevelError, line, {FormatArgument(arguments)...});
    }

private:
    void write(LogLevel level, LineFormat line, std::initializer_list<FormatArgument> arguments) const;
};

#endif
