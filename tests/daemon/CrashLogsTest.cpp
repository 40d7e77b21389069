#include "Daemon/CrashLogs.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <string>
#include <vector>

#include <sys/stat.h>

#include <gtest/gtest.h>

#include "tests/support/OwnProcess.h"
#include "tests/support/RecordedLog.h"
#include "tests/support/TemporaryRoot.h"

namespace {

namespace fs = std::filesystem;

using Lines = std::vector<std::string>;

const std::string logs = "/private/var/logs/", varrow = "/private/var/mobile/Library/Logs/Varrow/";

class CrashLogs : public testing::Test {
protected:
    CrashLogs() { recordLog(); }

    void runningBuild(const std::string& build) const {
        root_.write("/System/Library/Quennel/SystemVersion.plist",
                    "<plist version=\"1.0\"><dict><key>ProductName</key><string>Q</string>"
                    "<key>ProductBuildVersion</key><string>" +
                        build + "</string></dict></plist>");
    }

    // The collected files, "<name> <isPanic> <size>: <contents>", sorted.
    Lines collect() {
        recordLog();
        const int status = get_ramdisk_logs(&response_);
        EXPECT_EQ(response_["Status"], Value(status));
        EXPECT_EQ(response_["Error"], Value(""));
        EXPECT_EQ(status == 0, response_["Data"].array() != nullptr);
        Lines entries;
        if (const Value::Array* data = response_["Data"].array())
            for (const Value& entry : *data) {
                const Value::Data& contents = *entry["LogFileData"].data();
                entries.push_back(*entry["LogFileName"].text() + " " + *entry["isPanic"].text() + " " +
                                  std::to_string(*entry["LogFileSize"].integer()) + ": " +
                                  std::string(contents.begin(),
                                              contents.begin() + std::min<std::ptrdiff_t>(std::ssize(contents), 40)));
            }
        std::ranges::sort(entries);
        return entries;
    }

    static Lines missed(void (*found)(const CrashLog&) = [](const CrashLog&) {}) {
        Lines paths;
        visitCrashLogs({found, [&](std::string_view path, std::string_view reason) {
                            EXPECT_FALSE(reason.empty());
                            paths.emplace_back(path);
                        }});
        return paths;
    }

    static bool logged(const std::string& beginning) {
        return std::ranges::any_of(recordedLog(),
                                   [&](const std::string& line) { return line.starts_with("2 [HSLog] " + beginning); });
    }

