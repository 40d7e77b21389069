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
std::vector<std::string> lines; // of every destination, in order
std::size_t awaited = 0;
void (*whenAwaited)() = nullptr;

// "<time>-[<file>:<number>] <message>\n" as "[<file>] <message>".
std::string withoutTimeAndNumber(std::string_view line) {
    line.remove_prefix(line.find('['));
    line.remove_suffix(1);
    const std::size_t number = line.find(':');
    return std::string(line.substr(0, number)) + std::string(line.substr(line.find(']', number)));
}

void append(std::string line) {
    const std::lock_guard lock(mutex);
    lines.push_back(std::move(line));
    if (lines.size() == awaited)
        whenAwaited();
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
    append(level + handle + (log == &pluginLog ? withoutTimeAndNumber(message) : std::string(message)));
}

void systemLogWatch(SystemLogWatcher) {}

// "<operation>:<number> - <message>" loses its number; every other line stays as it is.
void consoleLog(std::string_view line) {
    const std::size_t end = line.find(" - ");
    const std::size_t number = line.substr(0, end).rfind(':');
    std::string kept(line);
    if (end != std::string_view::npos && number != std::string_view::npos)
        kept.erase(number, end - number);
    append("console: " + kept);
}

void recordLog() {
    logInit(nullptr);
    const std::lock_guard lock(mutex);
    lines.clear();
}

void whenRecorded(std::size_t count, void (*then)()) {
    const std::lock_guard lock(mutex);
    awaited = count;
    whenAwaited = then;
}

void recordCall(std::string_view call) {
    append("> " + std::string(call));
}

std::vector<std::string> recordedLines() {
    const std::lock_guard lock(mutex);
    return lines;
}

std::vector<std::string> recordedLog() {
    std::vector<std::string> log = recordedLines();
    std::erase_if(log, [](const std::string& line) { return line.starts_with("console: ") || line.starts_with("> "); });
    return log;
}
