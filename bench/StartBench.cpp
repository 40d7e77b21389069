// How long the service takes from its start to its first answer, beside the bare echo of bench-request, which loads
// libsystemd alone.
#include <memory>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>

#include "bench/ServiceOnBus.h"

namespace {

// The end of the process is not counted.
void startUp(benchmark::State& state, const std::vector<std::string>& command, const char* name, const char* path) {
    sd_bus* bus = openBus();
    for (auto step : state) {
        auto server = std::make_unique<Server>(command);
        sd_bus_message_unref(call(bus, name, path, {{"messageStr", "noCommand"}}));
        state.PauseTiming();
        server.reset();
        state.ResumeTiming();
    }
    sd_bus_flush_close_unref(bus);
}

} // namespace

int main(int count, char** arguments) {
    benchmark::Initialize(&count, arguments);
    const Device device;
    const std::vector<std::string> service = {beside(arguments[0], "VeltraOrloServices")},
                                   echo = {beside(arguments[0], "bench-request"), "--echo"};
    benchmark::RegisterBenchmark("start/veltra", startUp, service, serviceName, servicePath)->UseRealTime();
    benchmark::RegisterBenchmark("start/echo", startUp, echo, echoName, echoPath)->UseRealTime();
    benchmark::RunSpecifiedBenchmarks();
    return 0;
}
