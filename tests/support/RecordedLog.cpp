#include "tests/support/RecordedLog.h"

#include <mutex>
#include <string_view>

#include "Daemon/HSLog.h"
#include "platform/SystemLog.h"

class SystemLog {};

namespace {

SystemLog pluginLog, defaultLog;
std::mutex mutex;
std::vector<std::string> lines;

// "<time>-[<file>:<number>] <message>\n" as "[<file>] <message>".
std::string withoutTimeAndNumber(std::string_view line) {
    line.remove_prefix(line.find('['));
    line.remove_suffix(1);
    const std::size_t number = line.find(':');
    return std::string(line.substr(0, number)) + std::string(line.substr(line.find(']', number)));
}

} // namespace

SystemLog* systemLogCreate(std::string_view, std::string_view) {
    return &pluginLog;
}

SystemLog* systemLogDefault() {
    return &defaultLog;
}

bool systemLogTypeEnabled(const SystemLog*, SystemLogType) {
    return true;
}

void systemLogWrite(SystemLog* log, SystemLogType type, std::string_view message) {
    const std::string level = std::to_string(static_cast<int>(type) + 1);
    const std::lock_guard lock(mutex);
    lines.push_back(level + " " + (log == &pluginLog ? withoutTimeAndNumber(message) : std::string(message)));
}

void consoleLog(std::string_view) {}

void recordLog() {
    logInit(nullptr);
    const std::lock_guard lock(mutex);
    lines.clear();
}

std::vector<std::string> recordedLog() {
    const std::lock_guard lock(mutex);
    return lines;
}
