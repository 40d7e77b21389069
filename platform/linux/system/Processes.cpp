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

#include "platform/linux/system/DeviceRoot.h"

namespace processes {

namespace {

// The same open file under a number above the standard descriptors.
FileDescriptor aboveStandard(FileDescriptor file) {
    if (!file || file.get() > STDERR_FILENO)
        return file;
    return FileDescriptor(::fcntl(file.get(), F_DUPFD_CLOEXEC, STDERR_FILENO + 1));
}

class FileActions {
public:
    FileActions() { error_ = ::posix_spawn_file_actions_init(&actions_); }
    ~FileActions() { ::posix_spawn_file_actions_destroy(&actions_); }
    FileActions(const FileActions&) = delete;
    FileActions& operator=(const FileActions&) = delete;

    void duplicate(int from, int onto) {
        if (from >= 0 && error_ == 0)
            error_ = ::posix_spawn_file_actions_adddup2(&actions_, from, onto);
    }
    const posix_spawn_file_actions_t* get() const { return &actions_; }
    int error() const { return error_; }

private:
    posix_spawn_file_actions_t actions_;
    int error_;
};

class Attributes {
public:
    Attributes() {
        // The service blocks the signals that its event loop takes, and a child would inherit that.
        sigset_t none;
        ::sigemptyset(&none);
        error_ = ::posix_spawnattr_init(&attributes_);
        if (error_ == 0)
            error_ = ::posix_spawnattr_setsigmask(&attributes_, &none);
        if (error_ == 0)
            error_ = ::posix_spawnattr_setflags(&attributes_, POSIX_SPAWN_SETSIGMASK);
    }
    ~Attributes() { ::posix_spawnattr_destroy(&attributes_); }
    Attributes(const Attributes&) = delete;
    Attributes& operator=(const Attributes&) = delete;

    const posix_spawnattr_t* get() const { return &attributes_; }
    int error() const { return error_; }

private:
    posix_spawnattr_t attributes_;
    int error_;
};

} // namespace

int createPipe(Pipe& pipe) {
    int ends[2];
    if (::pipe2(ends, O_CLOEXEC) != 0)
        return errno;
    FileDescriptor readEnd = aboveStandard(FileDescriptor(ends[0]));
    FileDescriptor writeEnd = aboveStandard(FileDescriptor(ends[1]));
    if (!readEnd || !writeEnd)
        return errno;
    pipe = {readEnd.release(), writeEnd.release()};
    return 0;
}

void closeDescriptor(int descriptor) {
    if (descriptor >= 0)
        ::close(descriptor);
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
    FileActions actions;
    actions.duplicate(standard.input, STDIN_FILENO);
    actions.duplicate(standard.output, STDOUT_FILENO);
    actions.duplicate(standard.error, STDERR_FILENO);
    const Attributes attributes;
    if (actions.error() != 0 || attributes.error() != 0)
        return actions.error() != 0 ? actions.error() : attributes.error();

    std::vector<char*> arguments;
    arguments.reserve(argv.size() + 1);
    for (const std::string& argument : argv)
        arguments.push_back(const_cast<char*>(argument.c_str()));
    arguments.push_back(nullptr);
    char* const environment[] = {nullptr};
    return ::posix_spawn(&child, path, actions.get(), attributes.get(), arguments.data(), environment);
}

Ending waitFor(pid_t child) {
    int status = 0;
    pid_t found;
    do
        found = ::waitpid(child, &status, 0);
    while (found < 0 && errno == EINTR);
    if (found < 0)
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
    const int flags = ::fcntl(descriptor, F_GETFL);
    if (flags >= 0)
        ::fcntl(descriptor, F_SETFL, flags | O_NONBLOCK);
}

int openEnding(pid_t child) {
    return static_cast<int>(::syscall(SYS_pidfd_open, child, 0));
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
    ssize_t count;
    do
        count = ::read(descriptor, bytes, size);
    while (count < 0 && errno == EINTR);
    return count < 0 ? -errno : count;
}

ssize_t writeSome(int descriptor, const void* bytes, std::size_t size) {
    ssize_t count;
    do
        count = ::write(descriptor, bytes, size);
    while (count < 0 && errno == EINTR);
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
    closeDescriptor(number);
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
