#include "tools/orloctl/Client.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <functional>
#include <iostream>
#include <memory>
#include <optional>
#include <string_view>
#include <system_error>
#include <utility>
#include <vector>

#include <fcntl.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include "platform/DeviceRoot.h"
#include "platform/ShownText.h"
#include "platform/Utf8.h"
#include "platform/linux/services/bus/BusValue.h"
#include "platform/linux/system/JsonReader.h"
#include "tools/orloctl/Interruption.h"
#include "tools/orloctl/LogTail.h"
#include "tools/orloctl/Reasons.h"

namespace {

constexpr const char* serviceName = "com.tevari.VeltraOrloServices";
constexpr const char* servicePath = "/com/tevari/VeltraOrloServices";
constexpr const char* serviceInterface = "com.tevari.VeltraPluginServer";
constexpr const char* journal = "the journal (journalctl -u veltra-orlo-services)";

using Clock = std::chrono::steady_clock;
using BusPtr = std::unique_ptr<sd_bus, decltype(&sd_bus_close_unref)>;
using MessagePtr = std::unique_ptr<sd_bus_message, decltype(&sd_bus_message_unref)>;
using CredentialsPtr = std::unique_ptr<sd_bus_creds, decltype(&sd_bus_creds_unref)>;
using SlotPtr = std::unique_ptr<sd_bus_slot, decltype(&sd_bus_slot_unref)>;

int check(int result) {
    if (result < 0)
        throw std::system_error(-result, std::generic_category());
    return result;
}

// One line on a terminal's standard error, and nowhere else, that says what is going on.
class LiveLine {
public:
    ~LiveLine() { clear(); }

    bool isSeen() const { return terminal_; }

