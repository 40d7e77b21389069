// The host plug-in framework as a D-Bus service: the interface com.tevari.VeltraPluginServer with its one method
//
//   HandleMessage(in a{sv} request, out b completed, out a{sv} response)
//
// The request has the keys "messageStr" (s) and "messageDict" (a{sv}), either of which may be absent. The response has
// "name", "statusCode", "response" and "error" (with "domain", "code" and "description"), the last two only when there
// is one, and is empty when the request was completed with no response object. The environment variable VELTRA_BUS
// chooses the bus: "system" (the default), "session", or a D-Bus address.
#include "platform/HostFramework.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <memory>
#include <new>
#include <system_error>
#include <utility>

#include <systemd/sd-bus.h>
#include <systemd/sd-daemon.h>
#include <systemd/sd-event.h>

#include "platform/Crypto.h"
#include "platform/DeviceRoot.h"
#include "platform/SystemLog.h"
#include "platform/linux/services/bus/BusValue.h"
#include "platform/linux/services/device/DeviceDescription.h"
#include "platform/linux/services/http/Http.h"

namespace {

constexpr const char* interfaceName = "com.tevari.VeltraPluginServer";

std::string busInUse() {
    const char* chosen = std::getenv("VELTRA_BUS");
    return chosen && *chosen ? chosen : "system";
}

// A service name as an object path: "/" and the name with its dots as slashes.
std::string objectPath(std::string_view serviceName) {
    std::string path = "/" + std::string(serviceName);
    std::replace(path.begin(), path.end(), '.', '/');
    return path;
}

void checkKeys(const Value::Dictionary& request) {
    for (const auto& [key, value] : request) {
        if (key == "messageStr") {
            if (!value.text())
                throw bus::Refusal("The value of key \"messageStr\" is no text.");
        } else if (key == "messageDict") {
            if (!value.dictionary())
                throw bus::Refusal("The value of key \"messageDict\" is no dictionary with text keys.");
        } else {
            throw bus::Refusal("A request has no key \"" + key + "\"; it has \"messageStr\" and \"messageDict\".");
        }
    }
}

HSMessageRequest readRequest(sd_bus_message* message) {
    Value::Dictionary request = bus::readDictionary(message);
    checkKeys(request);
    return {std::move(request["messageStr"]), std::move(request["messageDict"])};
}

void appendResponse(sd_bus_message* message, const HSMessageResponse& response) {
    Value error;
    if (const auto& given = response.error())
        error = Value::Dictionary{{"domain", given->domain}, {"code", given->code}, {"description", given->text}};
    const Value statusCode = response.statusCode();
    bus::appendEntries(message, {{"error", &error},
                                 {"name", &response.name()},
                                 {"response", &response.response()},
                                 {"statusCode", &statusCode}});
}

// Raises what bus::check does when nothing was sent.
void sendReply(sd_bus_message* request, bool completed, const std::optional<HSMessageResponse>& response) {
    sd_bus_message* reply = nullptr;
    bus::check(sd_bus_message_new_method_return(request, &reply));
    const std::unique_ptr<sd_bus_message, decltype(&sd_bus_message_unref)> owner(reply, sd_bus_message_unref);
    const int completedValue = completed;
    bus::check(sd_bus_message_append_basic(reply, SD_BUS_TYPE_BOOLEAN, &completedValue));
    if (response)
        appendResponse(reply, *response);
    else
        bus::appendEntries(reply, {});
    bus::check(sd_bus_send(nullptr, reply, nullptr));
}

int serve(VeltraPluginServerInterface& server, sd_bus_message* message) {
    const HSMessageRequest request = readRequest(message);
    bool replied = false;
    server.handleMessage(request, [&](bool completed, const std::optional<HSMessageResponse>& response) {
        sendReply(message, completed, response);
        replied = true;
    });
    return replied ? 1 : sd_bus_reply_method_errorf(message, SD_BUS_ERROR_FAILED, "The request was not completed.");
}

// sd-bus calls back through C, which no exception may cross: each becomes an error reply.
int handleMessageMethod(sd_bus_message* message, void* server, sd_bus_error*) {
    try {
        return serve(*static_cast<VeltraPluginServer*>(server), message);
    } catch (const bus::Refusal& refusal) {
        return sd_bus_reply_method_errorf(message, SD_BUS_ERROR_INVALID_ARGS, "%s", refusal.what());
    } catch (const std::system_error& failure) {
        return sd_bus_reply_method_errnof(message, failure.code().value(), "Cannot carry the message: %s",
                                          failure.what());
    } catch (const std::bad_alloc&) {
        return sd_bus_reply_method_errorf(message, SD_BUS_ERROR_NO_MEMORY, "Out of memory.");
    } catch (const std::exception& failure) {
        return sd_bus_reply_method_errorf(message, SD_BUS_ERROR_FAILED, "%s", failure.what());
    }
}

// The bus policy decides who may call; the method itself asks no privilege of the caller.
const sd_bus_vtable methods[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_METHOD_WITH_NAMES("HandleMessage", "a{sv}", SD_BUS_PARAM(request), "ba{sv}",
                             SD_BUS_PARAM(completed) SD_BUS_PARAM(response), handleMessageMethod,
                             SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_VTABLE_END,
};

// From here on SIGTERM and SIGINT arrive through the event loop, between two requests. The mask is inherited by every
// thread that is made later.
int watchSignals(sd_event* event) {
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGTERM);
    sigaddset(&signals, SIGINT);
    if (pthread_sigmask(SIG_BLOCK, &signals, nullptr) != 0)
        return -errno;
    for (const int signal : {SIGTERM, SIGINT}) {
        sd_event_source* source = nullptr;
        int result = sd_event_add_signal(event, &source, signal, nullptr, nullptr);
        if (result >= 0)
            result = sd_event_source_set_priority(source, SD_EVENT_PRIORITY_IMPORTANT);
        if (result >= 0)
            result = sd_event_source_set_floating(source, 1);
        sd_event_source_unref(source);
        if (result < 0)
            return result;
    }
    return 0;
}

} // namespace

