#include "Daemon/CrashLogs.h"

#include <algorithm>
#include <limits>
#include <new>
#include <optional>
#include <string>
#include <utility>

#include "Daemon/Conversions.h"
#include "Daemon/HSLog.h"
#include "platform/Files.h"
#include "platform/Utf8.h"
#include "platform/linux/system/Json.h"
#include "platform/linux/system/PropertyList.h"

namespace {

constexpr LogSource crashLog{"HSLog"};

constexpr std::string_view directories[] = {"/private/var/logs", "/private/var/mobile/Library/Logs/Varrow/"};
constexpr std::string_view suffixes[] = {".ips", ".log"};
constexpr std::string_view panicPrefix = "panic";
constexpr std::string_view systemVersionPath = "/System/Library/Quennel/SystemVersion.plist";

constexpr int collected = 0;
constexpr int directoryProblem = 43;
constexpr int noneCollected = 45;

// A log has no size that would be too large, so only memory bounds what is read.
constexpr std::size_t anySize = std::numeric_limits<std::ptrdiff_t>::max() - 1;

std::string joined(std::string_view directory, std::string_view name) {
    std::string path(directory);
    if (!path.ends_with('/'))
        path += '/';
    return path.append(name);
}

// File names come from whatever wrote the logs, and none of them is to begin a line of its own in ours.
std::string shown(std::string_view path) {
    std::string text;
    utf8::appendOnOneLine(text, path);
    return text;
}

bool hasLogSuffix(std::string_view path) {
    return std::ranges::any_of(suffixes, [path](std::string_view suffix) { return path.ends_with(suffix); });
}

// The log entry of one file, or nothing when it is left out.
Value entryOf(const std::string& path, std::string_view name) try {
    if (!hasLogSuffix(path)) {
        crashLog.info("Suffix Mismatch . Skipping file : %@", shown(path));
        return {};
    }
    Error error;
    const Value attributes = files::attributes(path, &error);
    if (attributes.isNothing()) {
        crashLog.info("Failed to retrieve attributes for %@: (%@)", shown(path), error);
        return {};
    }
    const Value size = isLXNumber(attributes["Size"]);
    if (size.isNothing()) {
        crashLog.info("Failed to retrieve size of %@.", shown(path));
        return {};
    }
    const bool isPanic = name.starts_with(panicPrefix);
    if (isPanic && !check_panic_version(path)) {
        crashLog.info("Panic Version and System Version does not match. Skipping");
        return {};
    }
    if (isPanic)
        crashLog.info("Panic Version and System Version matches. Sending to HOST");
    std::optional<Value::Data> contents = files::readWhole(path, anySize, &error);
    if (!contents) {
        crashLog.info("Failed to load %@: %@", shown(path), error);
        return {};
    }
    Value::Dictionary entry{
        {"isPanic", isPanic ? "YES" : "NO"}, {"LogFileName", utf8::repaired(path)}, {"LogFileSize", size}};
    entry["LogFileData"] = std::move(*contents); // in a list it would be copied
    return Value(std::move(entry));
} catch (const std::bad_alloc& failure) {
    crashLog.info("Failed to load %@: %@", shown(path), failure.what());
    return {};
}

void collect(std::string_view directory, Value::Array& entries) {
    for (const std::string& name : files::list(directory)) {
        const std::string path = joined(directory, name);
        crashLog.info("File Name: %@", shown(path));
        if (Value entry = entryOf(path, name); !entry.isNothing())
            entries.push_back(std::move(entry));
    }
}

// What is wrong with a log directory, or null.
const char* problemWith(std::string_view directory) {
    switch (files::kindOf(directory)) {
    case files::Kind::Nothing:
        return "Log directory not found";
    case files::Kind::Other:
        return "Log directory expected. but found file";
    case files::Kind::Directory:
        break;
    }
    return nullptr;
}

Value systemVersionList() {
    const std::optional<Value::Data> contents = files::readWhole(systemVersionPath);
    return contents ? propertyListToValue(*contents).value_or(Value()) : Value();
}

} // namespace

int get_ramdisk_logs(Value* response) {
    Value::Array entries;
    for (const std::string_view directory : directories) {
        if (const char* problem = problemWith(directory)) {
            const Value interim = Value::Dictionary{{"Status", directoryProblem}, {"Error", problem}};
            crashLog.info(" Response dict populated: %@", interim);
            continue;
        }
        collect(directory, entries);
    }
    const int status = entries.empty() ? noneCollected : collected;
    Value::Dictionary final{{"Status", status}, {"Error", ""}};
    if (!entries.empty())
        final["Data"] = std::move(entries);
    if (response)
        *response = std::move(final);
    crashLog.info(" Returning Status: %d", status);
    return status;
}

bool check_panic_version(std::string_view path) try {
    const std::optional<Value::Data> report = files::readWhole(path, anySize);
    const Value systemVersion = systemVersionList();
    const std::string* build = systemVersion["ProductBuildVersion"].text();
    if (!report || report->empty() || !build || build->empty()) // every text would contain an empty identifier
        return false;
    const std::string_view text(reinterpret_cast<const char*>(report->data()), report->size());
    if (std::ranges::any_of(text, [](char byte) { return static_cast<unsigned char>(byte) >= 0x80; }))
        return false; // no ASCII text
    const auto version = jsonTextMember(text.substr(0, text.find('\n')), "os_version");
    return version && version->find(*build) != std::string::npos;
} catch (const std::bad_alloc&) {
    return false; // as a report that cannot be read
}
