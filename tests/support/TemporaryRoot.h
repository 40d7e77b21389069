#ifndef VELTRA_TESTS_TEMPORARY_ROOT_H
#define VELTRA_TESTS_TEMPORARY_ROOT_H

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <stdexcept>
#include <string>
#include <string_view>

// A device root of a test's own, empty at first: the environment variable VELTRA_DEVICE_ROOT names it while this lives,
// and it is removed at the end. Around the root lies a directory that is not the device's, for tests that try to get
// out. Paths that the operations take are device paths.
class TemporaryRoot {
public:
    TemporaryRoot() {
        std::string name = (std::filesystem::temp_directory_path() / "veltra-test-XXXXXX").string();
        if (!::mkdtemp(name.data()))
            throw std::runtime_error("no temporary directory");
        around_ = name;
        std::filesystem::create_directory(host("/"));
        ::setenv("VELTRA_DEVICE_ROOT", host("/").c_str(), 1);
    }
    TemporaryRoot(const TemporaryRoot&) = delete;
    TemporaryRoot& operator=(const TemporaryRoot&) = delete;
    ~TemporaryRoot() {
        ::unsetenv("VELTRA_DEVICE_ROOT");
        std::error_code ignored;
        std::filesystem::remove_all(around_, ignored);
    }

    // The directory around the root.
    const std::filesystem::path& around() const { return around_; }

    // Where `path` lies for the host.
    std::filesystem::path host(std::string_view path) const {
        return around_ / "root" / std::filesystem::path(path).relative_path();
    }

    // Writes a file, with the directories that it needs.
    void write(std::string_view path, std::string_view contents) const {
        std::filesystem::create_directories(host(path).parent_path());
        std::ofstream(host(path), std::ios::binary) << contents;
    }

    // Writes the device description.
    void describe(std::string_view json) const { write("/etc/veltra/device.json", json); }

    // The contents of a file; of a missing one the text "(missing)".
    std::string read(std::string_view path) const {
        std::ifstream file(host(path), std::ios::binary);
        return file ? std::string(std::istreambuf_iterator<char>(file), {}) : "(missing)";
    }

    void makeDirectory(std::string_view path) const { std::filesystem::create_directories(host(path)); }

    // Makes the symbolic link `path` with the text `target`, which is not changed in any way.
    void link(std::string_view path, const std::filesystem::path& target) const {
        std::filesystem::create_directories(host(path).parent_path());
        std::filesystem::create_symlink(target, host(path));
    }

    // All that lies below the root: file contents, link targets and, for the rest, the kind.
    std::map<std::string, std::string> contents() const {
        namespace fs = std::filesystem;
        std::map<std::string, std::string> found;
        for (const fs::directory_entry& entry : fs::recursive_directory_iterator(host("/"))) {
            const std::string path = "/" + entry.path().lexically_relative(host("/")).string();
            found[path] = entry.is_symlink()        ? "link to " + fs::read_symlink(entry.path()).string()
                          : entry.is_regular_file() ? read(path)
                          : entry.is_directory()    ? "directory"
                                                    : "special";
        }
        return found;
    }

private:
    std::filesystem::path around_;
};

#endif
