#include "Daemon/Common/HSPipeUtil.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstddef>
#include <cstring>
#include <filesystem>
#include <regex>
#include <string>
#include <vector>

#include <fcntl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include "platform/Format.h"
#include "platform/Processes.h"
#include "tests/support/OwnProcess.h"
#include "tests/support/RecordedLog.h"
#include "tests/support/TemporaryRoot.h"

namespace {

namespace fs = std::filesystem;

using Lines = std::vector<std::string>;

constexpr const char* program = "/usr/bin/program";

Value::Data bytes(std::string_view text) {
    return {text.begin(), text.end()};
}

std::size_t openDescriptors() {
    return static_cast<std::size_t>(std::distance(fs::directory_iterator("/proc/self/fd"), {}));
}

// The message of the operating system's error number, as the log lines end with it.
std::string text(int number) {
    return std::string(std::strerror(number)) + "\n";
}

// The recorded lines of HSPipeUtil, with a star in place of what differs from run to run. Those of level 2 come without
// their beginning.
Lines log() {
    static const std::regex beginning(R"(^2 \[HSPipeUtil\] )"), number(R"((at line |program \()[0-9a-fx]+)");
    Lines lines;
    for (const std::string& line : recordedLog())
        lines.push_back(std::regex_replace(std::regex_replace(line, beginning, ""), number, "$1*"));
    return lines;
}

std::ptrdiff_t timesLogged(const std::string& line) {
    return std::ranges::count(log(), line);
}

class HSPipeUtilTest : public testing::Test {
protected:
    HSPipeUtilTest() : descriptors_(openDescriptors()) { recordLog(); }

    ~HSPipeUtilTest() override {
        EXPECT_EQ(openDescriptors(), descriptors_);
        EXPECT_EQ(::waitpid(-1, nullptr, WNOHANG), -1) << "a child was not reaped";
        EXPECT_EQ(errno, ECHILD);
    }

    void script(const std::string& lines, const char* interpreter = "/bin/sh") const {
        root_.write(program, std::string("#!") + interpreter + "\n" + lines);
        fs::permissions(root_.host(program), fs::perms::owner_all);
    }

    // A program of this machine as the device's.
    void binary(const char* path) const {
        root_.makeDirectory("/usr/bin");
        fs::copy_file(path, root_.host(program), fs::copy_options::overwrite_existing);
    }

    int run(const std::vector<std::string>& options = {}) {
        error_ = {};
        return HSPipeUtil::HSPipeUtilExecCommand(program, options, &response_, &error_);
    }

    int runWith(const Value::Data& data, const std::vector<std::string>& options = {}) {
        error_ = {};
        return HSPipeUtil::HSPipeUtilExecCommandWithData(program, options, data, &response_, &error_);
    }

    std::string output() const { return *response_["Output"].text(); }

