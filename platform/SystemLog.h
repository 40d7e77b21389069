// The system log and the system console log.
#ifndef VELTRA_PLATFORM_SYSTEM_LOG_H
#define VELTRA_PLATFORM_SYSTEM_LOG_H

#include <string_view>

enum class SystemLogType {
    Default,
    Info,
    Debug,
    Error,
};

// A handle of the system log. Handles live until the process ends.
class SystemLog;

// A handle for `subsystem` and `category`, or null when none can be made.
SystemLog* systemLogCreate(std::string_view subsystem, std::string_view category);

// The handle that always exists and belongs to no subsystem.
SystemLog* systemLogDefault();

// Whether a message of `type` written to `log` would reach a reader. False for a null handle.
bool systemLogTypeEnabled(const SystemLog* log, SystemLogType type);

// Writes one message. Never fails outward; may be called from any thread.
void systemLogWrite(SystemLog* log, SystemLogType type, std::string_view message);

// Has `watcher` see each message that is written from here on, just before, on the thread that writes it.
using SystemLogWatcher = void (*)(const SystemLog* log, SystemLogType type, std::string_view message) noexcept;
void systemLogWatch(SystemLogWatcher watcher);

// Writes one line to the system console log (standard error, which the service manager keeps).
void consoleLog(std::string_view line);

#endif