    void show(const std::string& text) {
        winsize size = {};
        const std::size_t columns =
            ::ioctl(STDERR_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 8 ? size.ws_col : 80;
        clear();
        std::cerr << shortened(utf8::escaped(text), columns - 4)
                  << std::flush; // the dots, and no wrap at the last column
        shown_ = true;
    }

    void clear() {
        if (std::exchange(shown_, false))
            std::cerr << "\r\033[K" << std::flush;
    }

private:
    const bool terminal_ = isatty(STDERR_FILENO) == 1;
    bool shown_ = false;
};

MessagePtr requestMessage(sd_bus* connection, const std::string& command, const Value::Dictionary& arguments,
                          bool wantsMessages) {
    sd_bus_message* message = nullptr;
    check(sd_bus_message_new_method_call(connection, &message, serviceName, servicePath, serviceInterface,
                                         "HandleMessage"));
    MessagePtr owner(message, sd_bus_message_unref);
    Value::Dictionary request = {{"messageStr", command}, {"messageDict", arguments}};
    if (wantsMessages)
        request["messages"] = true;
    bus::appendDictionary(message, request);
    return owner;
}

std::int64_t logSize() {
    const FileDescriptor log = openInRoot(logPath, O_PATH);
    struct stat status = {};
    return log && ::fstat(log.get(), &status) == 0 ? status.st_size : 0;
}

// Where the service has said what it did. Only what the service manager starts for the system bus writes to the journal
// for certain.
std::string whereReasonsAre(const std::string& bus, std::int64_t logSizeBefore) {
    const std::int64_t size = logSize();
    const bool logged = size > 0 && size != logSizeBefore; // a log that was rotated meanwhile is smaller
    const std::string log = std::string(logPath) + " on the device";
    if (bus == "system")
        return logged ? "The reasons are in " + log + " and in " + journal + "."
                      : "The request left nothing in " + log + "; the reasons are in " + journal + ".";
    return logged ? "The reasons are in " + log + "."
                  : "The request left nothing in " + log + "; see what the service printed.";
}

// The error of a bad URL has it as it was sent; what is printed goes without user and password.
void hideUserInfo(Value::Dictionary& response) {
    const auto error = response.find("error");
    if (error != response.end() && error->second.dictionary())
        for (auto& [key, value] : *error->second.dictionary())
            if (const std::string* text = value.text())
                value = withoutUserInfo(*text);
}

Report failed(Outcome outcome, std::string why) {
    Report report;
    report.fail(std::move(why), outcome);
    return report;
}

Report unreachable(std::string why) {
    return failed(Outcome::Unreachable, std::move(why));
}

// Reads a reply into an answer. A reply without response object is one to an unknown command.
Answer answerFrom(sd_bus_message* reply, const std::string& command) {
    int completed = 0;
    check(sd_bus_message_read_basic(reply, SD_BUS_TYPE_BOOLEAN, &completed));
    Value::Dictionary response = bus::readDictionary(reply);
    if (response.empty())
        return {failed(Outcome::UnknownCommand, "The plug-in does not know the command \"" + command + "\".")};
    hideUserInfo(response);
    Answer answer;
    answer.response = std::move(response);
    answer.report.json["response"] = jsonFromValue(answer.response);
    if (answer.response["statusCode"].integer() != 0)
        answer.report.fail("The plug-in answered \"" + command + "\" with a failure.", Outcome::Failure);
    return answer;
}

// What an error reply means, and what to do.
Report reportOfError(const sd_bus_error& error, const ServiceAddress& address) {
    const std::string_view name = error.name;
    const std::string text = error.message ? error.message : error.name;
    const std::string where = " on the bus \"" + address.bus + "\"";
    if (name == SD_BUS_ERROR_INVALID_ARGS)
        return failed(Outcome::Usage, "The service refused the request: " + text);
    if (name == SD_BUS_ERROR_ACCESS_DENIED && geteuid() != 0)
        return unreachable("Only root may call the service" + where + ": use sudo.");
    if (name == SD_BUS_ERROR_LIMITS_EXCEEDED)
        return unreachable("The service" + where + " is busy, and as much waits for it as it takes: try again later; " +
                           "orloctl status shows the request in hand.");
    if (name == SD_BUS_ERROR_NO_REPLY)
        return unreachable("The service" + where + " did not answer: " + text);
    if (name == SD_BUS_ERROR_SERVICE_UNKNOWN)
        return unreachable("The service " + std::string(serviceName) + " is not running" + where +
                           ": start VeltraOrloServices there, or name another bus with --bus.");
    return unreachable("The service" + where + " cannot be used: " + text);
}

std::chrono::microseconds timeLeft(const ServiceAddress& address) {
    return std::max(std::chrono::duration_cast<std::chrono::microseconds>(address.deadline() - Clock::now()),
                    std::chrono::microseconds(0));
}

struct BusError {
    BusError() = default;
    BusError(const BusError&) = delete;
    BusError& operator=(const BusError&) = delete;
    ~BusError() { sd_bus_error_free(&found); }

    sd_bus_error found = {};
};

// Who has the name on the bus: the user and the name of the connection. Null for nobody, and where the bus does not
// tell, which sets *problem.
CredentialsPtr ownerOf(sd_bus* connection, const char* name, int* problem = nullptr) {
    sd_bus_creds* credentials = nullptr;
    const int result =
        sd_bus_get_name_creds(connection, name, SD_BUS_CREDS_EUID | SD_BUS_CREDS_UNIQUE_NAME, &credentials);
    if (problem && result != -ENXIO)
        *problem = result;
    return {result < 0 ? nullptr : credentials, sd_bus_creds_unref};
}

std::optional<uid_t> userOf(sd_bus* connection, const char* name) {
    const CredentialsPtr owner = ownerOf(connection, name);
    uid_t user = 0;
    return owner && sd_bus_creds_get_euid(owner.get(), &user) >= 0 ? std::optional(user) : std::nullopt;
}

// The name of the service's connection, which no message to it starts; empty when the service does not run.
std::string connectionOfService(sd_bus* connection, int* problem = nullptr) {
    const CredentialsPtr owner = ownerOf(connection, serviceName, problem);
    const char* name = nullptr;
    return owner && sd_bus_creds_get_unique_name(owner.get(), &name) >= 0 ? name : "";
}

// What the service says of itself; nothing, with *error set, when it does not.
Value::Dictionary propertiesOf(sd_bus* connection, const std::string& service, sd_bus_error* error) {
    sd_bus_message* reply = nullptr;
    if (service.empty() ||
        sd_bus_call_method(connection, service.c_str(), servicePath, "org.freedesktop.DBus.Properties", "GetAll", error,
                           &reply, "s", serviceInterface) < 0)
        return {};
    const MessagePtr owner(reply, sd_bus_message_unref);
    return bus::readDictionary(reply);
}

struct RequestInHand {
    std::string command;
    std::int64_t seconds; // since it was begun

