// The real service on the bus in VELTRA_BUS, for the benchmarks that measure requests to it. They run from the top of
// the source tree.
#ifndef VELTRA_BENCH_SERVICE_ON_BUS_H
#define VELTRA_BENCH_SERVICE_ON_BUS_H

#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

#include <spawn.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include "platform/FileDescriptor.h"
#include "platform/linux/services/bus/BusValue.h"

constexpr const char* interfaceName = "com.tevari.VeltraPluginServer";
constexpr const char* serviceName = "com.tevari.VeltraOrloServices";
constexpr const char* servicePath = "/com/tevari/VeltraOrloServices";

// The same method without a service behind it, of "bench-request --echo".
constexpr const char* echoName = "com.tevari.VeltraOrloServices.Echo";
constexpr const char* echoPath = "/echo";

inline void require(bool holds, const std::string& what) {
    if (holds)
        return;
    std::fprintf(stderr, "benchmark: %s\n", what.c_str());
    std::exit(EXIT_FAILURE);
}

inline int check(int result) {
    require(result >= 0, bus::reasonOf(result));
    return result;
}

inline sd_bus* openBus() {
    const char* address = std::getenv("VELTRA_BUS");
    sd_bus* opened = nullptr;
    check(bus::open(address ? address : "session", &opened));
    return opened;
}

// Sends a request and waits for the reply, which the caller releases.
inline sd_bus_message* call(sd_bus* bus, const char* name, const char* path, const Value::Dictionary& request) {
    sd_bus_message *message = nullptr, *reply = nullptr;
    check(sd_bus_message_new_method_call(bus, &message, name, path, interfaceName, "HandleMessage"));
    bus::appendDictionary(message, request);
    check(sd_bus_call(bus, message, 0, nullptr, &reply));
    sd_bus_message_unref(message);
    return reply;
}

// Starts a program with the ends of pipes, or -1, as its standard input and output.
inline pid_t start(std::vector<std::string> words, int input = -1, int output = -1) {
    std::vector<char*> arguments;
    arguments.reserve(words.size() + 1);
    for (std::string& word : words)
        arguments.push_back(word.data());
    arguments.push_back(nullptr);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    if (input >= 0)
        posix_spawn_file_actions_adddup2(&actions, input, STDIN_FILENO);
    if (output >= 0)
        posix_spawn_file_actions_adddup2(&actions, output, STDOUT_FILENO);
    pid_t pid = -1;
    require(posix_spawnp(&pid, arguments[0], &actions, nullptr, arguments.data(), environ) == 0,
            "cannot start " + words[0]);
    posix_spawn_file_actions_destroy(&actions);
    return pid;
}

inline int exitStatusOf(pid_t pid) {
    int status = -1;
    return waitpid(pid, &status, 0) == pid && WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

// A service that has reported readiness, as it would to its manager; it ends with this object.
class Server {
public:
    explicit Server(const std::vector<std::string>& command) {
        const FileDescriptor manager(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
        sockaddr_un address = {AF_UNIX, {}};
        socklen_t length = sizeof(sa_family_t); // an abstract name that the kernel chooses
        auto* const where = reinterpret_cast<sockaddr*>(&address);
        const timeval patience = {.tv_sec = 60, .tv_usec = 0}; // one that ends first tells nobody
        require(setsockopt(manager.get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience) == 0, "no socket");
        require(bind(manager.get(), where, length) == 0, "no socket");
        length = sizeof address;
        require(getsockname(manager.get(), where, &length) == 0, "no socket");
        const std::string name(address.sun_path + 1, length - sizeof(sa_family_t) - 1);
        setenv("NOTIFY_SOCKET", ("@" + name).c_str(), 1);
        pid_ = start(command);
        char message[256];
        const ssize_t size = recv(manager.get(), message, sizeof message, 0);
        require(size > 0 && std::string_view(message, static_cast<std::size_t>(size)).starts_with("READY=1"),
                command[0] + " is not ready");
    }
    ~Server() {
        kill(pid_, SIGTERM);
        exitStatusOf(pid_);
    }
    Server(const Server&) = delete;
    Server& operator=(const Server&) = delete;

private:
    pid_t pid_;
};

// The program `name` that was built with `program`.
inline std::string beside(const char* program, const char* name) {
    return (std::filesystem::path(program).parent_path() / name).string();
}

// A folder with an example device, the device root of what is started; it is gone at the end.
class Device {
public:
    Device() {
        std::string name = std::filesystem::temp_directory_path() / "veltra-bench-XXXXXX";
        require(mkdtemp(name.data()), "no temporary folder");
        root = name;
        std::filesystem::copy("examples/device", root, std::filesystem::copy_options::recursive);
        std::filesystem::create_directories(root / "private/var/log");
        std::filesystem::create_directories(root / "tmp");
        setenv("VELTRA_DEVICE_ROOT", root.c_str(), 1);
    }
    ~Device() { std::filesystem::remove_all(root); }
    Device(const Device&) = delete;
    Device& operator=(const Device&) = delete;

    std::filesystem::path root;
};

#endif
