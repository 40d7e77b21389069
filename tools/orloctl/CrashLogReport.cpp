#include "tools/orloctl/CrashLogReport.h"

#include <algorithm>
#include <filesystem>
#include <set>
#include <sstream>
#include <string_view>
#include <system_error>

#include "Daemon/CrashLogs.h"
#include "platform/Utf8.h"
#include "tools/orloctl/LocalFiles.h"

namespace {

using nlohmann::ordered_json;

// Copies logs into one directory, under names that do not collide.
class CopyDirectory {
public:
    explicit CopyDirectory(const std::string& path) : path_(path) {
        std::error_code problem;
        std::filesystem::create_directories(path_, problem);
        if (problem)
            throw UsageError("Cannot make the directory " + path + ": " + problem.message());
    }

    // The path of the copy.
    std::string copy(const std::string& logPath, const Value::Data& contents) {
        const std::string name = logPath.substr(logPath.rfind('/') + 1);
        std::string unused = name;
        for (int number = 2; !names_.insert(unused).second; ++number)
            unused = std::to_string(number) + "-" + name;
        std::string target = path_ / unused;
        writeLocalFile(target, contents);
        return target;
    }

private:
    const std::filesystem::path path_;
    std::set<std::string> names_;
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
                log["copy"] = copies->copy(name, *entry["LogFileData"].data());
            logs.push_back(std::move(log));
        }
    }
    Report report;
    report.text = table(logs);
    if (copies && !logs.empty())
        report.text += std::to_string(logs.size()) + " copied to " + copyDirectory + "\n";
    report.json = {{"status", status}, {"logs", std::move(logs)}};
    return report;
}
