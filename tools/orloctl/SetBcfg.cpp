#include "tools/orloctl/SetBcfg.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <iostream>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/time.h>

#include "platform/DeviceRoot.h"
#include "tools/orloctl/Interruption.h"
#include "tools/orloctl/LocalFiles.h"

namespace {

using namespace std::chrono_literals;

// The store's folder, which exists on an installed system.
constexpr const char* lockFolder = "/var/lib/orlo";
constexpr const char* lockName = "orloctl.lock";

[[noreturn]] void refuseLock(const std::string& why) {
    throw UsageError(std::string("Cannot lock ") + lockFolder + "/" + lockName + " on the device: " + why);
}

// Whoever can open a lock file can hold the lock for ever.
bool isPrivate(const FileDescriptor& file, mode_t forbidden) {
    struct stat status;
    return ::fstat(file.get(), &status) == 0 && status.st_uid == ::geteuid() && (status.st_mode & forbidden) == 0;
}

FileDescriptor openLock() {
    const FileDescriptor folder = makeDirectoryInRoot(lockFolder, 0700);
    FileDescriptor file(
        folder ? ::openat(folder.get(), lockName, O_RDWR | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, 0600) : -1);
    if (!file)
        refuseLock(std::strerror(errno));
    if (!isPrivate(folder, 0022) || !isPrivate(file, 0077))
        refuseLock("other users can open it or replace it");
    return file;
}

// Interrupts a system call that waits: after `first`, and then every second, since the first time the call may not have
// begun to wait yet.
class Alarm {
public:
    explicit Alarm(std::chrono::microseconds first) {
        struct sigaction action = {};
        action.sa_handler = [](int) {};
        ::sigaction(SIGALRM, &action, &earlier_);
        const itimerval times = {{1, 0}, {first / 1s, std::max<suseconds_t>(1, (first % 1s).count())}};
        ::setitimer(ITIMER_REAL, &times, nullptr);
    }
    Alarm(const Alarm&) = delete;
    Alarm& operator=(const Alarm&) = delete;
    ~Alarm() {
        const itimerval none = {};
        ::setitimer(ITIMER_REAL, &none, nullptr);
        ::sigaction(SIGALRM, &earlier_, nullptr);
    }

private:
    struct sigaction earlier_ = {};
};

// False when the time is up, and after an interruption.
bool take(const FileDescriptor& lock, std::chrono::steady_clock::time_point deadline) {
    if (::flock(lock.get(), LOCK_EX | LOCK_NB) == 0)
        return true;
    std::cerr << "orloctl: waiting for another orloctl, which has a configuration blob rewritten\n";
    const auto left = deadline - std::chrono::steady_clock::now();
    const Alarm alarm(
        std::clamp<std::chrono::microseconds>(std::chrono::duration_cast<std::chrono::microseconds>(left), 1us, 1s));
    while (::flock(lock.get(), LOCK_EX) != 0) {
        if (errno != EINTR)
            refuseLock(std::strerror(errno));
        if (Interruption::isRaised() || std::chrono::steady_clock::now() >= deadline)
            return false;
    }
    return true;
}

} // namespace

BlobAnswer setBcfg(const ServiceAddress& address, const std::string& devicePath) {
    const Interruption interruption;
    const FileDescriptor lock = openLock();
    BlobAnswer found;
    if (!take(lock, address.deadline())) {
        found.answer.report.fail(
            noAnswerReason(address) +
                " while another orloctl has a configuration blob rewritten. The request was not sent.",
            Outcome::Unreachable);
        return found;
    }
    const BlobResult result;
    found.answer = sendRequest(address, "setGlobalbCfg", {{"bcfgDataPath", devicePath}});
    if (!found.answer.report.ok())
        return found;
    if (found.answer.serviceUser)
        found.result = result.read(*found.answer.serviceUser, devicePath);
    else
        found.result.problem = "The service has left the bus, so that nobody knows whose the result must be.";
    if (!found.result.problem.empty())
        found.answer.report.fail(found.result.problem, Outcome::Failure);
    return found;
}
