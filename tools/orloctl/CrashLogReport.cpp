#include "tools/orloctl/CrashLogReport.h"

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstring>
#include <filesystem>
#include <map>
#include <set>
#include <sstream>
#include <string_view>
#include <system_error>

#include <fcntl.h>
#include <sys/stat.h>

#include "Daemon/CrashLogs.h"
#include "platform/Utf8.h"
#include "platform/linux/system/FileDescriptor.h"
#include "platform/linux/system/NewFile.h"
#include "tools/orloctl/Arguments.h"
#include "tools/orloctl/LocalFiles.h"

namespace {

using nlohmann::ordered_json;

constexpr std::size_t longestName = NAME_MAX;

// `prefix` and the log's own name. A name that got too long loses characters before its suffix, ".ips" or ".log".
std::string copyName(const std::string& prefix, std::string_view name) {
    const std::size_t suffix = std::min(name.size(), name.rfind('.'));
    const std::string_view ending = name.substr(suffix);
    return prefix + std::string(utf8::beginning(name.substr(0, suffix), longestName - prefix.size() - ending.size())) +
           std::string(ending);
}

// Copies logs into one directory, under names that do not collide.
class CopyDirectory {
public:
    explicit CopyDirectory(const std::string& path) : path_(path) {
        std::error_code problem;
        std::filesystem::create_directories(path_, problem);
        if (problem)
            throw UsageError("Cannot make the directory " + path + ": " + problem.message());
        directory_ = FileDescriptor(::open(path_.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
        if (!directory_)
            throw UsageError("Cannot open the directory " + path + ": " + std::strerror(errno));
    }

    // Copies a log, of which `log` tells: "copy" is then the path of the copy, or "note" says why there is none.
    void copy(ordered_json& log, std::string_view logPath, const Value::Data& contents) {
        const std::string name = unusedName(logPath.substr(logPath.rfind('/') + 1));
        if (const std::string problem = write(name, contents); problem.empty())
            log["copy"] = (path_ / name).string();
        else
            log["note"] = "not copied to " + (path_ / name).string() + ": " + problem;
    }

private:
    std::string unusedName(std::string_view name) {
        std::string unused = copyName("", name);
        for (int& number = copies_[unused]; !names_.insert(unused).second;)
            unused = copyName(std::to_string(++number + 1) + "-", name);
        return unused;
    }

    // A regular file that is there is replaced, anything else stays as it is. The reason of a failure, or an empty
    // text.
    std::string write(const std::string& name, const Value::Data& contents) const {
        struct stat status;
        if (::fstatat(directory_.get(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 && !S_ISREG(status.st_mode))
            return "what stands there is no file";
        NewFile file(directory_);
        return file && file.fill(contents) && file.replace(name) ? "" : std::strerror(errno);
    }

    const std::filesystem::path path_;
    FileDescriptor directory_;
    std::set<std::string> names_;
    std::map<std::string, int> copies_; // how many more logs had the name
};

std::string onOneLine(const std::string& text) {
    std::string line;
    utf8::appendOnOneLine(line, text);
    return line;
}

std::string table(const ordered_json& logs) {
    if (logs.empty())
        return "The device keeps no crash logs.\n";
    std::size_t width = 4;
    for (const ordered_json& log : logs)
        width = std::max(width, onOneLine(log["name"]).size());
    std::ostringstream text;
    const auto row = [&](const std::string& name, const std::string& size, const std::string& panic) {
        text << name << std::string(width - name.size() + 2, ' ');
        text << std::string(12 - std::min<std::size_t>(12, size.size()), ' ') << size << "  " << panic << '\n';
    };
    row("NAME", "SIZE", "PANIC");
    for (const ordered_json& log : logs)
        row(onOneLine(log["name"]), std::to_string(log["size"].get<std::int64_t>()), log["panic"] ? "yes" : "no");
    for (const ordered_json& log : logs)
        if (log.contains("note"))
            text << onOneLine(log["name"]) << ": " << onOneLine(log["note"]) << '\n';
    return text.str();
}

} // namespace

Report collectCrashLogs(const std::string& copyDirectory) {
    Value response;
    const int status = get_ramdisk_logs(&response);
    std::optional<CopyDirectory> copies;
    if (!copyDirectory.empty())
        copies.emplace(copyDirectory);
    ordered_json logs = ordered_json::array();
    if (const Value::Array* entries = response["Data"].array()) {
        for (const Value& entry : *entries) {
            const std::string& name = *entry["LogFileName"].text();
            ordered_json log{{"name", name},
                             {"size", *entry["LogFileSize"].integer()},
                             {"panic", *entry["isPanic"].text() == "YES"}};
            if (copies)
                copies->copy(log, name, *entry["LogFileData"].data());
            logs.push_back(std::move(log));
        }
    }
    Report report;
    report.text = table(logs);
    if (copies && !logs.empty()) {
        const auto copied = std::ranges::count_if(logs, [](const ordered_json& log) { return log.contains("copy"); });
        report.ok = static_cast<std::size_t>(copied) == logs.size();
        report.text += std::to_string(copied) + " copied to " + copyDirectory + "\n";
        if (!report.ok)
            report.problem = "Not all logs were copied to " + copyDirectory;
    }
    report.json = {{"status", status}, {"logs", std::move(logs)}};
    return report;
}