    std::string text() const { return command + ", in hand for " + std::to_string(seconds) + " s"; }
};

std::optional<RequestInHand> requestInHand(const Value& properties) {
    const std::string* command = properties["RequestInHand"].text();
    if (!command || command->empty())
        return std::nullopt;
    const std::int64_t now =
        std::chrono::duration_cast<std::chrono::microseconds>(std::chrono::system_clock::now().time_since_epoch())
            .count();
    const std::int64_t started = properties["RequestStarted"].integer().value_or(0);
    return RequestInHand{*command, (now - std::clamp(started, std::int64_t{0}, now)) / 1'000'000};
}

// What the service tells of a request while it serves it.
struct Message {
    std::int32_t level;
    std::string source; // the file that logs
    std::string text;

    nlohmann::ordered_json json() const { return {{"level", level}, {"source", source}, {"text", text}}; }
    std::string line() const { return messageLine(source, text); }
};

// One request and what comes of it.
class Conversation {
public:
    Conversation(sd_bus* connection, const ServiceAddress& address, const std::string& command)
        : bus_(connection), address_(address), command_(command) {}

    // The timeout counts also while the bus itself keeps the client waiting.
    Answer send(const Value::Dictionary& arguments) {
        const std::int64_t logSizeBefore = logSize();
        sd_bus_slot* filter = nullptr;
        check(sd_bus_add_filter(bus_, &filter, onMessage, this));
        const SlotPtr filterOwner(filter, sd_bus_slot_unref);
        call(arguments, true);
        wait();
        if (isTooOldForMessages_) { // an upgrade lets the program that runs go on
            call(arguments, false);
            wait();
        }
        answer_->reasons = whereReasonsAre(address_.bus, logSizeBefore);
        if (answer_->report.outcome == Outcome::Failure)
            answer_->report.problem += ' ' + answer_->reasons;
        answer_->report.messages = messages();
        return std::move(*answer_);
    }

private:
    static constexpr std::chrono::microseconds tick = std::chrono::seconds(1);

    void call(const Value::Dictionary& arguments, bool wantsMessages) {
        constexpr std::uint64_t noTimeoutOfItsOwn = UINT64_MAX;
        const MessagePtr message = requestMessage(bus_, command_, arguments, wantsMessages);
        sd_bus_slot* reply = nullptr;
        answer_.reset();
        check(sd_bus_call_async(bus_, &reply, message.get(), onReply, this, noTimeoutOfItsOwn));
        reply_.reset(reply);
        boundCalls(std::max(timeLeft(address_), tick));
    }

    // How long the bus itself may take for what is asked of it meanwhile.
    void boundCalls(std::chrono::microseconds time) const {
        check(sd_bus_set_method_call_timeout(bus_, static_cast<std::uint64_t>(time.count())));
    }

    void wait() {
        while (!answer_) {
            const auto left = timeLeft(address_);
            if (left.count() == 0 || Interruption::isRaised())
                return giveUp();
            if (check(sd_bus_process(bus_, nullptr)) > 0)
                continue;
            const int waited = sd_bus_wait(bus_, static_cast<std::uint64_t>(std::min(left, tick).count()));
            if (waited != -EINTR)
                check(waited);
            showProgress(waited == 0);
        }
    }

    void giveUp() {
        const std::string fate = fateOfRequest();
        if (!answer_)
            answer_ = {unreachable(noAnswerReason(address_) + " while the service on the bus \"" + address_.bus +
                                   "\" was to answer. " + fate)};
    }

