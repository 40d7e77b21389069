#include "platform/DeviceRoot.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <new>
#include <utility>
#include <vector>

#include <dirent.h>
#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace {

constexpr int mostLinks = 40; // as many as the kernel follows
constexpr std::size_t deepest = 128;

std::nullopt_t nothing(int number) {
    errno = number;
    return std::nullopt;
}

FileDescriptor none(int number) {
    errno = number;
    return {};
}

bool isSame(const struct stat& one, const struct stat& other) {
    return one.st_dev == other.st_dev && one.st_ino == other.st_ino;
}

// Opens what `path` names in `directory` when no link lies on the way and the way does not leave the directory, looked
// up by the kernel in one call. None for every other path, and where the kernel or a filter has no such call.
FileDescriptor openBeneath(const FileDescriptor& directory, const std::string& path, int flags) {
    open_how how = {};
    how.flags = static_cast<std::uint64_t>(flags);
    how.resolve = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS;
    return FileDescriptor(static_cast<int>(::syscall(SYS_openat2, directory.get(), path.c_str(), &how, sizeof how)));
}

// Opens the regular file or directory that was found under `name` in `directory`, that very one; nothing else is
// opened, since opening alone can arm a device or wake who waits at a FIFO.
FileDescriptor openFound(const FileDescriptor& found, const struct stat& status, const FileDescriptor& directory,
                         const std::string& name, int flags) {
    if (S_ISDIR(status.st_mode))
        return FileDescriptor(::openat(found.get(), ".", flags));
    if (!S_ISREG(status.st_mode))
        return none(S_ISLNK(status.st_mode) ? ELOOP : ENXIO);
    if ((flags & O_DIRECTORY) != 0)
        return none(ENOTDIR);
    FileDescriptor file(::open(("/proc/self/fd/" + std::to_string(found.get())).c_str(), flags & ~O_NOFOLLOW));
    if (file || errno != ENOENT)
        return file;
    // Without /proc only the name is left, and what it names may have changed since.
    flags |= O_NOFOLLOW | O_NONBLOCK | O_NOCTTY;
    file = name.find('/') == std::string::npos ? FileDescriptor(::openat(directory.get(), name.c_str(), flags))
                                               : openBeneath(directory, name, flags);
    struct stat opened;
    return file && ::fstat(file.get(), &opened) == 0 && isSame(opened, status) ? std::move(file) : none(EAGAIN);
}

// The way from the device root to what a path names, one name at a time. No name is looked up but in a directory that
// is held open, links are read and never followed by the kernel, and ".." goes back to the directory that was passed on
// the way here, wherever that has been moved to meanwhile.
class Walk {
public:
    // What `path` names, as a descriptor of O_PATH.
    FileDescriptor find(std::string_view path, bool followLast, Links links) {
        if (path.empty() || path.size() >= PATH_MAX || path.find('\0') != std::string_view::npos)
            return none(path.empty() ? ENOENT : path.size() >= PATH_MAX ? ENAMETOOLONG : EINVAL);
        passed_.push_back(openDeviceRoot());
        if (!passed_.back())
            return {};
        if (path.size() <= deepest) { // most paths are short and lead through no link
            name_ = path.substr(std::min(path.find_first_not_of('/'), path.size()));
            FileDescriptor found = openBeneath(passed_.back(), name_, O_PATH | O_CLOEXEC);
            if (found && ::fstat(found.get(), &status_) == 0)
                return found;
        }
        rest_ = path;
        for (int linksLeft = links == Links::Followed ? mostLinks : 0; takeName();) {
            if (name_ == ".." && passed_.size() > 1)
                passed_.pop_back();
            if (name_ == "." || name_ == "..")
                continue;
            constexpr int asItIs = O_PATH | O_NOFOLLOW | O_CLOEXEC;
            // Most names on the way are those of directories, which need no look at what they are.
            if (!rest_.empty() && passed_.size() <= deepest) {
                FileDescriptor directory(::openat(passed_.back().get(), name_.c_str(), asItIs | O_DIRECTORY));
                if (directory) {
                    passed_.push_back(std::move(directory));
                    continue;
                }
            }
            FileDescriptor next(::openat(passed_.back().get(), name_.c_str(), asItIs));
            if (!next || ::fstat(next.get(), &status_) != 0)
                return {};
            const bool isLast = rest_.empty();
            if (S_ISLNK(status_.st_mode) && (followLast || !isLast || links == Links::Refused)) {
                if (linksLeft-- == 0)
                    return none(ELOOP);
                if (!goOnWith(next))
                    return {};
            } else if (isLast) {
                return next;
            } else if (!S_ISDIR(status_.st_mode) || passed_.size() > deepest) {
                return none(S_ISDIR(status_.st_mode) ? ENAMETOOLONG : ENOTDIR);
            } else { // it was put there since the look before
                passed_.push_back(std::move(next));
            }
        }
        FileDescriptor directory = std::move(passed_.back());
        return ::fstat(directory.get(), &status_) == 0 ? std::move(directory) : FileDescriptor();
    }

    FileDescriptor open(const FileDescriptor& found, int flags) {
        return openFound(found, status_, passed_.back(), name_, flags);
    }

private:
    // Takes the next name off the rest of the path; false when there is none.
    bool takeName() {
        const std::size_t start = rest_.find_first_not_of('/');
        if (start == std::string::npos)
            return false;
        const std::size_t end = std::min(rest_.find('/', start), rest_.size());
        name_ = rest_.substr(start, end - start);
        rest_.erase(0, end);
        return true;
    }

