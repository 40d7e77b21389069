#include "tools/orloctl/LogTail.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <deque>
#include <optional>
#include <string>
#include <utility>

#include <fcntl.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/DeviceRoot.h"
#include "tools/orloctl/LocalFiles.h"

namespace {

[[noreturn]] void refuse() {
    throw UsageError(std::string("Cannot read the log ") + logPath + " on the device: " + std::strerror(errno) +
                     " (the journal has it too where systemd has started the service: journalctl -u "
                     "veltra-orlo-services)");
}

// Wakes up whenever something changes in the folder of the log.
class Watch {
public:
    Watch() : events_(::inotify_init1(IN_CLOEXEC)) {
        const std::string path = logPath;
        const FileDescriptor folder = openDirectoryInRoot(path.substr(0, path.rfind('/')));
        const std::string name = "/proc/self/fd/" + std::to_string(folder.get());
        if (!folder || ::inotify_add_watch(events_.get(), name.c_str(), IN_MODIFY | IN_CREATE | IN_MOVED_TO) < 0)
            refuse();
    }

    void wait() const {
        char events[4096];
        if (::read(events_.get(), events, sizeof events) < 0)
            refuse();
    }

private:
    FileDescriptor events_;
};

// The log from its beginning on, line by line.
class Reader {
public:
    Reader() : file_(openInRoot(logPath, O_RDONLY)) {}

    explicit operator bool() const { return static_cast<bool>(file_); }

    // Hands on what there is up to the end; a line that has no end yet waits for it. False when `take` wants no more.
    bool readOn(const std::function<bool(std::string_view)>& take) {
        std::string piece(65536, '\0');
        while (file_) {
            const ssize_t count = ::pread(file_.get(), piece.data(), piece.size(), place_);
            if (count < 0)
                refuse();
            if (count == 0)
                break;
            place_ += count;
            pending_.append(piece, 0, static_cast<std::size_t>(count));
            std::size_t start = 0;
            for (std::size_t end; (end = pending_.find('\n', start)) != pending_.npos; start = end + 1)
                if (!take(std::string_view(pending_).substr(start, end - start)))
                    return false;
            pending_.erase(0, start);
        }
        return true;
    }

    // The file that has taken the place of this one, if any.
    FileDescriptor replacement() const {
        FileDescriptor now = openInRoot(logPath, O_RDONLY);
        struct stat here = {}, there = {};
        if (!now || ::fstat(now.get(), &there) != 0)
            return {};
        if (file_ && ::fstat(file_.get(), &here) == 0 && here.st_dev == there.st_dev && here.st_ino == there.st_ino &&
            there.st_size >= place_)
            return {};
        return now;
    }

    void goTo(FileDescriptor file) {
        file_ = std::move(file);
        place_ = 0;
        pending_.clear();
    }

private:
    FileDescriptor file_;
    off_t place_ = 0;
    std::string pending_;
};

} // namespace

void readLog(std::size_t lines, bool isFollowed, const std::function<bool(std::string_view line)>& take) {
    const std::optional<Watch> watch = isFollowed ? std::make_optional<Watch>() : std::nullopt;
    Reader reader;
    if (!reader && !isFollowed)
        refuse();
    std::deque<std::string> last;
    reader.readOn([&](std::string_view line) {
        last.emplace_back(line);
        if (last.size() > lines)
            last.pop_front();
        return true;
    });
    bool isWanted = std::ranges::all_of(last, take);
    while (isWanted && isFollowed) {
        FileDescriptor next = reader.replacement();
        if (!next)
            watch->wait();
        isWanted = reader.readOn(take);
        if (!next)
            continue;
        reader.goTo(std::move(next));
        isWanted = isWanted && reader.readOn(take);
    }
}