SystemLog* getLogHandle(int number) {
    static SystemLog* const log = systemLogCreate(interfaceName, "framework");
    return number == 1 ? log : nullptr;
}

struct VeltraPluginServer::Connection {
    sd_event* event = nullptr;
    sd_bus* bus = nullptr;
};

VeltraPluginServer::~VeltraPluginServer() {
    if (!connection_)
        return;
    sd_bus_flush_close_unref(connection_->bus);
    sd_event_unref(connection_->event);
    delete connection_;
}

bool VeltraPluginServer::initWithServiceName(std::string_view serviceName) {
    const std::string name(serviceName);
    const std::string which = busInUse();
    connection_ = new Connection;
    http::prepare();
    if (!crypto::prepare()) {
        consoleLog(name + ": cannot set up the cryptographic library");
        return false;
    }
    if (!openDeviceRoot()) {
        consoleLog(name + ": cannot open the device root \"" + deviceRootPath() + "\": " + std::strerror(errno));
        return false;
    }
    int result = bus::open(which, &connection_->bus);
    if (result >= 0)
        result = sd_bus_add_object_vtable(connection_->bus, nullptr, objectPath(name).c_str(), interfaceName, methods,
                                          static_cast<VeltraPluginServer*>(this));
    // The first call that waits for the bus.
    const char* uniqueName = nullptr;
    if (result >= 0)
        result = sd_bus_get_unique_name(connection_->bus, &uniqueName);
    if (result < 0) {
        consoleLog(name + ": cannot reach the bus \"" + which + "\": " + bus::reasonOf(result));
        return false;
    }
    result = sd_bus_request_name(connection_->bus, name.c_str(), 0);
    if (result < 0) {
        consoleLog(name + ": cannot own this name on the bus \"" + which +
                   "\": " + (result == -EEXIST ? "another process owns it already" : bus::reasonOf(result)));
        return false;
    }
    return true;
}

void VeltraPluginServer::resume() {
    int result = sd_event_new(&connection_->event);
    if (result >= 0)
        result = watchSignals(connection_->event);
    if (result >= 0)
        result = sd_bus_set_exit_on_disconnect(connection_->bus, 1);
    if (result >= 0)
        result = sd_bus_attach_event(connection_->bus, connection_->event, SD_EVENT_PRIORITY_NORMAL);
    if (result >= 0) {
        (void)deviceDescription(); // says what is wrong with it before the first request needs it
        sd_notify(0, "READY=1");
        result = sd_event_loop(connection_->event);
    }
    sd_notify(0, "STOPPING=1");
    if (result != 0)
        consoleLog(result < 0 ? "cannot serve requests: " + bus::reasonOf(result) : "the bus closed the connection");
    sd_bus_flush(connection_->bus);
    std::exit(result == 0 ? EXIT_SUCCESS : EXIT_FAILURE);
}
