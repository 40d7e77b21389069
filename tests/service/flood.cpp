// flood ADDRESS CLIENTS CALLS COMMAND [MIB]: sends CALLS requests in all, of so many MiB, from CLIENTS connections at
// once, each keeping many in flight, and prints how many were completed. Exits with 0 when every one was.
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <string>
#include <vector>

#include <systemd/sd-bus.h>
#include <systemd/sd-event.h>

#include "platform/linux/services/bus/BusValue.h"

namespace {

struct Flood {
    sd_event* event = nullptr;
    int open = 0;
    int completed = 0;
    int failed = 0;
};

int onReply(sd_bus_message* reply, void* context, sd_bus_error*) {
    auto& flood = *static_cast<Flood*>(context);
    ++(sd_bus_message_is_method_error(reply, nullptr) ? flood.failed : flood.completed);
    return --flood.open == 0 ? sd_event_exit(flood.event, 0) : 0;
}

void check(int result) {
    if (result >= 0)
        return;
    std::fprintf(stderr, "flood: %s\n", bus::reasonOf(result).c_str());
    std::exit(2);
}

void send(sd_bus* bus, const char* command, const Value& filler, Flood& flood) {
    sd_bus_message* message = nullptr;
    check(sd_bus_message_new_method_call(bus, &message, "com.tevari.VeltraOrloServices",
                                         "/com/tevari/VeltraOrloServices", "com.tevari.VeltraPluginServer",
                                         "HandleMessage"));
    bus::appendDictionary(message, {{"messageStr", command}, {"messageDict", filler}});
    check(sd_bus_call_async(bus, nullptr, message, onReply, &flood, UINT64_MAX));
    sd_bus_message_unref(message);
    ++flood.open;
}

} // namespace

int main(int count, char** arguments) {
    if (count < 5)
        return 2;
    const int clients = std::atoi(arguments[2]);
    const int calls = std::atoi(arguments[3]);
    Value filler;
    if (count > 5)
        filler = Value::Dictionary{{"filler", Value::Data(std::strtoul(arguments[5], nullptr, 10) << 20)}};
    Flood flood;
    check(sd_event_default(&flood.event));
    std::vector<sd_bus*> buses(static_cast<std::size_t>(clients));
    for (sd_bus*& bus : buses) {
        check(bus::open(arguments[1], &bus));
        check(sd_bus_attach_event(bus, flood.event, SD_EVENT_PRIORITY_NORMAL));
    }
    for (int i = 0; i < calls; ++i)
        send(buses[static_cast<std::size_t>(i % clients)], arguments[4], filler, flood);
    check(sd_event_loop(flood.event));
    std::printf("%d completed, %d failed\n", flood.completed, flood.failed);
    for (sd_bus* bus : buses)
        sd_bus_flush_close_unref(bus);
    sd_event_unref(flood.event);
    return flood.completed == calls ? 0 : 1;
}
