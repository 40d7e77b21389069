// What the remote store costs on top of HTTPS: puts and gets of records in one session of the data-store library,
// beside the curl command line with as many requests on one connection, both to the same nginx on loopback. Either
// makes its connection anew for each run, and the session fetches the trust object and its measure first.
#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include "platform/Json.h"
#include "platform/OrloDataStore.h"

namespace {

constexpr int requests = 500;
constexpr const char* host = "https://orlo-ds.tevari.example:8443";

void require(bool holds, const char* what) {
    if (holds)
        return;
    std::cerr << "bench-remote-store: " << what << '\n';
    std::exit(EXIT_FAILURE);
}

// Starts a program with the ends of pipes, or -1, as its standard input and output.
pid_t start(std::vector<std::string> words, int input, int output) {
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
    require(posix_spawnp(&pid, arguments[0], &actions, nullptr, arguments.data(), environ) == 0, "cannot start");
    posix_spawn_file_actions_destroy(&actions);
    return pid;
}

int exitStatusOf(pid_t pid) {
    int status = -1;
    return waitpid(pid, &status, 0) == pid && WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

// The folder of this run, which is the device root too.
std::filesystem::path folder;

// nginx as the store; it ends with this object, which closes its standard input.
class Server {
public:
    Server() {
        std::filesystem::create_directories(folder / "etc/veltra");
        std::ofstream(folder / "etc/veltra/device.json") << "{}";
        int input[2], output[2];
        require(pipe2(input, O_CLOEXEC) == 0 && pipe2(output, O_CLOEXEC) == 0, "no pipes");
        process_ = start({"examples/remote-store/lab.py", "nginx", folder}, input[0], output[1]);
        close(input[0]);
        close(output[1]);
        input_ = input[1];
        std::string announcement;
        for (char c = 0; read(output[0], &c, 1) == 1 && c != '\n';)
            announcement += c;
        close(output[0]);
        description_ = jsonToValue(announcement).value_or(Value());
        require(description_.dictionary(), "no server");
    }
    ~Server() {
        close(input_);
        exitStatusOf(process_);
    }
    Server(const Server&) = delete;
    Server& operator=(const Server&) = delete;

    // What leads curl to the server.
    std::vector<std::string> curlOptions() const {
        std::vector<std::string> options = {"--cacert", folder / "store-ca.pem"};
        for (const auto& [from, to] : *description_["connectTo"].dictionary())
            options.insert(options.end(), {"--connect-to", from + ":" + *to.text()});
        return options;
    }

private:
    pid_t process_;
    int input_;
    Value description_;
};

std::string instance(int number) {
    return "B" + std::to_string(number);
}

class Session {
public:
    Session() : session_(QDOrloCreateWithOptions(options())) {
        Value::Data object;
        require(
            QDOrloDataCopyTrustObject(session_, "http://orlo-ca.tevari.example:8080/orlotrustobject", &object, nullptr),
            "no trust object");
        digest_.resize(32);
        QDSupportDigestSha256(object.data(), static_cast<std::uint32_t>(object.size()), digest_.data());
        QDOrloSetOption(session_, "TrustObjectDigest", digest_);
    }
    ~Session() { QDSupportSafeRelease(session_); }
    Session(const Session&) = delete;
    Session& operator=(const Session&) = delete;

    std::string digest() const { return *QDOrloCreateInstanceString(digest_).text(); }

    void put(int number, const Value::Data& record) {
        permit(OrloActionPut, number);
        require(QDOrloDataPut(session_, "psd2", instance(number), record, nullptr), "put");
    }

    Value::Data get(int number) {
        permit(OrloActionGet, number);
        auto record = QDOrloDataCopy(session_, "psd2", instance(number), nullptr);
        require(record.has_value(), "get");
        return std::move(*record);
    }

private:
    static Value options() {
        return Value::Dictionary{{"APTicket", Value::Data{1}},
                                 {"DataVersion", 1},
                                 {"DSURL", host},
                                 {"CAURL", "https://orlo-ca.tevari.example:8443"}};
    }

    void permit(OrloAction action, int number) {
        QDOrloSetOption(session_, "Permissions",
                        QDOrloDataCreatePermissionsString(session_, action, "psd2", instance(number)));
    }

    __QDOrlo* session_;
    Value::Data digest_;
};

void countRequests(benchmark::State& state) {
    state.counters["ns_per_item"] = benchmark::Counter(static_cast<double>(state.iterations()) * requests * 1e-9,
                                                       benchmark::Counter::kIsRate | benchmark::Counter::kInvert);
}

Value::Data recordOf(const benchmark::State& state) {
    return Value::Data(static_cast<std::size_t>(state.range(0)), 0xA5);
}

void putAll(const Value::Data& record) {
    Session session;
    for (int number = 1; number <= requests; ++number)
        session.put(number, record);
}

void putWithSession(benchmark::State& state) {
    for (auto step : state)
        putAll(recordOf(state));
    countRequests(state);
}

void getWithSession(benchmark::State& state) {
    const Value::Data record = recordOf(state);
    putAll(record);
    for (auto step : state) {
        Session session;
        for (int number = 1; number <= requests; ++number)
            require(session.get(number) == record, "a record has changed");
    }
    countRequests(state);
}

// Runs curl with `options` on the URLs of all records.
void runCurl(benchmark::State& state, const Server& server, const std::vector<std::string>& options) {
    const Value::Data record = recordOf(state);
    std::ofstream(folder / "record", std::ios::binary)
        .write(reinterpret_cast<const char*>(record.data()), std::ssize(record));
    putAll(record);
    std::vector<std::string> command = {"curl",
                                        "--silent",
                                        "--fail",
                                        "--output",
                                        "/dev/null",
                                        "--header",
                                        "Orlo-Trust-Object-Digest: " + Session().digest(),
                                        "--header",
                                        "Orlo-Permissions: 1:psd2:B"};
    const std::string urls = std::string(host) + "/v1/records/psd2/B[1-" + std::to_string(requests) + "]";
    for (const auto& more : {server.curlOptions(), options, {urls}})
        command.insert(command.end(), more.begin(), more.end());
    for (auto step : state)
        require(exitStatusOf(start(command, -1, -1)) == 0, "curl");
    countRequests(state);
}

} // namespace

int main(int count, char** arguments) {
    benchmark::Initialize(&count, arguments);
    char name[] = "/tmp/veltra-bench-XXXXXX";
    require(mkdtemp(name), "no temporary folder");
    folder = name;
    setenv("VELTRA_DEVICE_ROOT", folder.c_str(), 1);
    {
        const Server server;
        benchmark::RegisterBenchmark("remote-put/veltra", putWithSession)->Arg(4096)->UseRealTime();
        benchmark::RegisterBenchmark("remote-put/curl",
                                     [&](benchmark::State& state) {
                                         runCurl(state, server, {"--upload-file", folder / "record"});
                                     })
            ->Arg(4096)
            ->UseRealTime();
        benchmark::RegisterBenchmark("remote-get/veltra", getWithSession)->Arg(4096)->UseRealTime();
        benchmark::RegisterBenchmark("remote-get/curl", [&](benchmark::State& state) { runCurl(state, server, {}); })
            ->Arg(4096)
            ->UseRealTime();
        benchmark::RunSpecifiedBenchmarks();
    }
    std::filesystem::remove_all(folder);
    return 0;
}
