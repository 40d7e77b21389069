#include "tests/support/RecordedLog.h"

#include <mutex>
#include <string_view>
#include <utility>

#include "Daemon/HSLog.h"
#include "platform/SystemLog.h"

class SystemLog {};

namespace {

SystemLog pluginLog, frameworkLog, defaultLog;
std::mutex mutex;
std::vector<std::string> lines;
std::vector<std::string> consoleLines;

// "<time>-[<file>:<number>] <message>\n" as "[<file>] <message>".
std::string withoutTimeAndNumber(std::string_view line) {
    line.remove_prefix(line.find('['));
    line.remove_suffix(1);
    const std::size_t number = line.find(':');
    return std::string(line.substr(0, number)) + std::string(line.substr(line.find(']', number)));
}

} // namespace

SystemLog* systemLogCreate(std::string_view, std::string_view category) {
    return category == "framework" ? &frameworkLog : &pluginLog;
}

SystemLog* systemLogDefault() {
    return &defaultLog;
}

bool systemLogTypeEnabled(const SystemLog*, SystemLogType) {
    return true;
}

void systemLogWrite(SystemLog* log, SystemLogType type, std::string_view message) {
    const std::string level = std::to_string(static_cast<int>(type) + 1) + " ";
    const std::string handle = log == &frameworkLog || log == &pluginLog ? "" : "to no handle of ours: ";
    const std::lock_guard lock(mutex);
    lines.push_back(level + handle + (log == &pluginLog ? withoutTimeAndNumber(message) : std::string(message)));
}

// "<operation>:<number> - <message>" loses its number; every other line stays as it is.
void consoleLog(std::string_view line) {
    const std::size_t end = line.find(" - ");
    const std::size_t number = line.substr(0, end).rfind(':');
    std::string kept(line);
    if (end != std::string_view::npos && number != std::string_view::npos)
        kept.erase(number, end - number);
    const std::lock_guard lock(mutex);
    consoleLines.push_back(std::move(kept));
}

void recordLog() {
    logInit(nullptr);
    const std::lock_guard lock(mutex);
    lines.clear();
    consoleLines.clear();
}

std::vector<std::string> recordedConsole() {
    const std::lock_guard lock(mutex);
    return consoleLines;
}

std::vector<std::string> recordedLog() {
    const std::lock_guard lock(mutex);
    return lines;
}
