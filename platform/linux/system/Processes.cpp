#include "platform/Processes.h"

#include <cerrno>
#include <climits>
#include <cstring>
#include <utility>

#include <fcntl.h>
#include <poll.h>
#include <spawn.h>
#include <sys/ioctl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include "platform/DeviceRoot.h"

namespace processes {

namespace {

// The same open file under a number above the standard descriptors.
FileDescriptor aboveStandard(FileDescriptor file) {
    if (!file || file.get() > STDERR_FILENO)
        return file;
    return FileDescriptor(::fcntl(file.get(), F_DUPFD_CLOEXEC, STDERR_FILENO + 1));
}

// How a child is to start.
class SpawnSettings {
public:
    SpawnSettings() {
        // The service blocks the signals that its event loop takes, and a child would inherit that.
        sigset_t none;
        ::sigemptyset(&none);
        note(::posix_spawn_file_actions_init(&actions));
        note(::posix_spawnattr_init(&attributes));
        note(::posix_spawnattr_setsigmask(&attributes, &none));
        note(::posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK));
    }
    ~SpawnSettings() {
        ::posix_spawn_file_actions_destroy(&actions);
        ::posix_spawnattr_destroy(&attributes);
    }
    SpawnSettings(const SpawnSettings&) = delete;
    SpawnSettings& operator=(const SpawnSettings&) = delete;

    void duplicate(int from, int onto) {
        if (from >= 0)
            note(::posix_spawn_file_actions_adddup2(&actions, from, onto));
    }

    posix_spawn_file_actions_t actions;
    posix_spawnattr_t attributes;
    int error = 0; // of the first step that failed

private:
    void note(int result) { error = error != 0 ? error : result; }
};

} // namespace

int createPipe(Pipe& pipe) {
    int ends[2];
    if (::pipe2(ends, O_CLOEXEC) != 0)
        return errno;
    Pipe made{FileDescriptor(ends[0]), FileDescriptor(ends[1])};
    made = {aboveStandard(std::move(made.readEnd)), aboveStandard(std::move(made.writeEnd))};
    if (!made.readEnd || !made.writeEnd)
        return errno;
    pipe = std::move(made);
    return 0;
}

int spawn(const std::vector<std::string>& argv, const StandardDescriptors& standard, pid_t& child) {
    const FileDescriptor program = openInRoot(argv.empty() ? std::string_view() : argv[0], O_PATH);
    if (!program)
        return errno;
    char path[PATH_MAX];
    const std::string link = "/proc/self/fd/" + std::to_string(program.get());
    const ssize_t length = ::readlink(link.c_str(), path, sizeof path);
    if (length < 0 || length == sizeof path)
        return length < 0 ? errno : ENAMETOOLONG;
    path[length] = '\0';
    SpawnSettings settings;
    settings.duplicate(standard.input, STDIN_FILENO);
    settings.duplicate(standard.output, STDOUT_FILENO);
    settings.duplicate(standard.error, STDERR_FILENO);
    if (settings.error != 0)
        return settings.error;

    std::vector<char*> arguments;
    arguments.reserve(argv.size() + 1);
    for (const std::string& argument : argv)
        arguments.push_back(const_cast<char*>(argument.c_str()));
    arguments.push_back(nullptr);
    char* const environment[] = {nullptr};
    return ::posix_spawn(&child, path, &settings.actions, &settings.attributes, arguments.data(), environment);
}

Ending waitFor(pid_t child) {
    int status = 0;
    if (TEMP_FAILURE_RETRY(::waitpid(child, &status, 0)) < 0)
        return {Ending::Unknown, errno};
    if (WIFEXITED(status))
        return {Ending::Exited, WEXITSTATUS(status)};
    if (WIFSTOPPED(status))
        return {Ending::Stopped, WSTOPSIG(status)};
    return {Ending::Terminated, WTERMSIG(status)};
}

void killAndWait(pid_t child) {
    ::kill(child, SIGKILL);
    while (waitFor(child).kind == Ending::Stopped) {
    }
}

void makeNonBlocking(int descriptor) {
    ::fcntl(descriptor, F_SETFL, O_NONBLOCK); // a pipe has no other flag that can be set
}

FileDescriptor openEnding(pid_t child) {
    return FileDescriptor(static_cast<int>(::syscall(SYS_pidfd_open, child, 0)));
}

Ready waitUntilReady(int writeEnd, int readEnd, pid_t child, int ending) {
    constexpr int nowAndThen = 20; // milliseconds
    pollfd ends[] = {{writeEnd, POLLOUT, 0}, {readEnd, POLLIN, 0}, {ending, POLLIN, 0}};
    while (true) {
        const int count = ::poll(ends, 3, ending < 0 ? nowAndThen : -1);
        if (count < 0 && (errno == EINTR || errno == EAGAIN))
            continue;
        bool hasEnded = ends[2].revents != 0;
        if (ending < 0) {
            siginfo_t found = {};
            hasEnded = ::waitid(P_PID, static_cast<id_t>(child), &found, WEXITED | WNOHANG | WNOWAIT) != 0 ||
                       found.si_pid != 0;
        }
        // When polling itself fails, reading and writing find out what is wrong.
        if (count != 0 || hasEnded)
            return {count < 0 || ends[0].revents != 0, count < 0 || ends[1].revents != 0, hasEnded};
    }
}

std::size_t readableBytes(int readEnd) {
    int count = 0;
    return ::ioctl(readEnd, FIONREAD, &count) == 0 && count > 0 ? static_cast<std::size_t>(count) : 0;
}

ssize_t readSome(int descriptor, void* bytes, std::size_t size) {
    const ssize_t count = TEMP_FAILURE_RETRY(::read(descriptor, bytes, size));
    return count < 0 ? -errno : count;
}

ssize_t writeSome(int descriptor, const void* bytes, std::size_t size) {
    const ssize_t count = TEMP_FAILURE_RETRY(::write(descriptor, bytes, size));
    return count < 0 ? -errno : count;
}

const char* errorText(int number) {
    const char* const text = ::strerrordesc_np(number);
    return text ? text : "Unknown error";
}

void catchBrokenPipe() {
    struct sigaction nothing = {};
    nothing.sa_handler = [](int) {};
    nothing.sa_flags = SA_RESTART;
    ::sigaction(SIGPIPE, &nothing, nullptr);
}

void openStandardDescriptors() {
    int number;
    do
        number = ::open("/dev/null", O_RDWR | O_CLOEXEC);
    while (number >= 0 && number <= STDERR_FILENO);
    const FileDescriptor oneTooMany(number);
}

BrokenPipeIgnored::BrokenPipeIgnored() {
    struct sigaction ignore = {}, previous = {};
    ignore.sa_handler = SIG_IGN;
    if (::sigaction(SIGPIPE, &ignore, &previous) == 0)
        previous_ = previous;
}

BrokenPipeIgnored::~BrokenPipeIgnored() {
    if (previous_)
        ::sigaction(SIGPIPE, &*previous_, nullptr);
}

} // namespace processes
