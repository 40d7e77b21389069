// The host plug-in framework as a D-Bus service: the interface com.tevari.VeltraPluginServer, which
// packaging/com.tevari.VeltraPluginServer.xml documents. The environment variable VELTRA_BUS chooses the bus: "system"
// (the default), "session", or a D-Bus address.
//
// The thread that resumes the server owns the bus and all that is here; RequestThread serves the requests.
#include "platform/HostFramework.h"

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <deque>
#include <exception>
#include <map>
#include <memory>
#include <new>
#include <optional>
#include <stdexcept>
#include <string>
#include <system_error>
#include <utility>

#include <poll.h>
#include <sys/epoll.h>
#include <systemd/sd-bus.h>
#include <systemd/sd-daemon.h>
#include <systemd/sd-event.h>

#include "platform/Crypto.h"
#include "platform/DeviceRoot.h"
#include "platform/SystemLog.h"
#include "platform/linux/services/bus/BusValue.h"
#include "platform/linux/services/bus/RequestThread.h"
#include "platform/linux/services/device/DeviceDescription.h"
#include "platform/linux/services/http/Http.h"
#include "platform/linux/services/store/OrloStoreBackend.h"

namespace {

using MessagePtr = std::unique_ptr<sd_bus_message, decltype(&sd_bus_message_unref)>;

constexpr const char* interfaceName = "com.tevari.VeltraPluginServer";

// What the requests that wait may hold, in octets of their messages.
constexpr std::size_t maximumWaiting = std::size_t{64} << 20;
constexpr std::size_t maximumWaitingOfSender = std::size_t{16} << 20;
constexpr std::size_t octetsBesideContents = 1024; // what the library keeps for each message

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

// A request as it came. Raises bus::Refusal for what is none.
struct Request {
    explicit Request(sd_bus_message* message) {
        Value::Dictionary contents = bus::readDictionary(message, &octets);
        octets += octetsBesideContents;
        for (auto& [key, value] : contents) {
            if (key == "messageStr") {
                if (!value.text())
                    throw bus::Refusal("The value of key \"messageStr\" is no text.");
                content.messageStr = std::move(value);
            } else if (key == "messageDict") {
                if (!value.dictionary())
                    throw bus::Refusal("The value of key \"messageDict\" is no dictionary with text keys.");
                content.messageDict = std::move(value);
            } else if (key == "messages") {
                if (!value.isBoolean())
                    throw bus::Refusal("The value of key \"messages\" is no boolean.");
                wantsMessages = *value.boolean();
            } else {
                throw bus::Refusal("A request has no key \"" + key +
                                   "\"; it has \"messageStr\", \"messageDict\" and \"messages\".");
            }
        }
    }

    HSMessageRequest content;
    bool wantsMessages = false;
    std::size_t octets = 0; // of the message
};

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
    const MessagePtr owner(reply, sd_bus_message_unref);
    const int completedValue = completed;
    bus::check(sd_bus_message_append_basic(reply, SD_BUS_TYPE_BOOLEAN, &completedValue));
    if (response)
        appendResponse(reply, *response);
    else
        bus::appendEntries(reply, {});
    bus::check(sd_bus_send(nullptr, reply, nullptr));
}

// Replies with the error that stands for what is being handled.
int replyWithFailure(sd_bus_message* request) {
    try {
        throw;
    } catch (const bus::Refusal& refusal) {
        return sd_bus_reply_method_errorf(request, SD_BUS_ERROR_INVALID_ARGS, "%s", refusal.what());
    } catch (const std::system_error& failure) {
        return sd_bus_reply_method_errnof(request, failure.code().value(), "Cannot carry the message: %s",
                                          failure.what());
    } catch (const std::bad_alloc&) {
        return sd_bus_reply_method_errorf(request, SD_BUS_ERROR_NO_MEMORY, "Out of memory.");
    } catch (const std::exception& failure) {
        return sd_bus_reply_method_errorf(request, SD_BUS_ERROR_FAILED, "%s", failure.what());
    }
}

// The requests between the bus and the thread that serves them.
class Requests final : public RequestReceiver {
public:
    Requests(sd_event* event, sd_bus* bus, std::string path, VeltraPluginServerInterface& server)
        : event_(event), bus_(bus), path_(std::move(path)), thread_(server) {}

    RequestThread& thread() { return thread_; }
    const std::string& commandInHand() const { return command_; }
    std::uint64_t started() const { return started_; }
    std::size_t waiting() const { return waiting_.size(); }

