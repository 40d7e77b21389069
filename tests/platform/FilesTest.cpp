#include "platform/Files.h"

#include <atomic>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <map>
#include <optional>
#include <string>
#include <thread>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>

#include <gtest/gtest.h>

#include "platform/DeviceRoot.h"
#include "tests/support/OwnProcess.h"
#include "tests/support/TemporaryRoot.h"

namespace {

std::string flushed; // a letter for each file and directory that was

} // namespace

extern "C" int fsync(int descriptor) {
    struct stat status = {};
    EXPECT_EQ(::fstat(descriptor, &status), 0);
    flushed += S_ISREG(status.st_mode) ? (status.st_size > 0 ? 'f' : 'e') : 'd';
    return static_cast<int>(::syscall(SYS_fsync, descriptor));
}

namespace {

Value::Data bytes(std::string_view text) {
    return {text.begin(), text.end()};
}

std::optional<std::string> readText(std::string_view path) {
    const std::optional<Value::Data> contents = files::readWhole(path);
    if (!contents)
        return std::nullopt;
    return std::string(contents->begin(), contents->end());
}

unsigned mode(const std::filesystem::path& path) {
    struct stat status = {};
    EXPECT_EQ(::stat(path.c_str(), &status), 0);
    return status.st_mode & 07777;
}

TEST(Files, pathsAreResolvedInsideTheRoot) {
    const TemporaryRoot root;
    std::ofstream(root.around() / "secret") << "outside";
    root.write("/secret", "inside");
    root.write("/etc/real", "real");
    root.link("/etc/absolute", "/etc/real");
    root.link("/etc/relative", "../../../../secret");
    root.link("/etc/toHost", root.around() / "secret");
    root.link("/etc/up", "../..");
    root.link("/etc/loop", "loop");
    root.link("/etc/magic", "/proc/self/root/secret");

    std::string deep = "/";
    for (int depth = 0; depth < 70; ++depth)
        deep += "d/";
    root.makeDirectory(deep + deep);
    for (const std::string& from : {deep, deep + deep})
        root.link(from + "etc", "/etc");

    const std::pair<std::string, std::optional<std::string>> rows[] = {
        {"/etc/real", "real"},        {"etc/real", "real"},
        {"/../secret", "inside"},     {"/etc/../../../secret", "inside"},
        {"/etc/absolute", "real"},    {"/etc/relative", "inside"},
        {"/etc/up/secret", "inside"}, {"/etc/toHost", std::nullopt},
        {"/etc/loop", std::nullopt},  {"/etc/magic", std::nullopt},
        {"", std::nullopt},           {std::string("/secret\0", 8), std::nullopt},
        {"/etc/real/", std::nullopt}, {"/etc/real/../real", std::nullopt},
        {"//etc/./real", "real"},     {"/etc/up/etc/relative/", std::nullopt},
        {deep + "etc/real", "real"},  {deep + deep + "etc/real", std::nullopt},
    };
    const auto check = [&rows = rows] {
        for (const auto& [path, contents] : rows)
            EXPECT_EQ(readText(path), contents) << path;
    };
    check();
    inOwnProcess([&] {
        if (::chroot(root.around().c_str()) != 0)
            return; // root alone may do so
        ::setenv("VELTRA_DEVICE_ROOT", "/root", 1);
        check(); // without /proc
    });
}

// While one thread reads, another moves what is on the way out of the root, and a link into its place.
TEST(Files, whatIsMovedWhileAPathIsResolvedLeadsNowhereElse) {
    const TemporaryRoot root;
    std::filesystem::create_directory(root.around() / "out");
    for (const char* path : {"secret", "out/secret"})
        std::ofstream(root.around() / path) << "outside";
    root.write("/secret", "inside");
    root.write("/a/secret", "inside");
    root.makeDirectory("/a/b/c");
    root.link("/a/link", root.around());
    std::atomic<bool> done = false;
    std::thread mover([&] {
        const std::string away = root.around() / "out/b", place = root.host("/a/b"), link = root.host("/a/link");
        while (!done) {
            ::rename(place.c_str(), away.c_str());
            ::rename(away.c_str(), place.c_str());
            ::renameat2(AT_FDCWD, place.c_str(), AT_FDCWD, link.c_str(), RENAME_EXCHANGE);
        }
    });
    std::map<std::string, int> seen;
    for (int round = 0; round < 5000; ++round)
        for (const char* path : {"/a/b/../secret", "/a/b/c/../../../secret", "/a/b/secret"})
            ++seen[readText(path).value_or("nothing")];
    done = true;
    mover.join();
    EXPECT_GT(seen["inside"], 0);
    EXPECT_EQ(seen["outside"], 0);
}

TEST(Files, onlyRegularFilesUpToASizeAreReadAndNothingIsWaitedFor) {
    const TemporaryRoot root;
    root.makeDirectory("/directory");
    ASSERT_EQ(::mkfifo(root.host("/fifo").c_str(), 0600), 0);
    root.write("/sparse", "");
    std::filesystem::resize_file(root.host("/sparse"), files::maximumSize + 1);
    for (const char* path : {"/directory", "/fifo", "/missing", "/sparse"})
        EXPECT_EQ(readText(path), std::nullopt) << path;
    root.write("/ten", "0123456789");
    EXPECT_TRUE(readRegularFile(openInRoot("/ten", O_RDONLY), 10));
    EXPECT_FALSE(readRegularFile(openInRoot("/ten", O_RDONLY), 9));

    // The file systems of the kernel state a size of 0 or of a page for nodes that hold something else.
    ::setenv("VELTRA_DEVICE_ROOT", "/", 1);
    for (const char* path : {"/proc/version", "/proc/kallsyms", "/sys/devices/system/cpu/possible"}) {
        std::ifstream file(path, std::ios::binary);
        EXPECT_EQ(readText(path).value_or(""), std::string(std::istreambuf_iterator<char>(file), {})) << path;
    }
    EXPECT_FALSE(readRegularFile(openInRoot("/proc/version", O_RDONLY), 5));
}

TEST(Files, replaceMakesAPrivateFileOfTheWholeContentsThatOutlastsAPowerCut) {
    const TemporaryRoot root;
    root.write("/tmp/blob", "readable by all");
    root.link("/private", "tmp");
    for (const mode_t mask : {0U, 0777U}) {
        const mode_t before = ::umask(mask);
        for (const char* path : {"/tmp/blob", "tmp/../tmp/blob", "/private/new", "top"}) {
            for (const std::string& contents : {std::string("longer"), std::string(1 << 17, 'x'), std::string()}) {
                flushed.clear();
                EXPECT_TRUE(files::replace(path, bytes(contents))) << path;
                // The new file before it takes its place, and then the place.
                EXPECT_EQ(flushed, contents.empty() ? "ed" : "fd");
                EXPECT_TRUE(root.read(path) == contents) << path;
                EXPECT_EQ(mode(root.host(path)), 0600u) << path;
            }
        }
        ::umask(before);
    }
    EXPECT_EQ(root.contents().size(), 5u); // no file of another name is left
}

TEST(Files, whatIsNoRegularFileIsNotWrittenAndEverythingStaysAsItWas) {
    const TemporaryRoot root;
    std::ofstream(root.around() / "secret") << "outside";
    root.write("/tmp/file", "old");
    root.makeDirectory("/tmp/directory");
    ASSERT_EQ(::mkfifo(root.host("/tmp/fifo").c_str(), 0600), 0);
    root.link("/tmp/link", "file");
    root.link("/tmp/dangling", "missing");
    root.link("/tmp/toHost", root.around() / "secret");
    root.link("/linked", root.around());
    const auto before = root.contents();

    const std::string longName = "/tmp/" + std::string(256, 'n'), cutName("/tmp/new\0", 9);
    for (const std::string& path : std::initializer_list<std::string>{
             "/tmp/directory", "/tmp/fifo", "/tmp/link", "/tmp/dangling", "/tmp/toHost", "/linked/new", "/missing/file",
             "/tmp/file/x", "/tmp/", "/tmp/..", "/tmp/.", "/", "", longName, cutName}) {
        EXPECT_FALSE(files::replace(path, bytes("new"))) << path;
        EXPECT_FALSE(files::append(path, "new")) << path;
    }
    EXPECT_EQ(root.contents(), before);
}

TEST(Files, aDirectoryIsMadeWithThoseAboveItAndOutlastsAPowerCut) {
    const TemporaryRoot root;
    root.link("/var", "private/var");
    root.makeDirectory("/private/var");
    flushed.clear();
    EXPECT_TRUE(makeDirectoryInRoot("/var/lib/orlo/", 0700));
    EXPECT_EQ(flushed, "dd");
    EXPECT_EQ(mode(root.host("/var/lib")), 0755u);
    EXPECT_EQ(mode(root.host("/var/lib/orlo")), 0700u);
}

// A file-size limit stands in for a full disk: the write that crosses it is cut short and the next one fails.
TEST(Files, replaceThatCannotWriteKeepsTheOldFileAndLeavesNoOther) {
    const TemporaryRoot root;
    root.write("/tmp/file", "old");
    inOwnProcess([] {
        ASSERT_NE(std::signal(SIGXFSZ, SIG_IGN), SIG_ERR);
        const rlimit limit = {10, 10};
        ASSERT_EQ(::setrlimit(RLIMIT_FSIZE, &limit), 0);
        EXPECT_FALSE(files::replace("/tmp/file", bytes("more than ten bytes")));
    });
    EXPECT_EQ(root.contents(), (std::map<std::string, std::string>{{"/tmp", "directory"}, {"/tmp/file", "old"}}));
}

// Another writer removes what a killed one has left, and nothing else that has such a name.
TEST(Files, replaceRemovesWhatKilledWritersHaveLeft) {
    const TemporaryRoot root;
    for (const char* name :
         {".new-1", ".new-18446744073709551615", ".new-2x", ".new", ".new-", ".new-3", ".new-4", "other"})
        root.write(std::string("/tmp/") + name, "");
    std::filesystem::create_hard_link(root.host("/tmp/other"), root.host("/tmp/.new-5"));
    root.link("/tmp/.new-6", "other");
    root.makeDirectory("/tmp/.new-7");
    const FileDescriptor held(::open(root.host("/tmp/.new-3").c_str(), O_RDONLY));
    ASSERT_EQ(::flock(held.get(), LOCK_EX), 0);
    const bool foreign = ::chown(root.host("/tmp/.new-4").c_str(), 65534, 65534) == 0; // root alone may do so
    auto expected = root.contents();
    for (const char* name : {"/tmp/.new-1", "/tmp/.new-18446744073709551615", foreign ? "" : "/tmp/.new-4"})
        expected.erase(name);
    expected["/tmp/file"] = "new";
    EXPECT_TRUE(files::replace("/tmp/file", bytes("new")));
    EXPECT_EQ(root.contents(), expected);
}

TEST(Files, writersSideBySideDoNotTakeEachOthersFilesForLeftovers) {
    const TemporaryRoot root;
    root.makeDirectory("/tmp");
    inProcessesAtOnce([](int writer) {
        for (int round = 0; round < 50; ++round)
            EXPECT_TRUE(files::replace("/tmp/" + std::to_string(writer), bytes("new")));
    });
    EXPECT_EQ(root.contents().size(), 7u);
}

TEST(Files, appendAddsToAFileAndMakesOneThatItsGroupMayRead) {
    const TemporaryRoot root;
    root.write("/log/open", "");
    std::filesystem::permissions(root.host("/log/open"), std::filesystem::perms(0604));
    const mode_t mask = ::umask(077);
    for (const char* path : {"/log/a", "/log/open"}) {
        EXPECT_TRUE(files::append(path, "one\n"));
        EXPECT_TRUE(files::append(path, "two\n"));
        EXPECT_EQ(root.read(path), "one\ntwo\n");
    }
    ::umask(mask);
    EXPECT_EQ(mode(root.host("/log/a")), 0640u);
    EXPECT_EQ(mode(root.host("/log/open")), 0604u);
}

} // namespace
