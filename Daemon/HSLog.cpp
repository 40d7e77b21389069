#include "Daemon/HSLog.h"

#include <atomic>
#include <exception>
#include <mutex>
#include <optional>
#include <string>

#include "platform/Files.h"
#include "platform/SystemLog.h"

namespace {

constexpr char defaultSubsystem[] = "com.tevari.veltrad";
constexpr char category[] = "device";

struct LogState {
    std::optional<std::string> logFileName; // the name given to logInit; without one there is no log file
    SystemLog* connObj = nullptr;
};

// Null until logInit has run. Never released, since any thread may log until the process is gone.
std::atomic<const LogState*> logInitialized = nullptr;

void initialize(const char* name) {
    auto* const state = new LogState;
    if (name)
        state->logFileName = name;
    state->connObj = systemLogCreate(name ? name : defaultSubsystem, category);
    if (!state->connObj && systemLogTypeEnabled(systemLogDefault(), SystemLogType::Error))
        systemLogWrite(systemLogDefault(), SystemLogType::Error, "Couldn't create tlog_t");
    logInitialized = state;
}

void writeLine(const LogState& state, int level, const std::string& line) {
    if (level >= LogLevelDefault && level <= LogLevelError) {
        const auto type = static_cast<SystemLogType>(level - LogLevelDefault); // in the same order
        if (systemLogTypeEnabled(state.connObj, type))
            systemLogWrite(state.connObj, type, line);
    }
    if (state.logFileName)
        files::append(format("/private/var/log/%@.log", *state.logFileName), line);
}

} // namespace

std::string logTimestamp(std::time_t time) {
    std::tm local = {};
    char text[64];
    ::tzset(); // which localtime_r need not do, so that a change of the time zone shows at once
    if (!::localtime_r(&time, &local) || std::strftime(text, sizeof text, "%Y-%m-%d %I:%M:%S", &local) == 0)
        return {};
    return text;
}

void logInit(const char* name) {
    static std::once_flag once;
    std::call_once(once, initialize, name);
}

void newLog(int level, std::string_view text, std::initializer_list<FormatArgument> arguments) try {
    const LogState* const state = logInitialized;
    if (!state)
        return;
    writeLine(*state, level, logTimestamp(std::time(nullptr)) + "-" + formatForLog(text, arguments));
} catch (const std::exception&) {
    return; // a line that memory does not suffice for is lost; the work it tells of goes on
}

void consoleLine(std::string_view text, std::initializer_list<FormatArgument> arguments) try {
    consoleLog(formatForLog(text, arguments));
} catch (const std::exception&) {
    return; // as above
}

void LogSource::write(LogLevel level, LineFormat line, std::initializer_list<FormatArgument> arguments) const try {
    newLog(level, "[%@:%d] %@\n", {file, line.line, formatForLog(line.text, arguments).c_str()});
} catch (const std::exception&) {
    return; // as above
}
