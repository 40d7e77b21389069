#include "Daemon/CrashLogs.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <limits>
#include <new>
#include <optional>
#include <utility>

#include <fcntl.h>
#include <unistd.h>

#include "Daemon/HSLog.h"
#include "platform/DeviceRoot.h"
#include "platform/Files.h"
#include "platform/Json.h"
#include "platform/PropertyList.h"
#include "platform/Utf8.h"

namespace {

constexpr LogSource crashLog{"HSLog"};

constexpr std::string_view directories[] = {"/private/var/logs", "/private/var/mobile/Library/Logs/Varrow/"};
constexpr std::string_view suffixes[] = {".ips", ".log"};
constexpr std::string_view panicPrefix = "panic";
constexpr std::string_view systemVersionPath = "/System/Library/Quennel/SystemVersion.plist";

constexpr int collected = 0;
constexpr int directoryProblem = 43;
constexpr int noneCollected = 45;

// A line that is longer is none that a system writes before its report.
constexpr std::size_t longestHeader = std::size_t{16} << 20;

// A log has no size that would be too large, so only memory bounds what is read.
constexpr std::size_t anySize = std::numeric_limits<std::ptrdiff_t>::max() - 1;

std::string joined(std::string_view directory, std::string_view name) {
    std::string path(directory);
    if (!path.ends_with('/'))
        path += '/';
    return path.append(name);
}

bool hasLogSuffix(std::string_view path) {
    return std::ranges::any_of(suffixes, [path](std::string_view suffix) { return path.ends_with(suffix); });
}

Error lastError() {
    return {"POSIXErrorDomain", errno, std::strerror(errno)};
}

Value systemVersionList() {
    const std::optional<Value::Data> contents = files::readWhole(systemVersionPath);
    return contents ? propertyListToValue(*contents).value_or(Value()) : Value();
}

// Where the bytes of the file go on after a hole at `position`, which may be as large as anyone likes; nothing when the
// hole goes on to the end. The file is at its start afterwards.
std::optional<off_t> afterHole(const FileDescriptor& file, off_t position) {
    const off_t data = ::lseek(file.get(), position, SEEK_DATA);
    const bool isAtEnd = data < 0 && errno == ENXIO;
    ::lseek(file.get(), 0, SEEK_SET);
    return isAtEnd ? std::nullopt : std::optional(std::max(data, position));
}

// The first line of the file; or nothing, and `problem` says why, when it is no ASCII text, too long, or cannot be
// read. The file is gone through piece by piece, since it may be of any size, and is at its start afterwards.
std::optional<std::string> headerOf(const FileDescriptor& report, std::string& problem) {
    problem = "it is no ASCII text, or has no first line of a report";
    std::string header;
    bool isWhole = false;
    std::array<char, 65536> piece;
    for (off_t position = 0;;) {
        const ssize_t count = ::pread(report.get(), piece.data(), piece.size(), position);
        if (count < 0 && errno == EINTR)
            continue;
        if (count < 0) {
            problem = std::strerror(errno);
            return std::nullopt;
        }
        if (count == 0)
            return header;
        const std::string_view text(piece.data(), static_cast<std::size_t>(count));
        if (std::ranges::any_of(text, [](char byte) { return static_cast<unsigned char>(byte) >= 0x80; }))
            return std::nullopt;
        if (!isWhole) {
            const std::size_t end = text.find('\n');
            isWhole = end != std::string_view::npos;
            header += text.substr(0, end);
            if (header.size() > longestHeader || header.find('\0') != std::string::npos)
                return std::nullopt;
        }
        position += count;
        if (!isWhole)
            continue;
        const std::optional<off_t> next = afterHole(report, position);
        if (!next)
            return header;
        position = *next;
    }
}

// Whether the build that is running wrote the report. False, and `problem` says why, when that cannot be told.
bool isOfRunningBuild(const FileDescriptor& report, std::string& problem) {
    const Value systemVersion = systemVersionList();
    const std::string* build = systemVersion["ProductBuildVersion"].text();
    if (!build || build->empty()) { // every text would contain an empty identifier
        problem = "no build identifier can be read from " + std::string(systemVersionPath);
        return false;
    }
    const auto header = headerOf(report, problem);
    if (!header)
        return false;
    problem.clear();
    const auto version = jsonTextMember(*header, "os_version");
    return version && version->find(*build) != std::string::npos;
}

// Names come from whatever wrote the logs, and none of them is to begin a line of its own in ours.
void visitEntry(const FileDescriptor& directory, const std::string& path, const std::string& name,
                const CrashLogVisitor& visitor) try {
    crashLog.info("File Name: %@", utf8::escaped(path));
    if (!hasLogSuffix(path)) {
        crashLog.info("Suffix Mismatch . Skipping file : %@", utf8::escaped(path));
        return;
    }
    CrashLog log{path, name.starts_with(panicPrefix), {}, {}};
    if (::fstatat(directory.get(), name.c_str(), &log.status, AT_SYMLINK_NOFOLLOW) != 0) {
        const Error error = lastError();
        crashLog.info("Failed to retrieve attributes for %@: (%@)", utf8::escaped(path), error);
        visitor.missed(path, error.text);
        return;
    }
    errno = EISDIR;
    if (!S_ISDIR(log.status.st_mode))
        log.file = openInRoot(path, O_RDONLY, Links::Refused);
    const Error error = lastError();
    if (!log.file)
        visitor.missed(path, S_ISREG(log.status.st_mode) ? error.text : "it is no regular file");
    std::string problem;
    if (log.isPanic && !(log.file && isOfRunningBuild(log.file, problem))) {
        if (!problem.empty())
            visitor.missed(path, problem);
        crashLog.info("Panic Version and System Version does not match. Skipping");
        return;
    }
    if (log.isPanic)
        crashLog.info("Panic Version and System Version matches. Sending to HOST");
    if (log.file)
        visitor.found(log);
    else
        crashLog.info("Failed to load %@: %@", utf8::escaped(path), error);
} catch (const std::bad_alloc& failure) {
    crashLog.info("Failed to load %@: %@", utf8::escaped(path), failure.what());
    visitor.missed(path, failure.what());
}

void visitDirectory(std::string_view path, const CrashLogVisitor& visitor) {
    const FileDescriptor directory = openInRoot(path, O_PATH, Links::Refused);
    struct stat status = {};
    const bool isThere = directory ? ::fstat(directory.get(), &status) == 0 : errno == ELOOP;
    if (!isThere && errno != ENOENT)
        visitor.missed(path, std::strerror(errno));
    if (isThere && !S_ISDIR(status.st_mode))
        visitor.missed(path, "it is no directory, or a link leads there");
    if (!S_ISDIR(status.st_mode)) {
        const char* problem = isThere ? "Log directory expected. but found file" : "Log directory not found";
        const Value interim = Value::Dictionary{{"Status", directoryProblem}, {"Error", problem}};
        crashLog.info(" Response dict populated: %@", interim);
        return;
    }
    const std::optional<std::vector<std::string>> names = namesIn(directory);
    if (!names)
        visitor.missed(path, std::strerror(errno));
    for (const std::string& name : names.value_or(std::vector<std::string>()))
        visitEntry(directory, joined(path, name), name, visitor);
}

} // namespace

void visitCrashLogs(const CrashLogVisitor& visitor) {
    for (const std::string_view directory : directories)
        visitDirectory(directory, visitor);
}

int get_ramdisk_logs(Value* response) {
    Value::Array entries;
    const auto load = [&entries](const CrashLog& log) {
        std::optional<Value::Data> contents = readRegularFile(log.file, anySize);
        if (!contents) {
            crashLog.info("Failed to load %@: %@", utf8::escaped(log.path), lastError());
            return;
        }
        Value::Dictionary entry{{"isPanic", log.isPanic ? "YES" : "NO"},
                                {"LogFileName", utf8::repaired(log.path)},
                                {"LogFileSize", std::int64_t{log.status.st_size}}};
        entry["LogFileData"] = std::move(*contents); // in a list it would be copied
        entries.emplace_back(std::move(entry));
    };
    visitCrashLogs({load, [](std::string_view, std::string_view) {}});
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
    const FileDescriptor report = openInRoot(path, O_RDONLY, Links::Refused);
    std::string problem;
    return report && isOfRunningBuild(report, problem);
} catch (const std::bad_alloc&) {
    return false; // as a report that cannot be read
}
