#include "Daemon/HSLog.h"

#include <algorithm>
#include <cstdlib>
#include <regex>
#include <sstream>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

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

// The line with a T in place of its timestamp.
std::string timed(const std::string& line) {
    static const std::regex timestamp(R"(\d{4}-\d\d-\d\d \d\d:\d\d:\d\d-)");
    return std::regex_replace(line, timestamp, "T-", std::regex_constants::format_first_only);
}

class HSLog : public testing::Test {
protected:
    HSLog() { root.makeDirectory("/private/var/log"); }

    // The log file's lines, timed.
    std::vector<std::string> fileLines() const {
        std::vector<std::string> lines;
        std::istringstream file(root.read(path));
        for (std::string line; std::getline(file, line);)
            lines.push_back(timed(line));
        return lines;
    }

    const TemporaryRoot root;
};

TEST(HSLogTimestamp, carriesTheLocalTimeOnATwelveHourClock) {
    ::setenv("TZ", "UTC0", 1);
    EXPECT_EQ(logTimestamp(0), "1970-01-01 12:00:00");
    ::setenv("TZ", "UTC-2", 1); // from now on two hours ahead of UTC
    const std::pair<std::time_t, const char*> rows[] = {
        {1709640309, "2024-03-05 02:05:09"}, // 14:05:09
        {1709589600, "2024-03-05 12:00:00"}, // 00:00:00
        {1704063599, "2024-01-01 12:59:59"}, // 00:59:59, still the old year in UTC
    };
    for (const auto& [time, expected] : rows)
        EXPECT_EQ(logTimestamp(time), expected);
    ::unsetenv("TZ");
    ::tzset();
}

TEST_F(HSLog, linesGoToTheSystemLogByLevelAndToTheFileAlwaysOnceTheLogHasBegun) {
    inOwnProcess([&] {
        newLog(LogLevelError, "too early", {});
        logInit("test");
        logInit("second"); // does nothing
        debugDisabled = true;
        std::vector<std::string> expectedFile, expectedLog;
        for (int level = -1; level <= 5; ++level) {
            newLog(level, "[%@:%d] %@\n", {"main", level, Value("Gerät")});
            expectedFile.push_back(format("T-[main:%d] Gerät", level));
        }
        EXPECT_EQ(fileLines(), expectedFile);
        EXPECT_EQ(root.contents().size(), 4u); // the file and its three directories

        for (const auto& [type, level] : {std::pair("Default", 1), std::pair("Info", 2), std::pair("Error", 4)})
            expectedLog.push_back(format("test/device %s T-[main:%d] Gerät\n", type, level));
        std::ranges::transform(systemLog, systemLog.begin(), timed);
        EXPECT_EQ(systemLog, expectedLog);
    });
}

TEST_F(HSLog, withoutANameThereIsNoFile) {
    inOwnProcess([&] {
        logInit(nullptr);
        newLog(LogLevelInfo, "line\n", {});
        EXPECT_EQ(root.contents().size(), 3u);
        EXPECT_EQ(timed(systemLog.at(0)), "com.tevari.veltrad/device Info T-line\n");
    });
}

TEST_F(HSLog, aHandleThatCannotBeMadeIsReportedOnceAndTheFileGoesOnWhateverBecomesOfIt) {
    inOwnProcess([&] {
        creationFails = true;
        logInit("test");
        newLog(LogLevelInfo, "first\n", {});
        std::filesystem::remove(root.host(path));
        newLog(LogLevelError, "second\n", {});
        EXPECT_EQ(fileLines(), std::vector<std::string>{"T-second"});
        std::filesystem::remove_all(root.host("/private"));
        newLog(LogLevelInfo, "third\n", {});
        EXPECT_EQ(systemLog, std::vector<std::string>{"default Error Couldn't create tlog_t"});
    });
}

TEST_F(HSLog, linesOfDifferentThreadsStayWhole) {
    constexpr std::size_t lines = 200;
    inOwnProcess([&] {
        std::vector<std::thread> writers;
        for (const char mark : {'a', 'b', 'c', 'd'})
            writers.emplace_back([mark] {
                logInit("test");
                for (std::size_t line = 0; line < lines; ++line)
                    newLog(0, "%@\n", {std::string(5000, mark)});
            });
        for (std::thread& writer : writers)
            writer.join();
        const std::vector<std::string> written = fileLines();
        for (const std::string& line : written)
            EXPECT_TRUE(line == "T-" + std::string(5000, line.back())) << line;
        EXPECT_EQ(written.size(), writers.size() * lines);
    });
}

TEST_F(HSLog, aSourceNamesItsFileAndTheLineOfTheCall) {
    inOwnProcess([&] {
        logInit("test");
        LogSource{"ZPDevice"}.info("%s is %d%%", "it", 7);
        EXPECT_EQ(fileLines(), std::vector{format("T-[ZPDevice:%d] it is 7%%", __LINE__ - 1)});
        LogSource{"ZPDevice"}.error("100% of %@");
        EXPECT_TRUE(systemLog.at(0).starts_with("test/device Info "));
        EXPECT_EQ(timed(systemLog.at(1)), format("test/device Error T-[ZPDevice:%d] 100%% of (null)\n", __LINE__ - 2));
    });
}

} // namespace