    // What becomes of the request now. The service has begun with it when it has told anything; otherwise it drops it
    // when this client leaves the bus, unless nothing else keeps it from beginning.
    std::string fateOfRequest() {
        std::uint64_t waiting = 0;
        if (sd_bus_get_n_queued_write(bus_, &waiting) < 0 || waiting != 0)
            return "The request was not sent.";
        const std::string ahead = requestAhead();
        // What has come already; more than that only comes from somebody who floods this client.
        for (int turn = 0; turn < 10000 && !answer_ && check(sd_bus_process(bus_, nullptr)) > 0; ++turn)
            continue;
        return !told_.empty() ? "The service goes on with the request."
               : !ahead.empty()
                   ? "The service has dropped the request, which was still waiting for another (" + ahead + ")."
                   : "It is not known whether the service goes on with the request.";
    }

    // The request that keeps this one waiting, when nothing has been told yet and the service says so in time.
    std::string requestAhead() const try {
        if (!told_.empty())
            return "";
        boundCalls(tick);
        const auto inHand = requestInHand(propertiesOf(bus_, connectionOfService(bus_), nullptr));
        boundCalls(std::max(timeLeft(address_), tick));
        return inHand ? inHand->text() : "";
    } catch (const std::exception&) {
        return "";
    }

    // A second that has passed without anything happening is the time to look what this request waits for.
    void showProgress(bool isIdle) {
        using std::chrono::seconds;
        const auto passed = std::chrono::duration_cast<seconds>(Clock::now() - start_);
        if (!line_.isSeen() || passed < seconds(1))
            return;
        if (isIdle)
            ahead_ = requestAhead();
        line_.show(std::to_string(passed.count()) + " s  " +
                   (!told_.empty()    ? told_.back().line()
                    : !ahead_.empty() ? "waiting for another request: " + ahead_
                                      : "waiting for the service"));
    }

    // With -v all that was told; otherwise what may be the reasons of a failure.
    nlohmann::ordered_json messages() const {
        const bool hasFailed = !answer_->report.ok();
        auto found = nlohmann::ordered_json::array();
        for (const Message& message : told_)
            if (address_.verbose ||
                isReason(command_, message.level, message.text, hasFailed && &message == &told_.back()))
                found.push_back(message.json());
        return found;
    }

    // Whether the bus names `sender` as the service: others may send signals too.
    bool isService(const char* sender) {
        if (!sender || sender == service_ || sender == stranger_)
            return sender && sender == service_;
        service_ = connectionOfService(bus_);
        if (sender == service_)
            return true;
        stranger_ = sender; // its next message costs no question
        return false;
    }

    static int onMessage(sd_bus_message* signal, void* context, sd_bus_error*) {
        auto& self = *static_cast<Conversation*>(context);
        Message told;
        const char *source = nullptr, *text = nullptr;
        if (sd_bus_message_is_signal(signal, serviceInterface, "Message") <= 0 ||
            !self.isService(sd_bus_message_get_sender(signal)) ||
            sd_bus_message_read(signal, "iss", &told.level, &source, &text) < 0)
            return 0;
        told.source = source;
        told.text = text;
        if (self.address_.verbose && !self.address_.json) {
            self.line_.clear();
            print(std::cerr, told.line());
        }
        self.told_.push_back(std::move(told));
        return 1;
    }

    static int onReply(sd_bus_message* reply, void* context, sd_bus_error*) {
        auto& self = *static_cast<Conversation*>(context);
        try {
            const sd_bus_error* error = sd_bus_message_get_error(reply);
            self.isTooOldForMessages_ =
                error && error->message && !self.isTooOldForMessages_ &&
                error->name == std::string_view(SD_BUS_ERROR_INVALID_ARGS) &&
                std::string_view(error->message).find("no key \"messages\"") != std::string::npos;
            self.answer_ = error ? Answer{reportOfError(*error, self.address_)} : answerFrom(reply, self.command_);
            if (const char* sender = sd_bus_message_get_sender(reply); sender && !error)
                self.answer_->serviceUser = userOf(self.bus_, sender);
        } catch (const std::exception& failure) {
            self.answer_ = {unreachable(std::string("The answer cannot be read: ") + failure.what())};
        }
        return 0;
    }

