#include "Daemon/HSLog.h"

#include <cstdlib>
#include <sstream>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include <sys/stat.h>

#include <gtest/gtest.h>

#include "platform/SystemLog.h"
#include "tests/support/OwnProcess.h"
#include "tests/support/TemporaryRoot.h"

// The system log of these tests: writes down what reaches it, in place of the real one.
class SystemLog {
public:
    std::string handle;
};

namespace {

SystemLog created, standard{"default"};
bool creationFails = false, debugDisabled = false;
std::vector<std::string> systemLog; // "handle type message"

constexpr const char* typeNames[] = {"Default", "Info", "Debug", "Error"};
constexpr char path[] = "/private/var/log/test.log";

} // namespace

SystemLog* systemLogCreate(std::string_view subsystem, std::string_view category) {
    created.handle = std::string(subsystem) + "/" + std::string(category);
    return creationFails ? nullptr : &created;
}

SystemLog* systemLogDefault() {
    return &standard;
}

bool systemLogTypeEnabled(const SystemLog* log, SystemLogType type) {
    return log && !(debugDisabled && type == SystemLogType::Debug);
}

void systemLogWrite(SystemLog* log, SystemLogType type, std::string_view message) {
    systemLog.push_back(log->handle + " " + typeNames[static_cast<int>(type)] + " " + std::string(message));
}

void consoleLog(std::string_view) {}

