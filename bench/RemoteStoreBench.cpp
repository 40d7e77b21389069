// What a record of 4 KiB costs through the service on a remote store: requests that put and get it, beside the curl
// command line with as many requests for the same object on one connection. The store is an nginx on loopback, or the
// S3 gateway of Ceph where the argument "ceph" says so, for which it has to be installed. For each request the service
// fetches the trust object twice besides and, on the object store, asks for the record's tag before it puts.
#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>
#include <span>
#include <sstream>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <unistd.h>

#include "bench/ServiceOnBus.h"
#include "platform/Crypto.h"
#include "platform/Hexadecimal.h"
#include "platform/Json.h"

namespace {

constexpr int requests = 200;
constexpr std::size_t recordSize = 4096;
constexpr const char* host = "orlo-ds.tevari.example:8443";
constexpr std::string_view trustObject = "the trust object of the lab\n";

std::string readFile(const std::filesystem::path& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

std::string digestOf(std::string_view text) {
    std::uint8_t digest[crypto::sha256Size];
    require(crypto::sha256(reinterpret_cast<const std::uint8_t*>(text.data()), text.size(), digest), "no digest");
    return hexadecimal(digest);
}

std::string percentEncoded(std::string_view text) {
    std::string encoded;
    for (const char c : text)
        (encoded += '%') += hexadecimal(std::span(reinterpret_cast<const std::uint8_t*>(&c), 1));
    return encoded;
}

// A store of the lab and the service that uses it; both end with this object.
class Store {
public:
    Store(const std::string& kind, const std::string& service) {
        int input[2], output[2];
        require(pipe2(input, O_CLOEXEC) == 0 && pipe2(output, O_CLOEXEC) == 0, "no pipes");
        lab_ = start({"examples/remote-store/lab.py", kind, device_.root}, input[0], output[1]);
        close(input[0]);
        close(output[1]);
        input_ = input[1];
        std::string announcement;
        for (char c = 0; read(output[0], &c, 1) == 1 && c != '\n';)
            announcement += c;
        close(output[0]);
        store_ = jsonToValue(announcement).value_or(Value());
        require(store_.dictionary(), "no server");
        std::ofstream(record(), std::ios::binary) << std::string(recordSize, 'r');
        service_ = std::make_unique<Server>(std::vector{service});
        bus_ = openBus();
    }
    ~Store() {
        sd_bus_flush_close_unref(bus_);
        service_.reset();
        close(input_);
        exitStatusOf(lab_);
    }
    Store(const Store&) = delete;
    Store& operator=(const Store&) = delete;

    void put() {
        answer({{"messageStr", "putPSD2"}, {"messageDict", Value::Dictionary{{"psd2DataPath", "/tmp/record"}}}});
    }

    void get() {
        answer({{"messageStr", "getPSD2"}, {"messageDict", Value::Dictionary{{"psd2V4DataPath", "/tmp/got"}}}});
        require(readFile(device_.root / "tmp/got").size() == recordSize, "the record has changed");
    }

    // What curl has to be told for the same object, as many times as a run has requests.
    std::vector<std::string> curl() const {
        std::vector<std::string> words = {"curl",
                                          "--silent",
                                          "--fail",
                                          "--output",
                                          "/dev/null",
                                          "--cacert",
                                          device_.root / "store-ca.pem",
                                          "--header",
                                          "Orlo-Trust-Object-Digest: " + digestOf(trustObject)};
        for (const auto& [from, to] : *store_["connectTo"].dictionary())
            words.insert(words.end(), {"--connect-to", from + ":" + *to.text()});
        std::string user, bucket;
        if (const Value& s3 = store_["s3"]; s3.dictionary()) {
            std::istringstream keys(readFile(device_.root / "store-key"));
            std::string key, secret;
            keys >> key >> secret;
            user = percentEncoded(key) + ":" + percentEncoded(secret) + "@";
            bucket = "/" + *s3["bucket"].text();
            words.insert(words.end(), {"--aws-sigv4", "aws:amz:" + *s3["region"].text() + ":s3", "--header",
                                       "x-amz-content-sha256: UNSIGNED-PAYLOAD"});
        }
        // What follows the hash is not sent.
        words.push_back("https://" + user + host + bucket + "/v2/records/psd2/VAN0001#[1-" + std::to_string(requests) +
                        "]");
        return words;
    }

    std::filesystem::path record() const { return device_.root / "tmp/record"; }

private:
    void answer(const Value::Dictionary& request) {
        sd_bus_message* const reply = call(bus_, serviceName, servicePath, request);
        int completed = 0;
        check(sd_bus_message_read_basic(reply, SD_BUS_TYPE_BOOLEAN, &completed));
        const Value response = bus::readDictionary(reply);
        require(response["statusCode"] == Value(0), "the service answered " + response.description());
        sd_bus_message_unref(reply);
    }

    Device device_;
    pid_t lab_;
    int input_;
    Value store_;
    std::unique_ptr<Server> service_;
    sd_bus* bus_ = nullptr;
};

void countRequests(benchmark::State& state) {
    state.counters["ns_per_item"] = benchmark::Counter(static_cast<double>(state.iterations()) * requests * 1e-9,
                                                       benchmark::Counter::kIsRate | benchmark::Counter::kInvert);
}

} // namespace

int main(int count, char** arguments) {
    benchmark::Initialize(&count, arguments);
    Store store(count > 1 ? arguments[1] : "nginx", beside(arguments[0], "VeltraOrloServices"));
    store.put();
    const auto add = [](const std::string& name, auto run) {
        benchmark::RegisterBenchmark(name.c_str(),
                                     [run](benchmark::State& state) {
                                         for (auto step : state)
                                             run();
                                         countRequests(state);
                                     })
            ->Arg(recordSize)
            ->UseRealTime();
    };
    const auto service = [&](void (Store::*request)()) {
        return [&store, request] {
            for (int number = 0; number < requests; ++number)
                (store.*request)();
        };
    };
    const auto curl = [&](const std::vector<std::string>& more) {
        std::vector<std::string> words = store.curl();
        words.insert(words.end() - 1, more.begin(), more.end());
        return [words] { require(exitStatusOf(start(words, -1, -1)) == 0, "curl failed"); };
    };
    add("remote-put/veltra", service(&Store::put));
    add("remote-put/curl", curl({"--upload-file", store.record()}));
    add("remote-get/veltra", service(&Store::get));
    add("remote-get/curl", curl({}));
    benchmark::RunSpecifiedBenchmarks();
    return 0;
}
