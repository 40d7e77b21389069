#include "tests/support/RecordedLog.h"

#include <mutex>
#include <regex>
#include <string_view>

#include "Daemon/HSLog.h"
#include "platform/SystemLog.h"

class SystemLog {};

namespace {

SystemLog onlyLog;
std::mutex mutex;
std::vector<std::string> lines;

} // namespace

SystemLog* systemLogCreate(std::string_view, std::string_view) {
    return &onlyLog;
}

SystemLog* systemLogDefault() {
    return &onlyLog;
}

bool systemLogTypeEnabled(const SystemLog*, SystemLogType) {
    return true;
}

void systemLogWrite(SystemLog*, SystemLogType type, std::string_view message) {
    static const std::regex form("^[^\\[]*\\[(\\w+):\\d+\\] ([^]*)\n$");
    const std::string line = std::regex_replace(std::string(message), form, "[$1] $2");
    const std::lock_guard lock(mutex);
    lines.push_back(std::to_string(static_cast<int>(type) + 1) + " " + line);
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