    // Takes a request from the bus: to be served now, to wait, or to be refused. Returns what sd-bus takes for handled.
    int add(sd_bus_message* message) try {
        Request request(message);
        if (isStopping_)
            return refuseAtStop(message);
        if (!inHand_)
            return serve(message, std::move(request));
        const std::string sender = sd_bus_message_get_sender(message);
        const auto held = octetsOfSenders_.find(sender);
        if (request.octets > maximumWaiting - waitingOctets_ ||
            request.octets > maximumWaitingOfSender - (held == octetsOfSenders_.end() ? 0 : held->second))
            return sd_bus_reply_method_errorf(message, SD_BUS_ERROR_LIMITS_EXCEEDED,
                                              "The requests that wait hold too much already.");
        std::size_t& octetsOfSender = octetsOfSenders_[sender];
        waiting_.push_back({referenceTo(message), request.octets});
        octetsOfSender += request.octets;
        waitingOctets_ += request.octets;
        return 1;
    } catch (...) {
        return replyWithFailure(message);
    }

    // Drops what waits for a reply that nobody can get, since its sender has left the bus.
    void dropOf(const std::string& sender) {
        if (!octetsOfSenders_.contains(sender))
            return;
        std::erase_if(waiting_, [&](const Waiting& request) {
            if (sd_bus_message_get_sender(request.message.get()) != sender ||
                sd_bus_message_get_expect_reply(request.message.get()) == 0)
                return false;
            release(request);
            return true;
        });
    }

    // Refuses what waits and what comes, and ends the loop once the request in hand has been served.
    void stop() {
        isStopping_ = true;
        for (; !waiting_.empty(); waiting_.pop_front())
            refuseAtStop(waiting_.front().message.get());
        if (!inHand_)
            sd_event_exit(event_, EXIT_SUCCESS);
    }

    // Waits for the request in hand, without the bus, and ends the thread.
    void finish() {
        waiting_.clear();
        while (inHand_) {
            pollfd wakeUp = {thread_.wakeUp().get(), POLLIN, 0};
            (void)::poll(&wakeUp, 1, -1);
            thread_.take(*this);
        }
        thread_.end();
    }

    void receive(const RequestMessage& message) override try {
        sd_bus_message* signal = nullptr;
        bus::check(sd_bus_message_new_signal(bus_, &signal, path_.c_str(), interfaceName, "Message"));
        const MessagePtr owner(signal, sd_bus_message_unref);
        bus::check(sd_bus_message_set_destination(signal, sd_bus_message_get_sender(inHand_.get())));
        bus::check(sd_bus_message_append_basic(signal, SD_BUS_TYPE_INT32, &message.level));
        bus::appendText(signal, message.source);
        bus::appendText(signal, message.text);
        bus::check(sd_bus_send(bus_, signal, nullptr));
    } catch (const std::exception&) {
        return; // the request does not depend on it
    }

    void receive(const RequestEnding& ending) override {
        if (ending.response) {
            sendReply(inHand_.get(), ending.completed, *ending.response);
        } else {
            try {
                std::rethrow_exception(ending.failure);
            } catch (...) {
                replyWithFailure(inHand_.get());
            }
        }
        inHand_.reset();
        command_.clear();
        started_ = 0;
        serveNext();
    }

private:
    struct Waiting {
        MessagePtr message;
        std::size_t octets;
    };

    static MessagePtr referenceTo(sd_bus_message* message) {
        return {sd_bus_message_ref(message), sd_bus_message_unref};
    }

    static int refuseAtStop(sd_bus_message* message) {
        return sd_bus_reply_method_errorf(message, SD_BUS_ERROR_FAILED,
                                          "The service ends and has not begun with the request.");
    }

    int serve(sd_bus_message* message, Request request) {
        const std::string* named = request.content.messageStr.text();
        std::string command = named ? *named : "";
        thread_.serve(std::move(request.content), request.wantsMessages);
        inHand_ = referenceTo(message);
        command_ = std::move(command);
        started_ = static_cast<std::uint64_t>(
            std::chrono::duration_cast<std::chrono::microseconds>(std::chrono::system_clock::now().time_since_epoch())
                .count());
        return 1;
    }

    void serveNext() {
        while (!inHand_ && !waiting_.empty()) {
            const Waiting next = std::move(waiting_.front());
            waiting_.pop_front();
            release(next);
            try {
                bus::check(sd_bus_message_rewind(next.message.get(), 1));
                serve(next.message.get(), Request(next.message.get()));
            } catch (...) {
                replyWithFailure(next.message.get());
            }
        }
        if (!inHand_ && isStopping_)
            sd_event_exit(event_, EXIT_SUCCESS);
    }

