#include "platform/SystemLog.h"

#include <atomic>
#include <cstddef>
#include <deque>
#include <exception>
#include <mutex>
#include <string>

#include <sys/uio.h>
#include <syslog.h>
#include <unistd.h>

#define SD_JOURNAL_SUPPRESS_LOCATION
#include <systemd/sd-journal.h>

#include "platform/Utf8.h"

// The fields that tell whose message it is, ready for the journal.
class SystemLog {
public:
    SystemLog(std::string_view subsystem, std::string_view category)
        : identifierField("SYSLOG_IDENTIFIER=" + std::string(subsystem)),
          categoryField("VELTRA_CATEGORY=" + std::string(category)) {}

    const std::string identifierField;
    const std::string categoryField;
};

namespace {

constexpr int priorities[] = {LOG_NOTICE, LOG_INFO, LOG_DEBUG, LOG_ERR}; // of the types, in their order

std::atomic<SystemLogWatcher> watcher = nullptr;

iovec field(const std::string& text) {
    return {const_cast<char*>(text.data()), text.size()};
}

} // namespace

SystemLog* systemLogCreate(std::string_view subsystem, std::string_view category) try {
    static std::mutex mutex;
    static auto* const logs = new std::deque<SystemLog>; // never destroyed: threads may log until the process is gone
    const std::lock_guard lock(mutex);
    return &logs->emplace_back(subsystem, category);
} catch (const std::exception&) {
    return nullptr;
}

SystemLog* systemLogDefault() {
    static SystemLog* const log = new SystemLog("VeltraOrloServices", "default");
    return log;
}

bool systemLogTypeEnabled(const SystemLog* log, SystemLogType) {
    return log != nullptr; // the journal keeps every priority and is filtered when it is read
}

void systemLogWrite(SystemLog* log, SystemLogType type, std::string_view message) try {
    if (!log)
        return;
    if (const SystemLogWatcher watch = watcher)
        watch(log, type, message);
    if (message.ends_with('\n'))
        message.remove_suffix(1); // an entry of the journal is a line already
    const std::string text = "MESSAGE=" + std::string(message);
    const std::string level = "PRIORITY=" + std::to_string(priorities[static_cast<std::size_t>(type)]);
    const iovec fields[] = {field(text), field(level), field(log->identifierField), field(log->categoryField)};
    sd_journal_sendv(fields, static_cast<int>(std::size(fields))); // without a journal this does nothing
} catch (const std::exception&) {
    return; // a line that memory does not suffice for is lost
}

void systemLogWatch(SystemLogWatcher newWatcher) {
    watcher = newWatcher;
}

void consoleLog(std::string_view line) try {
    const std::string text = utf8::escaped(line) + '\n';
    static_cast<void>(TEMP_FAILURE_RETRY(::write(STDERR_FILENO, text.data(), text.size())));
} catch (const std::exception&) {
    return;
}