    TemporaryRoot root_;
    Value response_;
    std::optional<Error> error_;

private:
    const std::size_t descriptors_;
};

TEST_F(HSPipeUtilTest, theOutcomeIsDescribedInTheResponseTheErrorAndTheLog) {
    const struct {
        std::string end;
        int result;
        std::string log;
        const char* interpreter = "/bin/sh";
    } rows[] = {
        {"echo out; echo err >&2; exit 0", 0, "exit status: 0\n"},
        {"echo out; echo err >&2; exit 255", 255, "exit status: 255\n"},
        {"echo out; echo err >&2; kill -KILL $$", -1, "/usr/bin/program was terminated by signal 9\n"},
        // PTRACE_TRACEME: only a traced child is reported as stopped.
        {"import ctypes, os, signal\nos.write(1, b'out\\n')\nos.write(2, b'err\\n')\nctypes.CDLL(None).ptrace(0, 0, 0, "
         "0)\n"
         "os.closerange(0, 3)\nos.kill(os.getpid(), signal.SIGSTOP)",
         -1, "/usr/bin/program was stopped by signal 19\n", "/usr/bin/python3"},
    };
    for (const auto& row : rows) {
        script(row.end, row.interpreter);
        for (const bool withInput : {false, true}) {
            SCOPED_TRACE(row.end);
            recordLog();
            const int code = row.result == 0 ? 0 : 7;
            EXPECT_EQ(withInput ? runWith(bytes("input"), {"-x", "y"}) : run({"-x"}), code);
            const std::string description = code == 0 ? ""
                                                      : format("Error executing command%s, result = %d\n",
                                                               withInput ? " with data" : "", row.result);
            const char* output = withInput ? "out\n" : "out\nerr\n";
            EXPECT_EQ(response_,
                      Value(Value::Dictionary{{"Status", code}, {"Output", output}, {"Error", description}}));
            EXPECT_EQ(error_, code == 0 ? std::nullopt : std::optional(Error{"HSErrorDomain", 7, description}));
        }
        // Of a call without input the transcripts have the lines.
        const std::string name = "+[HSPipeUtil HSPipeUtilExecCommandWithData:options:data:response:error:]";
        Lines lines = {"Enter " + name + " at line *\n",
                       "argv[0] = /usr/bin/program\n",
                       "argv[1] = -x\n",
                       "argv[2] = y\n",
                       "entering hs_execute_command_with_input_data: /usr/bin/program (* - 5)\n",
                       "executing /usr/bin/program\n",
                       "Start Reading output from shell command\n",
                       "waiting for child to exit\n",
                       "child exited\n",
                       row.log};
        if (error_)
            lines.insert(lines.end(), {error_->text, error_->description()});
        lines.push_back("Exit " + name + format(" at line *, success = %d\n", error_ ? 7 : 0));
        EXPECT_EQ(log(), lines);
    }
}

TEST_F(HSPipeUtilTest, aProgramThatCannotBeStartedIsAFailureWithoutOutput) {
    root_.write("/plain", "#!/bin/sh\n");
    root_.write("/noise", "no program");
    root_.write("/lost", "#!/nonexistent/interpreter\n");
    root_.makeDirectory("/directory");
    for (const char* path : {"/noise", "/lost"})
        fs::permissions(root_.host(path), fs::perms::owner_all);
    root_.link("/outside", fs::canonical("/bin/sh"));
    const std::pair<std::string, int> rows[] = {{"/missing", ENOENT}, {"", ENOENT},        {"/directory", EACCES},
                                                {"/plain", EACCES},   {"/noise", ENOEXEC}, {"/lost", ENOENT},
                                                {"/outside", ENOENT}};
    for (const auto& [path, number] : rows) {
        const std::string failed = "posix_spawn " + path + " failed: " + text(number);
        recordLog();
        EXPECT_EQ(hs_execute_command({path}, &response_, &error_), -1);
        EXPECT_EQ(timesLogged(failed), 1) << path;
        EXPECT_EQ(hs_execute_command_with_input_data({path}, "x", 1, &response_, nullptr), -1);
        EXPECT_EQ(timesLogged(failed), 2) << path;
        EXPECT_EQ(response_, Value(Value::Dictionary{{"Status", 7}, {"Output", ""}, {"Error", ""}}));
        EXPECT_EQ(error_->text, "Error executing command, result = -1\n");
    }
}

int unusedDescriptors() {
    std::vector<int> taken;
    for (int number = ::dup(0); number >= 0; number = ::dup(0))
        taken.push_back(number);
    for (const int number : taken)
        ::close(number);
    return static_cast<int>(taken.size());
}

void leaveDescriptors(int count) {
    const rlimit limit{64, 64};
    ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &limit), 0);
    for (int unused = unusedDescriptors(); unused > count; --unused)
        ::dup(0);
}

TEST_F(HSPipeUtilTest, withoutDescriptorsForThePipesNothingIsRunAndNoneStaysOpen) {
    script("exit 0");
    const std::string noPipe = "pipe failed while preparing to execute /usr/bin/program: ";
    const std::string noStart = "posix_spawn /usr/bin/program failed: ";
    const struct {
        bool withInput;
        int unused;
        const std::string& line;
    } rows[] = {{false, 1, noPipe}, {false, 2, noStart}, {true, 3, noPipe}, {true, 4, noStart}};
    for (const auto& row : rows) {
        inOwnProcess([&] {
            leaveDescriptors(row.unused);
            EXPECT_EQ(row.withInput ? runWith(bytes("in")) : run(), 7);
            EXPECT_EQ(output(), "");
            EXPECT_EQ(unusedDescriptors(), row.unused);
            ::close_range(48, 63, 0); // the sanitizer needs some for what comes
            EXPECT_EQ(timesLogged(row.line + text(EMFILE)), 1) << row.unused;
        });
    }
}

TEST_F(HSPipeUtilTest, aChildThatCannotBeWaitedForIsAFailureWithItsOutput) {
    script("echo out");
    inOwnProcess([&] {
        ASSERT_NE(std::signal(SIGCHLD, SIG_IGN), SIG_ERR); // the kernel then reaps the children itself
        for (const bool withInput : {false, true}) {
            recordLog();
            EXPECT_EQ(withInput ? runWith({}) : run(), 7);
            EXPECT_EQ(error_->text,
                      std::string("Error executing command") + (withInput ? " with data" : "") + ", result = -1\n");
            EXPECT_EQ(output(), "out\n");
            EXPECT_EQ(timesLogged("waitpid failed for /usr/bin/program: " + text(ECHILD)), 1);
            EXPECT_EQ(timesLogged("child exited\n"), 0);
        }
    });
}