    void release(const Waiting& request) {
        waitingOctets_ -= request.octets;
        const auto octets = octetsOfSenders_.find(sd_bus_message_get_sender(request.message.get()));
        octets->second -= request.octets;
        if (octets->second == 0)
            octetsOfSenders_.erase(octets);
    }

    sd_event* const event_;
    sd_bus* const bus_;
    const std::string path_;
    bool isStopping_ = false;

    MessagePtr inHand_{nullptr, sd_bus_message_unref};
    std::string command_;
    std::uint64_t started_ = 0;

    std::deque<Waiting> waiting_;
    std::size_t waitingOctets_ = 0;
    std::map<std::string, std::size_t> octetsOfSenders_; // of those that have any

    RequestThread thread_;
};

// The server's end of the bus.
struct Host {
    VeltraPluginServerInterface& server;
    std::string version;
    std::string path;
    sd_event* event = nullptr;
    sd_bus* bus = nullptr;
    Requests* requests = nullptr; // never destroyed: threads may log until the process is gone
};

// sd-bus calls back through C, which no exception may cross.
int onRequest(sd_bus_message* message, void* host, sd_bus_error*) {
    return static_cast<Host*>(host)->requests->add(message);
}

int onDeparture(sd_bus_message* message, void* host, sd_bus_error*) try {
    const char* name = nullptr;
    bus::check(sd_bus_message_read_basic(message, SD_BUS_TYPE_STRING, &name));
    static_cast<Host*>(host)->requests->dropOf(name);
    return 0;
} catch (const std::exception&) {
    return 0;
}

int onProperty(sd_bus*, const char*, const char*, const char* name, sd_bus_message* reply, void* host,
               sd_bus_error*) try {
    const auto& [server, version, path, event, bus, requests] = *static_cast<const Host*>(host);
    const std::string_view wanted = name;
    if (wanted == "RequestStarted")
        return sd_bus_message_append(reply, "t", requests->started());
    if (wanted == "RequestsWaiting")
        return sd_bus_message_append(reply, "u", static_cast<std::uint32_t>(requests->waiting()));
    bus::appendText(reply, wanted == "Version"      ? version
                           : wanted == "DeviceRoot" ? deviceRootPath()
                           : wanted == "StoreState" ? orloStoreState()
                                                    : requests->commandInHand());
    return 0;
} catch (const std::exception&) {
    return -ENOMEM;
}

int onWakeUp(sd_event_source*, int, std::uint32_t, void* host) {
    auto& requests = *static_cast<Host*>(host)->requests;
    requests.thread().take(requests);
    return 0;
}

int onStop(sd_event_source*, const signalfd_siginfo*, void* host) {
    static_cast<Host*>(host)->requests->stop();
    return 0;
}