    sd_bus* const bus_;
    const ServiceAddress& address_;
    const std::string& command_;
    const Clock::time_point start_ = Clock::now();
    std::optional<Answer> answer_;
    std::vector<Message> told_;
    SlotPtr reply_{nullptr, sd_bus_slot_unref};
    bool isTooOldForMessages_ = false;
    std::string service_;  // its unique name
    std::string stranger_; // that of the last other sender
    std::string ahead_;
    LiveLine line_;
};

// Does `work` with a connection to the bus. What keeps it from that becomes a report.
template <class Result>
Result onBus(const ServiceAddress& address, const std::function<Result(sd_bus*)>& work) {
    sd_bus* opened = nullptr;
    if (const int result = bus::open(address.bus, &opened); result < 0)
        return {unreachable("Cannot reach the bus \"" + address.bus + "\": " + bus::reasonOf(result) +
                            "; --bus or VELTRA_BUS names another.")};
    const BusPtr connection(opened, sd_bus_close_unref);
    try {
        return work(connection.get());
    } catch (const bus::Refusal& refusal) {
        return {failed(Outcome::Usage, refusal.what())};
    } catch (const std::system_error& failure) {
        if (const int code = failure.code().value(); code == E2BIG || code == EMSGSIZE || code == ENOBUFS)
            return {failed(Outcome::Usage, std::string("The request is too large for a message: ") + failure.what())};
        return {unreachable("Lost the bus \"" + address.bus + "\": " + failure.what())};
    }
}

// Whether the bus starts the service when a request comes.
bool startsAtRequest(sd_bus* connection) {
    char** names = nullptr;
    if (sd_bus_list_names(connection, nullptr, &names) < 0)
        return false;
    bool isListed = false;
    for (char** name = names; *name; ++name) {
        isListed = isListed || *name == std::string_view(serviceName);
        std::free(*name);
    }
    std::free(names);
    return isListed;
}

Report statusOf(sd_bus* connection, const ServiceAddress& address) {
    check(sd_bus_set_method_call_timeout(connection, static_cast<std::uint64_t>(timeLeft(address).count())));
    int problem = 0;
    const std::string service = connectionOfService(connection, &problem);
    check(problem);
    if (service.empty() && startsAtRequest(connection))
        return {.json = {{"service", "not running; a request starts it"}, {"bus", address.bus}}};
    BusError error;
    if (service.empty())
        sd_bus_error_set_const(&error.found, SD_BUS_ERROR_SERVICE_UNKNOWN, nullptr);
    const Value properties = propertiesOf(connection, service, &error.found);
    if (sd_bus_error_is_set(&error.found))
        return reportOfError(error.found, address);
    if (!properties["DeviceRoot"].text())
        return {.json = {{"service", "running; it says nothing of itself"}, {"bus", address.bus}}};
    Report report;
    report.json = {{"service", "running"}, {"bus", address.bus}};
    for (const auto& [name, shown] : {std::pair("Version", "version"),
                                      {"DeviceRoot", "deviceRoot"},
                                      {"StoreState", "store"},
                                      {"RequestsWaiting", "requestsWaiting"}})
        report.json[shown] = jsonFromValue(properties[name]);
    report.json["requestInHand"] = nlohmann::ordered_json::object();
    if (const auto inHand = requestInHand(properties))
        report.json["requestInHand"] = {{"command", inHand->command}, {"seconds", inHand->seconds}};
    return report;
}

} // namespace

std::string messageLine(const std::string& source, const std::string& text) {
    std::string line = source + ": " + text.substr(0, text.find_last_not_of('\n') + 1);
    for (std::size_t end = 0; (end = line.find('\n', end)) != line.npos; end += 1)
        line.insert(end + 1, "    ");
    return line;
}

std::string noAnswerReason(const ServiceAddress& address) {
    return Interruption::isRaised() ? "Interrupted"
                                    : "Time is up (the timeout is " + std::to_string(address.timeout.count()) + " s)";
}

Answer sendRequest(const ServiceAddress& address, const std::string& command, const Value::Dictionary& arguments) {
    const Interruption interruption;
    return onBus<Answer>(
        address, [&](sd_bus* connection) { return Conversation(connection, address, command).send(arguments); });
}

Report askStatus(const ServiceAddress& address) {
    return onBus<Report>(address, [&](sd_bus* connection) { return statusOf(connection, address); });
}