    TemporaryRoot root_;
    Value response_;
};

TEST_F(CrashLogs, directoriesThatAreMissingOrFilesShowInTheLogOnly) {
    EXPECT_EQ(get_ramdisk_logs(&response_), 45);
    EXPECT_EQ(response_, Value(Value::Dictionary{{"Status", 45}, {"Error", ""}}));
    const std::string interim = "2 [HSLog]  Response dict populated: {\"Error\": \"Log directory ";
    const std::string missing = interim + "not found\", \"Status\": 43}";
    EXPECT_EQ(recordedLog(), (Lines{missing, missing, "2 [HSLog]  Returning Status: 45"}));

    root_.write("/private/var/logs", "file");
    root_.write(varrow + "a.ips", "a");
    EXPECT_EQ(collect(), Lines{varrow + "a.ips NO 1: a"});
    EXPECT_EQ(recordedLog(), (Lines{interim + "expected. but found file\", \"Status\": 43}",
                                    "2 [HSLog] File Name: " + varrow + "a.ips", "2 [HSLog]  Returning Status: 0"}));
}

TEST_F(CrashLogs, filesAreChosenByTheEndOfTheirNamesAndDirectoriesInOrder) {
    for (const char* name : {"a.ips", "b.txt", "c.log", "d.LOG", "log", ".log", "e.log.gz"})
        root_.write(logs + name, name);
    root_.write(varrow + "f.log", "");
    root_.write(logs + "old.log/g.ips", "deeper");
    EXPECT_EQ(collect(), (Lines{logs + ".log NO 4: .log", logs + "a.ips NO 5: a.ips", logs + "c.log NO 5: c.log",
                                varrow + "f.log NO 0: "}));
    EXPECT_EQ(*response_["Data"].array()->back()["LogFileName"].text(), varrow + "f.log");
    EXPECT_TRUE(logged("Suffix Mismatch . Skipping file : " + logs + "b.txt"));
    EXPECT_TRUE(logged("Failed to load " + logs + "old.log: "));
}

TEST_F(CrashLogs, panicReportsAreCollectedWhenTheRunningBuildWroteThem) {
    const std::string good = R"json({"os_version": "Quennel 3.1 (21A55)", "x": [1.5, {"os_version": 7}]})json";
    const std::string nested(1'000'000, '['), closed(nested.size(), ']');
    const struct {
        const char* build; // null: no version list
        std::string report;
        bool collected;
        bool missed = false; // it cannot be told which build wrote it
    } rows[] = {
        {"21A55", good + "\nmore {\n", true},
        {"21A5", good + "\n", true},
        {"21A56", good + "\n", false},
        {nullptr, good + "\n", false, true},
        {"", good + "\n", false, true},
        {"21A55", "\n" + good, false},
        {"21A55", "\"os_version 21A55\"", false},
        {"21A55", R"({"os_version": 21})", false},
        {"21A55", R"({"inner": {"os_version": "21A55"}})", false},
        {"21A55", R"({"os_version": "21A55")", false},
        {"21A55", R"({"os_version": "21A55"} x)", false},
        {"21A55", good + "\n\xC3\xA9", false, true}, // no ASCII text
        {"21A55", good + '\0' + "\n", false, true},
        {"21A55", R"({"x": )" + nested, false},
        {"21A55", R"({"x": )" + nested + closed + R"(, "os_version": "21A55"})", true},
    };
    for (const auto& row : rows) {
        fs::remove_all(root_.host("/System"));
        if (row.build)
            runningBuild(row.build);
        root_.write(logs + "panic-full-1.ips", row.report);
        EXPECT_EQ(check_panic_version(logs + "panic-full-1.ips"), row.collected) << row.report.substr(0, 80);
        EXPECT_EQ(missed(), row.missed ? Lines{logs + "panic-full-1.ips"} : Lines{}) << row.report.substr(0, 80);
        const Lines entries = collect();
        EXPECT_EQ(entries.size(), row.collected ? 1U : 0U) << row.report.substr(0, 80);
        EXPECT_EQ(entries.empty() || entries[0].starts_with(logs + "panic-full-1.ips YES "), true);
        EXPECT_TRUE(logged(row.collected ? "Panic Version and System Version matches. Sending to HOST"
                                         : "Panic Version and System Version does not match. Skipping"));
    }
    EXPECT_FALSE(check_panic_version("/missing"));

    root_.write(logs + "hole.ips", good + "\n");
    fs::resize_file(root_.host(logs + "hole.ips"), std::size_t{1} << 42); // nobody would live to see it read
    std::ofstream(root_.host(logs + "hole.ips"), std::ios::app) << "x";
    EXPECT_TRUE(check_panic_version(logs + "hole.ips"));
}

TEST_F(CrashLogs, whatIsNoReadableFileNeitherHangsNorBreaksTheCollection) {
    root_.write(logs + "good.log", "good");
    root_.write(varrow + "target", "linked");
    ::mkfifo(root_.host(logs + "fifo.log").c_str(), 0600);
    ::mkfifo(root_.host(logs + "panic.log").c_str(), 0600);
    for (const auto& [name, target] : {std::pair<std::string, std::string>("out.log", "/etc/hostname"),
                                       {"dots.log", "../../../../../../../../etc/hostname"},
                                       {"in.log", varrow + "target"},
                                       {"loop.log", "loop.log"}})
        root_.link(logs + name, target);
    EXPECT_EQ(collect(), Lines{logs + "good.log NO 4: good"});
    for (const char* name : {"fifo.log", "out.log", "dots.log", "in.log", "loop.log"})
        EXPECT_TRUE(logged("Failed to load " + logs + name + ": ")) << name;
    EXPECT_TRUE(logged("Panic Version and System Version does not match. Skipping"));
    const Lines withoutMemory = missed([](const CrashLog&) { throw std::bad_alloc(); });
    EXPECT_EQ(std::ranges::count(withoutMemory, logs + "good.log"), 1);
}

// Users may write to the folders, and a link in place of one would lead to files that only the collector may read.
TEST_F(CrashLogs, noFolderOnTheWayIsALink) {
    runningBuild("1");
    root_.write("/secret/varrow/panic-1.ips", "{\"os_version\": \"1\"}");
    root_.link("/private/var/logs", "/secret/varrow");
    root_.link("/private/var/mobile/Library", "/secret");
    root_.link("/secret/Logs/Varrow", "/secret/varrow");
    EXPECT_EQ(collect(), Lines{});
    EXPECT_FALSE(check_panic_version(logs + "panic-1.ips"));
}

#ifdef VELTRA_MEMORY_CAN_BE_LIMITED
TEST_F(CrashLogs, aLogNeedsTheMemoryOfOneCopyAndShortageOnlyLeavesItOut) {
    constexpr std::size_t size = std::size_t{32} << 20;
    runningBuild("21A55");
    root_.write(logs + "panic-1.ips", "{\"os_version\": \"21A55\"}\n");
    fs::resize_file(root_.host(logs + "panic-1.ips"), size);
    root_.write(logs + "panic-2.ips", "{\"os_version\": \"21A55" + std::string(size, 'x') + "\"}");
    root_.write(varrow + "a.log", "after it");
    root_.write(logs + "large.log", "");
    fs::resize_file(root_.host(logs + "large.log"), std::size_t{1} << 42); // more than memory holds
    inOwnProcess([&] {
        limitMemory(size + size / 2);
        ASSERT_EQ(get_ramdisk_logs(&response_), 0);
        EXPECT_TRUE(logged("Failed to load " + logs + "large.log: "));
        EXPECT_EQ((*response_["Data"].array())[0]["LogFileData"].data()->size(), size);
        EXPECT_EQ((*response_["Data"].array())[1]["LogFileName"], Value(varrow + "a.log"));
    });
}
#endif

TEST_F(CrashLogs, aFileNameCannotForgeALineOfTheLogNorBreakTheResponse) {
    root_.write(logs + "a\n[HSLog:1] forged\xFF.log", "x");
    EXPECT_EQ(collect(), Lines{logs + "a\n[HSLog:1] forged\uFFFD.log NO 1: x"});
    EXPECT_TRUE(logged("File Name: " + logs + "a\\n[HSLog:1] forged\\xff.log"));
}

} // namespace
