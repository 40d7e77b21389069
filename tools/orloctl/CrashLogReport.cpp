#include "tools/orloctl/CrashLogReport.h"

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <functional>
#include <map>
#include <optional>
#include <set>
#include <string_view>
#include <system_error>
#include <utility>

#include <fcntl.h>

#include "Daemon/CrashLogs.h"
#include "platform/DeviceRoot.h"
#include "platform/Utf8.h"
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

    // Copies a log, of which `entry` tells: "copy" is then the path of the copy, or "note" says why there is none.
    void copy(ordered_json& entry, const CrashLog& log) {
        const std::string path = utf8::repaired(log.path);
        const std::string name = unusedName(path.substr(path.rfind('/') + 1));
        const std::string problem = replaceFile(
            directory_, name, [&log](const NewFile& file) { return file.fillFrom(log.file); }, names_.size() == 1);
        if (problem.empty())
            entry["copy"] = (path_ / name).string();
        else
            entry["note"] = "not copied to " + (path_ / name).string() + ": " + problem;
    }

private:
    std::string unusedName(std::string_view name) {
        std::string unused = copyName("", name);
        for (int& number = copies_[unused]; !names_.insert(unused).second;)
            unused = copyName(std::to_string(++number + 1) + "-", name);
        return unused;
    }

    const std::filesystem::path path_;
    FileDescriptor directory_;
    std::set<std::string> names_;
    std::map<std::string, int> copies_; // how many more logs had the name
};

std::string dateOf(const CrashLog& log) {
    std::tm utc = {};
    char text[64] = "";
    if (::gmtime_r(&log.status.st_mtime, &utc))
        std::strftime(text, sizeof text, "%Y-%m-%dT%H:%M:%SZ", &utc);
    return text;
}

} // namespace

Report collectCrashLogs(const std::string& copyDirectory) {
    if (!openDeviceRoot())
        throw UsageError("Cannot open the device root " + deviceRootPath() + ": " + std::strerror(errno));
    std::optional<CopyDirectory> copies;
    if (!copyDirectory.empty())
        copies.emplace(copyDirectory);
    std::multimap<std::pair<std::time_t, long>, ordered_json, std::greater<>> found; // by time, newest first
    ordered_json missed = ordered_json::array();
    visitCrashLogs({[&](const CrashLog& log) {
                        ordered_json entry{{"name", utf8::repaired(log.path)},
                                           {"date", dateOf(log)},
                                           {"size", log.status.st_size},
                                           {"panic", log.isPanic}};
                        if (copies)
                            copies->copy(entry, log);
                        found.emplace(std::pair(log.status.st_mtim.tv_sec, log.status.st_mtim.tv_nsec), entry);
                    },
                    [&](std::string_view path, std::string_view reason) {
                        missed.push_back({{"name", utf8::repaired(path)}, {"note", reason}});
                    }});
    ordered_json logs = ordered_json::array();
    for (auto& [time, entry] : found)
        logs.push_back(std::move(entry));
    Report report;
    if (!missed.empty())
        report.fail("Not everything could be looked at", Outcome::Usage);
    if (copies && !std::ranges::all_of(logs, [](const ordered_json& log) { return log.contains("copy"); }))
        report.fail("Not all logs were copied to " + copyDirectory, Outcome::Usage);
    report.json = {{"status", logs.empty() ? 45 : 0}, {"logs", std::move(logs)}};
    if (!missed.empty())
        report.json["missed"] = std::move(missed);
    return report;
}
