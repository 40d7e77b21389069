// What a request costs beyond the bus: the whole frame of a request (reading it, its log lines, the look-up of the
// model) to the real service, beside a bare echo of the same messages written on sd-bus alone. Both are processes of
// their own on the bus in VELTRA_BUS; run it through scripts/bench, from the top of the source tree.
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <string>
#include <string_view>

#include <benchmark/benchmark.h>
#include <systemd/sd-bus.h>
#include <systemd/sd-daemon.h>
#include <systemd/sd-event.h>

#include "platform/linux/services/bus/BusValue.h"

namespace {

constexpr const char* interfaceName = "com.tevari.VeltraPluginServer";
constexpr const char* echoName = "com.tevari.VeltraOrloServices.Echo";
constexpr const char* serviceName = "com.tevari.VeltraOrloServices";

int check(int result) {
    if (result >= 0)
        return result;
    std::fprintf(stderr, "bench-request: %s\n", bus::reasonOf(result).c_str());
    std::exit(EXIT_FAILURE);
}

sd_bus* openBus() {
    const char* address = std::getenv("VELTRA_BUS");
    sd_bus* opened = nullptr;
    check(bus::open(address ? address : "session", &opened));
    return opened;
}

int onEcho(sd_bus_message* request, void*, sd_bus_error*) {
    sd_bus_message* reply = nullptr;
    const int completed = 1;
    check(sd_bus_message_new_method_return(request, &reply));
    check(sd_bus_message_append_basic(reply, 'b', &completed));
    check(sd_bus_message_copy(reply, request, 1));
    check(sd_bus_send(nullptr, reply, nullptr));
    sd_bus_message_unref(reply);
    return 1;
}

// The echo's process: the same method under another name.
int serveEchoes() {
    const sd_bus_vtable methods[] = {
        SD_BUS_VTABLE_START(0),
        SD_BUS_METHOD("HandleMessage", "a{sv}", "ba{sv}", onEcho, SD_BUS_VTABLE_UNPRIVILEGED),
        SD_BUS_VTABLE_END,
    };
    sd_bus* bus = openBus();
    sd_event* event = nullptr;
    check(sd_event_default(&event));
    check(sd_bus_add_object_vtable(bus, nullptr, "/echo", interfaceName, methods, nullptr));
    check(sd_bus_request_name(bus, echoName, 0));
    check(sd_bus_set_exit_on_disconnect(bus, 1));
    check(sd_bus_attach_event(bus, event, 0));
    sd_notify(0, "READY=1");
    return sd_event_loop(event);
}

// A process that has reported readiness; it ends with this object.
class Server {
public:
    explicit Server(const std::string& command) {
        std::FILE* output = popen(("scripts/start-service " + command).c_str(), "r");
        if (!output || std::fscanf(output, "%d", &pid_) != 1 || pclose(output) != 0) {
            std::fprintf(stderr, "bench-request: cannot start %s\n", command.c_str());
            std::exit(EXIT_FAILURE);
        }
    }
    ~Server() { kill(pid_, SIGTERM); }
    Server(const Server&) = delete;
    Server& operator=(const Server&) = delete;

private:
    pid_t pid_ = 0;
};

void call(benchmark::State& state, const char* name, const char* path) {
    sd_bus* bus = openBus();
    const std::string text(static_cast<std::size_t>(state.range(0)), 'x');
    for (auto step : state) {
        sd_bus_message *request = nullptr, *reply = nullptr;
        check(sd_bus_message_new_method_call(bus, &request, name, path, interfaceName, "HandleMessage"));
        bus::appendDictionary(request,
                              {{"messageStr", "noCommand"}, {"messageDict", Value::Dictionary{{"text", text}}}});
        check(sd_bus_call(bus, request, 0, nullptr, &reply));
        sd_bus_message_unref(request);
        sd_bus_message_unref(reply);
    }
    state.counters["ns_per_item"] = benchmark::Counter(static_cast<double>(state.iterations()) * 1e-9,
                                                       benchmark::Counter::kIsRate | benchmark::Counter::kInvert);
    sd_bus_flush_close_unref(bus);
}

void prepareDevice(const std::filesystem::path& root) {
    std::filesystem::copy("examples/device", root, std::filesystem::copy_options::recursive);
    std::filesystem::create_directories(root / "private/var/log");
    setenv("VELTRA_DEVICE_ROOT", root.c_str(), 1);
}

} // namespace

int main(int count, char** arguments) {
    if (count > 1 && std::string_view(arguments[1]) == "--echo")
        return serveEchoes();
    benchmark::Initialize(&count, arguments);
    char folder[] = "/tmp/veltra-bench-XXXXXX";
    if (!mkdtemp(folder))
        return EXIT_FAILURE;
    prepareDevice(std::filesystem::path(folder) / "device");
    const std::string program = arguments[0];
    {
        const Server echo(program + " --echo");
        const Server service((std::filesystem::path(program).parent_path() / "VeltraOrloServices").string());
        benchmark::RegisterBenchmark("request/echo", call, echoName, "/echo")->Arg(16)->Arg(4096)->UseRealTime();
        benchmark::RegisterBenchmark("request/veltra", call, serviceName, "/com/tevari/VeltraOrloServices")
            ->Arg(16)
            ->Arg(4096)
            ->UseRealTime();
        benchmark::RunSpecifiedBenchmarks();
    }
    std::filesystem::remove_all(folder);
    return 0;
}