#ifdef VELTRA_MEMORY_CAN_BE_LIMITED
TEST_F(HSPipeUtilTest, aChildThatWritesMoreThanMemoryHoldsDecidesByItsEnd) {
    script("exec yes");
    inOwnProcess([&] {
        limitMemory(std::size_t{32} << 20);
        EXPECT_EQ(run(), 7);
        EXPECT_EQ(timesLogged("/usr/bin/program was terminated by signal 13\n"), 1);
        EXPECT_GT(response_["Output"].text()->size(), std::size_t{4} << 20);
        EXPECT_EQ(response_["Output"].text()->substr(0, 4), "y\ny\n");

        EXPECT_EQ(runWith(Value::Data(1 << 20)), 7); // SIGPIPE is ignored, so the child sees that writing fails
        EXPECT_EQ(error_->text, "Error executing command with data, result = 1\n");
        EXPECT_EQ(response_["Output"].text()->substr(0, 4), "y\ny\n");
    });
}
#endif

TEST_F(HSPipeUtilTest, withoutAResponseNothingIsRun) {
    script("echo ran > \"$1\"");
    const std::string trace = root_.host("/trace");
    EXPECT_EQ(HSPipeUtil::HSPipeUtilExecCommand(program, {trace}, nullptr, &error_), 7);
    EXPECT_EQ(error_, (Error{"HSErrorDomain", 7, "Error executing command, result = -1\n"}));
    EXPECT_EQ(HSPipeUtil::HSPipeUtilExecCommandWithData(program, {trace}, {}, nullptr, &error_), 7);
    EXPECT_EQ(error_->text, "Error executing command with data, result = -1\n");
    EXPECT_EQ(timesLogged("4 [HSPipeUtil] Input response dictionary pointer is NULL."), 2);
    EXPECT_EQ(root_.read("/trace"), "(missing)");
}

// Keeps from programs what this process itself has inherited, as the pipe to the test that waits for it.
void keepOwnDescriptors() {
    ASSERT_EQ(::close_range(3, ~0U, CLOSE_RANGE_CLOEXEC), 0);
}

TEST_F(HSPipeUtilTest, theChildHasItsDevicePathForItsNameItsArgumentsAndNothingElseOfThisProcess) {
    binary("/usr/bin/env");
    EXPECT_EQ(run(), 0);
    EXPECT_EQ(output(), "");
    root_.link("/link", "/usr/bin/program");
    binary("/bin/cat");
    EXPECT_EQ(hs_execute_command({"/link", "/proc/self/cmdline"}, &response_, nullptr), 0);
    EXPECT_EQ(output(), "/link");
    script("printf '<%s>' \"$@\"; echo \"$0\"; grep SigBlk /proc/self/status; exec ls /proc/self/fd");
    inOwnProcess([&] {
        keepOwnDescriptors();
        sigset_t signals;
        sigemptyset(&signals);
        sigaddset(&signals, SIGTERM);
        ASSERT_EQ(::pthread_sigmask(SIG_BLOCK, &signals, nullptr), 0);
        const std::string expected = "<a b><><ü>" + fs::canonical(root_.host(program)).string() +
                                     "\nSigBlk:\t0000000000000000\n0\n1\n2\n3\n"; // 3 is the listing's own
        const std::vector<std::string> words = {"/link", "a b", "", "ü"};
        EXPECT_EQ(hs_execute_command(words, &response_, nullptr), 0);
        EXPECT_EQ(output(), expected);
        EXPECT_EQ(hs_execute_command_with_input_data(words, "x", 1, &response_, nullptr), 0);
        EXPECT_EQ(output(), expected);
    });
}

TEST_F(HSPipeUtilTest, aProcessThatTheChildLeavesBehindIsNotWaitedFor) {
    root_.makeDirectory("/");
    ASSERT_EQ(::mkfifo(root_.host("/end").c_str(), 0600), 0);
    const int end = ::open(root_.host("/end").c_str(), O_RDWR | O_CLOEXEC); // the one left behind lives until it closes
    // As on a kernel that has no descriptor for the ending of a child.
    script("read line < \"$1\"");
    pid_t child = 0;
    const FileDescriptor unread(hs_spawn_command({program, root_.host("/end")}, child, false, nullptr));
    EXPECT_FALSE(processes::waitUntilReady(end, -1, child, -1).hasEnded);
    EXPECT_EQ(::write(end, "\n", 1), 1);
    EXPECT_TRUE(processes::waitUntilReady(-1, -1, child, -1).hasEnded);
    EXPECT_EQ(processes::waitFor(child).kind, processes::Ending::Exited);

    const struct {
        const char* lines;
        std::size_t input;
        std::string output;
    } rows[] = {
        {"(read line < \"$1\"; echo late) & head -c 5000 /dev/zero | tr '\\0' x", 0, std::string(5000, 'x')},
        {"(read line < \"$1\"; echo late) & cat", 50000, std::string(50000, 'i')},
        {"exec 3<&0; read line < \"$1\" 3<&3 & printf out", 1 << 20, "out"},
        {"printf out; yes late >&2 & exit", 0, "out"},
    };
    for (const auto& row : rows) {
        script(row.lines);
        inOwnProcess([&] {
            keepOwnDescriptors();
            EXPECT_EQ(row.input == 0 ? run({root_.host("/end")})
                                     : runWith(Value::Data(row.input, 'i'), {root_.host("/end")}),
                      0);
            EXPECT_EQ(output().substr(0, row.output.size()), row.output) << row.lines;
        });
    }
    ::close(end);
}

