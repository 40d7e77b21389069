// What a request costs beyond the bus: the whole frame of a request (reading it, its log lines, the look-up of the
// model) to the real service, beside a bare echo of the same messages written on sd-bus alone. Both are processes of
// their own on the bus in VELTRA_BUS; run it through scripts/bench, from the top of the source tree.
#include <cstddef>
#include <string>
#include <string_view>

#include <benchmark/benchmark.h>
#include <systemd/sd-bus.h>
#include <systemd/sd-daemon.h>
#include <systemd/sd-event.h>

#include "bench/ServiceOnBus.h"

namespace {

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
    check(sd_bus_add_object_vtable(bus, nullptr, echoPath, interfaceName, methods, nullptr));
    check(sd_bus_request_name(bus, echoName, 0));
    check(sd_bus_set_exit_on_disconnect(bus, 1));
    check(sd_bus_attach_event(bus, event, 0));
    sd_notify(0, "READY=1");
    return sd_event_loop(event);
}

void request(benchmark::State& state, const char* name, const char* path) {
    sd_bus* bus = openBus();
    const std::string text(static_cast<std::size_t>(state.range(0)), 'x');
    for (auto step : state)
        sd_bus_message_unref(
            call(bus, name, path, {{"messageStr", "noCommand"}, {"messageDict", Value::Dictionary{{"text", text}}}}));
    state.counters["ns_per_item"] = benchmark::Counter(static_cast<double>(state.iterations()) * 1e-9,
                                                       benchmark::Counter::kIsRate | benchmark::Counter::kInvert);
    sd_bus_flush_close_unref(bus);
}

} // namespace

int main(int count, char** arguments) {
    if (count > 1 && std::string_view(arguments[1]) == "--echo")
        return serveEchoes();
    benchmark::Initialize(&count, arguments);
    const Device device;
    const Server echo({arguments[0], "--echo"}), service({beside(arguments[0], "VeltraOrloServices")});
    benchmark::RegisterBenchmark("request/echo", request, echoName, echoPath)->Arg(16)->Arg(4096)->UseRealTime();
    benchmark::RegisterBenchmark("request/veltra", request, serviceName, servicePath)
        ->Arg(16)
        ->Arg(4096)
        ->UseRealTime();
    benchmark::RunSpecifiedBenchmarks();
    return 0;
}
