// A bus connection that leads nowhere: enough to make, seal and read messages without a bus daemon.
#ifndef VELTRA_TESTS_SUPPORT_LOOSE_BUS_H
#define VELTRA_TESTS_SUPPORT_LOOSE_BUS_H

#include <cstdlib>
#include <memory>

#include <sys/socket.h>
#include <systemd/sd-bus.h>

class LooseBus {
public:
    using Message = std::unique_ptr<sd_bus_message, decltype(&sd_bus_message_unref)>;

    // A new message to write to.
    static Message message() {
        static sd_bus* const bus = connect(); // never ended: messages may live as long as the process
        sd_bus_message* made = nullptr;
        require(sd_bus_message_new_method_call(bus, &made, "a.b", "/a", "a.b", "C"));
        return {made, sd_bus_message_unref};
    }

    // Ends the writing of `message` and puts its reader at the start.
    static void finish(const Message& message) {
        require(sd_bus_message_seal(message.get(), 1, 0));
        require(sd_bus_message_rewind(message.get(), 1));
    }

    static void require(int result) {
        if (result < 0)
            std::abort();
    }

private:
    static sd_bus* connect() {
        int ends[2];
        sd_bus* bus = nullptr;
        require(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends));
        require(sd_bus_new(&bus));
        require(sd_bus_set_fd(bus, ends[0], ends[0]));
        require(sd_bus_start(bus));
        return bus;
    }
};

#endif