    // Puts the text of a link in front of the rest of the path.
    bool goOnWith(const FileDescriptor& link) {
        std::array<char, PATH_MAX> text;
        const ssize_t size = ::readlinkat(link.get(), "", text.data(), text.size());
        if (size <= 0 || size == PATH_MAX) {
            errno = size < 0 ? errno : size == 0 ? ENOENT : ENAMETOOLONG;
            return false;
        }
        rest_.insert(0, text.data(), static_cast<std::size_t>(size));
        if (text[0] == '/')
            passed_.erase(passed_.begin() + 1, passed_.end());
        return true;
    }

    std::vector<FileDescriptor> passed_; // the root, and the directories below it that lead to the next name
    std::string name_;                   // the last name that was looked up
    std::string rest_;
    struct stat status_ = {}; // of what was found
};

} // namespace

std::string deviceRootPath() {
    const char* root = std::getenv("VELTRA_DEVICE_ROOT");
    return root && *root ? root : "/";
}

FileDescriptor openDeviceRoot() {
    return FileDescriptor(::open(deviceRootPath().c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
}

FileDescriptor openInRoot(std::string_view path, int flags, Links links) {
    Walk walk;
    FileDescriptor found = walk.find(path, (flags & O_NOFOLLOW) == 0, links);
    return !found || (flags & O_PATH) != 0 ? std::move(found) : walk.open(found, flags | O_CLOEXEC);
}

FileDescriptor openIn(const FileDescriptor& directory, const std::string& name, int flags) {
    const FileDescriptor found(::openat(directory.get(), name.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC));
    struct stat status;
    return found && ::fstat(found.get(), &status) == 0 ? openFound(found, status, directory, name, flags | O_CLOEXEC)
                                                       : FileDescriptor();
}

FileDescriptor openDirectoryInRoot(std::string_view path, Links links) {
    return openInRoot(path, O_RDONLY | O_DIRECTORY, links);
}

FileDescriptor makeDirectoryInRoot(std::string_view path, mode_t mode) {
    while (path.size() > 1 && path.ends_with('/'))
        path.remove_suffix(1);
    FileDescriptor directory = openDirectoryInRoot(path);
    if (directory || errno != ENOENT)
        return directory;
    const std::optional<DevicePath> parts = splitDevicePath(path);
    if (!parts)
        return {};
    const FileDescriptor above = makeDirectoryInRoot(parts->parent, 0755);
    if (!above || (::mkdirat(above.get(), parts->name.c_str(), mode) != 0 && errno != EEXIST))
        return {};
    ::fsync(above.get());
    return openDirectoryInRoot(path);
}

std::optional<DevicePath> splitDevicePath(std::string_view path) {
    const std::size_t slash = path.rfind('/');
    std::string name(slash == std::string_view::npos ? path : path.substr(slash + 1));
    if (name.empty() || name == "." || name == ".." || name.find('\0') != std::string::npos)
        return std::nullopt;
    return DevicePath{slash == std::string_view::npos ? "/" : path.substr(0, slash + 1), std::move(name)};
}

std::optional<std::vector<std::string>> namesIn(const FileDescriptor& directory) {
    // A descriptor of its own, since the stream moves its position and closes it.
    FileDescriptor file(::openat(directory.get(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    std::unique_ptr<DIR, int (*)(DIR*)> stream(file ? ::fdopendir(file.get()) : nullptr, ::closedir);
    if (!stream)
        return std::nullopt;
    file.release();
    std::vector<std::string> names;
    const auto next = [&stream] {
        errno = 0; // at the end it stays so
        return ::readdir(stream.get());
    };
    while (const dirent* entry = next()) {
        const std::string_view name = entry->d_name;
        if (name != "." && name != "..")
            names.emplace_back(name);
    }
    const int error = errno;
    stream.reset();
    if (error != 0)
        return nothing(error);
    return names;
}

std::optional<Value::Data> readRegularFile(const FileDescriptor& file, std::size_t maximum) try {
    struct stat status;
    if (::fstat(file.get(), &status) != 0)
        return std::nullopt;
    if (!S_ISREG(status.st_mode))
        return nothing(S_ISDIR(status.st_mode) ? EISDIR : EINVAL);
    const auto stated = static_cast<std::size_t>(status.st_size);
    if (stated > maximum)
        return nothing(EFBIG);

    // One byte more than stated, so that a file that is as long as it says needs one read for the bytes and one for
    // the end, into the same memory; and at least a page, since a kernel node that states no size may give all it has
    // to the first read only.
    Value::Data contents(std::max<std::size_t>(stated + 1, 4096));
    std::size_t filled = 0;
    while (true) {
        if (filled == contents.size())
            contents.resize(std::min(contents.size() * 2, maximum + 1));
        const ssize_t count =
            TEMP_FAILURE_RETRY(::read(file.get(), contents.data() + filled, contents.size() - filled));
        if (count < 0)
            return std::nullopt;
        if (count == 0)
            break;
        filled += static_cast<std::size_t>(count);
        if (filled > maximum)
            return nothing(EFBIG);
    }
    contents.resize(filled);
    return contents;
} catch (const std::bad_alloc&) {
    return nothing(ENOMEM);
}