namespace {

// The line without its timestamp, when it has one.
std::string withoutTimestamp(const std::string& line) {
    constexpr std::string_view shape = "dddd-dd-dd dd:dd:dd-";
    bool found = line.size() >= shape.size();
    for (std::size_t i = 0; found && i < shape.size(); ++i)
        found = shape[i] == 'd' ? line[i] >= '0' && line[i] <= '9' : line[i] == shape[i];
    return found ? line.substr(shape.size()) : "no timestamp: " + line;
}

TEST(HSLog, timestampsCarryTheLocalTimeOnATwelveHourClock) {
    ::setenv("TZ", "UTC-2", 1); // two hours ahead of UTC
    ::tzset();
    const struct {
        std::time_t time;
        const char* expected;
    } rows[] = {
        {1709640309, "2024-03-05 02:05:09"}, // 14:05:09
        {1709589600, "2024-03-05 12:00:00"}, // 00:00:00
        {1709632800, "2024-03-05 12:00:00"}, // 12:00:00
        {1704063599, "2024-01-01 12:59:59"}, // 00:59:59, still the old year in UTC
    };
    for (const auto& row : rows)
        EXPECT_EQ(logTimestamp(row.time), row.expected);
    ::unsetenv("TZ");
    ::tzset();
}

TEST(HSLog, beforeLogInitNothingIsWritten) {
    const TemporaryRoot root;
    root.makeDirectory("/private/var/log");
    inOwnProcess([&] {
        newLog(LogLevelError, "%@", {"line"});
        EXPECT_EQ(root.read(path), "(missing)");
        EXPECT_TRUE(systemLog.empty());
    });
}

TEST(HSLog, linesGoToTheSystemLogByLevelAndToTheFileAlways) {
    const TemporaryRoot root;
    root.makeDirectory("/private/var/log");
    inOwnProcess([&] {
        logInit("test");
        logInit("second"); // does nothing
        debugDisabled = true;
        std::string expectedFile;
        for (int level = -1; level <= 5; ++level) {
            newLog(level, "[%@:%d] %@\n", {"main", level, Value("Gerät")});
            expectedFile += "[main:" + std::to_string(level) + "] Gerät\n";
        }
        std::istringstream lines(root.read(path));
        std::string file;
        for (std::string line; std::getline(lines, line);)
            file += withoutTimestamp(line) + "\n";
        EXPECT_EQ(file, expectedFile);

        ASSERT_EQ(systemLog.size(), 3u);
        const char* const types[] = {"Default", "Info", "Error"};
        const int levels[] = {1, 2, 4};
        for (std::size_t i = 0; i < 3; ++i) {
            const std::string prefix = "test/device " + std::string(types[i]) + " ";
            ASSERT_EQ(systemLog[i].substr(0, prefix.size()), prefix);
            EXPECT_EQ(withoutTimestamp(systemLog[i].substr(prefix.size())),
                      "[main:" + std::to_string(levels[i]) + "] Gerät\n");
        }
        EXPECT_EQ(root.contents().size(), 4u); // the file and its three directories
    });
}

TEST(HSLog, withoutANameThereIsNoFile) {
    const TemporaryRoot root;
    root.makeDirectory("/private/var/log");
    inOwnProcess([&] {
        logInit(nullptr);
        newLog(LogLevelInfo, "line\n", {});
        EXPECT_EQ(root.contents().size(), 3u);
        ASSERT_EQ(systemLog.size(), 1u);
        EXPECT_EQ(systemLog[0].substr(0, 29), "com.tevari.veltrad/device Inf");
    });
}

TEST(HSLog, aHandleThatCannotBeMadeIsReportedOnceAndTheFileGoesOn) {
    const TemporaryRoot root;
    root.makeDirectory("/private/var/log");
    inOwnProcess([&] {
        creationFails = true;
        logInit("test");
        newLog(LogLevelError, "line\n", {});
        EXPECT_EQ(systemLog, std::vector<std::string>{"default Error Couldn't create tlog_t"});
        EXPECT_EQ(withoutTimestamp(root.read(path)), "line\n");
    });
}

TEST(HSLog, theFileMayGoAndBecomeAnythingWithoutHarm) {
    const TemporaryRoot root;
    root.makeDirectory("/private/var/log");
    inOwnProcess([&] {
        logInit("test");
        newLog(LogLevelInfo, "first\n", {});
        std::filesystem::remove(root.host(path));
        newLog(LogLevelInfo, "second\n", {});
        EXPECT_EQ(withoutTimestamp(root.read(path)), "second\n");

        std::filesystem::remove(root.host(path));
        root.write("/etc/passwd", "root");
        root.link(path, "/etc/passwd");
        newLog(LogLevelInfo, "third\n", {});
        EXPECT_EQ(root.read("/etc/passwd"), "root");

        std::filesystem::remove(root.host(path));
        ::mkfifo(root.host(path).c_str(), 0600);
        newLog(LogLevelInfo, "fourth\n", {});

        std::filesystem::remove_all(root.host("/private"));
        newLog(LogLevelInfo, "fifth\n", {});
        EXPECT_EQ(systemLog.size(), 5u);
    });
}

TEST(HSLog, linesOfDifferentThreadsStayWhole) {
    constexpr int threads = 4, lines = 200;
    const TemporaryRoot root;
    root.makeDirectory("/private/var/log");
    inOwnProcess([&] {
        std::vector<std::thread> writers;
        writers.reserve(threads);
        for (int writer = 0; writer < threads; ++writer) {
            writers.emplace_back([writer] {
                logInit("test");
                for (int line = 0; line < lines; ++line)
                    newLog(0, "%@\n", {std::string(5000, static_cast<char>('a' + writer))});
            });
        }
        for (std::thread& writer : writers)
            writer.join();
        std::istringstream file(root.read(path));
        int found = 0;
        for (std::string line; std::getline(file, line); ++found) {
            line = withoutTimestamp(line);
            EXPECT_TRUE(line == std::string(5000, line[0])) << line;
        }
        EXPECT_EQ(found, threads * lines);
    });
}

TEST(HSLog, aSourceNamesItsFileAndTheLineOfTheCall) {
    const TemporaryRoot root;
    root.makeDirectory("/private/var/log");
    inOwnProcess([&] {
        constexpr LogSource zplog{"ZPDevice"};
        logInit("test");
        zplog.info("%s is %d%%", "it", 7);
        const int line = __LINE__ - 1;
        EXPECT_EQ(withoutTimestamp(root.read(path)), "[ZPDevice:" + std::to_string(line) + "] it is 7%\n");
        zplog.error("100% of %@");
        EXPECT_NE(systemLog[0].find("Info"), std::string::npos);
        EXPECT_NE(systemLog[1].find("Error"), std::string::npos);
        EXPECT_TRUE(systemLog[1].ends_with("] 100% of (null)\n")) << systemLog[1];
    });
}

} // namespace