// The bus policy decides who may call; the interface itself asks no privilege of the caller. A change of a property is
// told to nobody, since everybody on the bus would hear of it.
const sd_bus_vtable members[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_METHOD_WITH_NAMES("HandleMessage", "a{sv}", SD_BUS_PARAM(request), "ba{sv}",
                             SD_BUS_PARAM(completed) SD_BUS_PARAM(response), onRequest, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_SIGNAL_WITH_NAMES("Message", "iss", SD_BUS_PARAM(level) SD_BUS_PARAM(source) SD_BUS_PARAM(text), 0),
    SD_BUS_PROPERTY("DeviceRoot", "s", onProperty, 0, 0),
    SD_BUS_PROPERTY("RequestInHand", "s", onProperty, 0, 0),
    SD_BUS_PROPERTY("RequestStarted", "t", onProperty, 0, 0),
    SD_BUS_PROPERTY("RequestsWaiting", "u", onProperty, 0, 0),
    SD_BUS_PROPERTY("StoreState", "s", onProperty, 0, 0),
    SD_BUS_PROPERTY("Version", "s", onProperty, 0, 0),
    SD_BUS_VTABLE_END,
};

constexpr const char* departures =
    "type='signal',sender='org.freedesktop.DBus',path='/org/freedesktop/DBus',interface='org.freedesktop.DBus',"
    "member='NameOwnerChanged',arg2=''";

// From here on SIGTERM and SIGINT arrive through the event loop, before whatever else has come: no request begins after
// one. The mask is inherited by every thread that is made later.
int watchSignals(Host& host) {
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGTERM);
    sigaddset(&signals, SIGINT);
    if (pthread_sigmask(SIG_BLOCK, &signals, nullptr) != 0)
        return -errno;
    for (const int signal : {SIGTERM, SIGINT}) {
        sd_event_source* source = nullptr;
        int result = sd_event_add_signal(host.event, &source, signal, onStop, &host);
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

// The thread of the requests, to which their log lines are passed.
std::atomic<RequestThread*> requestThread = nullptr;

// Has the request in hand keep what it logs: the lines of the framework's handle, and those of the plug-in's log,
// "<time>-[<source>:<number>] <text>\n".
void passOn(const SystemLog* log, SystemLogType type, std::string_view message) noexcept {
    RequestThread* const thread = requestThread;
    if (log == getLogHandle(1))
        return thread->addMessage(type == SystemLogType::Error ? 4 : 2, "framework", message);
    const std::size_t source = message.find('[') + 1;
    const std::size_t text = message.find("] ", source);
    if (text == std::string_view::npos || !message.ends_with('\n'))
        return thread->addMessage(static_cast<int>(type) + 1, "", message);
    thread->addMessage(static_cast<int>(type) + 1, message.substr(source, message.find(':', source) - source),
                       message.substr(text + 2, message.size() - text - 3));
}

int startRequests(Host& host) try {
    host.requests = new Requests(host.event, host.bus, host.path, host.server);
    requestThread = &host.requests->thread();
    systemLogWatch(passOn);
    return sd_event_add_io(host.event, nullptr, requestThread.load()->wakeUp().get(), EPOLLIN, onWakeUp, &host);
} catch (const std::system_error& failure) {
    return -failure.code().value();
}

} // namespace

SystemLog* getLogHandle(int number) {
    static SystemLog* const log = systemLogCreate(interfaceName, "framework");
    return number == 1 ? log : nullptr;
}

struct VeltraPluginServer::Connection : Host {};

VeltraPluginServer::~VeltraPluginServer() {
    if (!connection_)
        return;
    sd_bus_flush_close_unref(connection_->bus);
    delete connection_;
}

bool VeltraPluginServer::initWithServiceName(std::string_view serviceName, std::string_view version) {
    const std::string name(serviceName);
    const std::string which = busInUse();
    connection_ = new Connection{{*this, std::string(version), objectPath(name)}};
    Host* const host = connection_;
    http::prepare();
    if (!crypto::prepare()) {
        consoleLog(name + ": cannot set up the cryptographic library");
        return false;
    }
    if (!openDeviceRoot()) {
        consoleLog(name + ": cannot open the device root \"" + deviceRootPath() + "\": " + std::strerror(errno));
        return false;
    }
    int result = bus::open(which, &host->bus);
    if (result >= 0)
        result = sd_bus_add_object_vtable(host->bus, nullptr, host->path.c_str(), interfaceName, members, host);
    // The first call that waits for the bus.
    if (result >= 0)
        result = sd_bus_add_match(host->bus, nullptr, departures, onDeparture, host);
    if (result < 0) {
        consoleLog(name + ": cannot reach the bus \"" + which + "\": " + bus::reasonOf(result));
        return false;
    }
    result = sd_bus_request_name(host->bus, name.c_str(), 0);
    if (result < 0) {
        consoleLog(name + ": cannot own this name on the bus \"" + which +
                   "\": " + (result == -EEXIST ? "another process owns it already" : bus::reasonOf(result)));
        return false;
    }
    return true;
}

void VeltraPluginServer::resume() {
    Host& host = *connection_;
    int result = sd_event_new(&host.event);
    if (result >= 0)
        result = watchSignals(host);
    if (result >= 0)
        result = startRequests(host);
    if (result >= 0)
        result = sd_bus_set_exit_on_disconnect(host.bus, 1);
    if (result >= 0)
        result = sd_bus_attach_event(host.bus, host.event, SD_EVENT_PRIORITY_NORMAL);
    if (result >= 0) {
        (void)deviceDescription(); // says what is wrong with it before the first request needs it
        sd_notify(0, "READY=1");
        result = sd_event_loop(host.event);
    }
    sd_notify(0, "STOPPING=1");
    if (result != 0)
        consoleLog(result < 0 ? "cannot serve requests: " + bus::reasonOf(result) : "the bus closed the connection");
    if (host.requests)
        host.requests->finish();
    sd_bus_flush(host.bus);
    std::exit(result == 0 ? EXIT_SUCCESS : EXIT_FAILURE);
}