TEST_F(HSPipeUtilTest, inputAndOutputOfAnySizePassAtTheSameTime) {
    constexpr std::size_t size = std::size_t{10} << 20;
    Value::Data data(size);
    for (std::size_t i = 0; i < size; ++i)
        data[i] = static_cast<std::uint8_t>('a' + i % 25);
    script("cat");
    EXPECT_EQ(runWith(data), 0);
    EXPECT_TRUE(bytes(output()) == data);

    script("head -c 10485760 /dev/zero | tr '\\0' x; wc -c"); // all of the output before any of the input is read
    EXPECT_EQ(runWith(data), 0);
    EXPECT_TRUE(output() == std::string(size, 'x') + "10485760\n");

    script("exec >&-; wc -c > \"$1\""); // the output ends long before the input
    EXPECT_EQ(runWith(data, {root_.host("/count")}), 0);
    EXPECT_EQ(root_.read("/count"), "10485760\n");

    script("cat; echo end");
    EXPECT_EQ(runWith({}), 0);
    EXPECT_EQ(output(), "end\n");
}

TEST_F(HSPipeUtilTest, aChildThatIgnoresItsInputDecidesByItsExitStatus) {
    struct sigaction before = {}, after = {};
    for (const auto& handler : {SIG_DFL, SIG_IGN}) {
        ASSERT_NE(std::signal(SIGPIPE, handler), SIG_ERR);
        ASSERT_EQ(::sigaction(SIGPIPE, nullptr, &before), 0);
        for (const int status : {0, 3}) {
            recordLog();
            script("exec <&-; exit " + std::to_string(status));
            EXPECT_EQ(runWith(Value::Data(1 << 20)), status == 0 ? 0 : 7);
            EXPECT_EQ(timesLogged("write failed for /usr/bin/program: " + text(EPIPE)), 1);
        }
        script("kill -PIPE $$; echo ignored");
        EXPECT_EQ(runWith({}), 0);
        EXPECT_EQ(output(), "ignored\n");
        ASSERT_EQ(::sigaction(SIGPIPE, nullptr, &after), 0);
        EXPECT_EQ(after.sa_handler, before.sa_handler);
        EXPECT_EQ(after.sa_flags, before.sa_flags);
    }
    EXPECT_NE(std::signal(SIGPIPE, SIG_DFL), SIG_ERR);
}

TEST_F(HSPipeUtilTest, anyOutputBecomesText) {
    binary("/bin/cat");
    using namespace std::string_literals;
    const auto a = [](std::size_t count) { return std::string(count, 'a'); };
    const std::string bad = "\uFFFD";
    const std::pair<std::string, std::string> rows[] = {
        {a(1022) + "é" + "b", a(1022) + "éb"},     {a(1020) + "😀" + a(1022), a(1020) + "😀" + a(1022)},
        {a(1022) + "\xC3", a(1022) + bad},         {a(1022) + "\xE2" + "x", a(1022) + bad + "x"},
        {a(1000) + "\0"s + a(30), a(1000) + a(8)}, {a(1022) + "\xC3" + "\0x"s, a(1022) + bad},
        {"\0"s + a(1022) + "end", "end"},
    };
    for (const auto& [written, expected] : rows) {
        root_.write("/file", written);
        EXPECT_EQ(run({root_.host("/file")}), 0);
        EXPECT_EQ(output(), expected) << written.size();
    }
}

TEST_F(HSPipeUtilTest, aProcessWithoutStandardDescriptorsRunsProgramsAllTheSame) {
    script("cat");
    inOwnProcess([&] {
        for (int number = 0; number < 3; ++number)
            ::close(number);
        EXPECT_EQ(run(), 7); // without an input to inherit, cat fails and says so
        EXPECT_EQ(runWith(bytes("in")), 0);
        EXPECT_EQ(output(), "in");
    });
}

} // namespace
