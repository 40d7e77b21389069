// A bus connection that leads nowhere: enough to make, seal and read messages without a bus daemon.
#ifndef VELTRA_TESTS_SUPPORT_LOOSE_BUS_H
#define VELTRA_TESTS_SUPPORT_LOOSE_BUS_H

#include <cstdlib>
#include <memory>

#include <sys/socket.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

class LooseBus {
public:
    using Message = std::unique_ptr<sd_bus_message, decltype(&sd_bus_message_unref)>;

    LooseBus() {
        require(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends_));
        require(sd_bus_new(&bus_));
        require(sd_bus_set_fd(bus_, ends_[0], ends_[0]));
        require(sd_bus_start(bus_));
    }
    ~LooseBus() {
        sd_bus_close_unref(bus_);
        close(ends_[1]);
    }
    LooseBus(const LooseBus&) = delete;
    LooseBus& operator=(const LooseBus&) = delete;

    // A new message to write to.
    Message message() {
        sd_bus_message* made = nullptr;
        require(sd_bus_message_new_method_call(bus_, &made, "a.b", "/a", "a.b", "C"));
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
    int ends_[2] = {-1, -1};
    sd_bus* bus_ = nullptr;
};

#endif
