#include "platform/Processes.h"

#include <cerrno>
#include <cstring>
#include <utility>

#include <fcntl.h>
#include <poll.h>
#include <spawn.h>
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
    const FileDescriptor program = aboveStandard(openInRoot(argv.empty() ? std::string_view() : argv[0], O_PATH));
    if (!program)
        return errno;
    FileActions actions;
    actions.duplicate(standard.input, STDIN_FILENO);
    actions.duplicate(standard.output, STDOUT_FILENO);
    actions.duplicate(standard.error, STDERR_FILENO);
    // The interpreter of a script opens it by the path that is executed, so the descriptor has to outlast the exec:
    // duplicating it onto itself takes the flag off that would close it.
    actions.duplicate(program.get(), program.get());
    const Attributes attributes;
    if (actions.error() != 0 || attributes.error() != 0)
        return actions.error() != 0 ? actions.error() : attributes.error();

    std::vector<char*> arguments;
    arguments.reserve(argv.size() + 1);
    for (const std::string& argument : argv)
        arguments.push_back(const_cast<char*>(argument.c_str()));
    arguments.push_back(nullptr);
    char* const environment[] = {nullptr};
    const std::string path = "/proc/self/fd/" + std::to_string(program.get());
    return ::posix_spawn(&child, path.c_str(), actions.get(), attributes.get(), arguments.data(), environment);
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

Ready waitUntilReady(int writeEnd, int readEnd) {
    pollfd ends[] = {{writeEnd, POLLOUT, 0}, {readEnd, POLLIN, 0}};
    int count;
    do
        count = ::poll(ends, 2, -1);
    while (count < 0 && (errno == EINTR || errno == EAGAIN));
    // When polling itself fails, reading and writing find out what is wrong.
    return {count < 0 || ends[0].revents != 0, count < 0 || ends[1].revents != 0};
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

std::string errorText(int number) {
    char text[256] = "";
    return ::strerror_r(number, text, sizeof text);
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
