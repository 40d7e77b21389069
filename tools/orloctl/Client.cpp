#include "tools/orloctl/Client.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <memory>
#include <optional>
#include <string_view>
#include <system_error>

#include <fcntl.h>
#include <sys/stat.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include "platform/DeviceRoot.h"
#include "platform/ShownText.h"
#include "platform/linux/services/bus/BusValue.h"
#include "platform/linux/system/JsonReader.h"
#include "tools/orloctl/Interruption.h"

namespace {

constexpr const char* serviceName = "com.tevari.VeltraOrloServices";
constexpr const char* servicePath = "/com/tevari/VeltraOrloServices";
constexpr const char* serviceInterface = "com.tevari.VeltraPluginServer";
constexpr const char* logPath = "/private/var/log/com.tevari.VeltraOrloServices.log";
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

// The time since the request was sent, on a terminal's standard error and nowhere else.
class ElapsedTime {
public:
    ~ElapsedTime() {
        if (shown_)
            (void)std::fputs("\r\033[K", stderr);
    }

    void show() {
        const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(Clock::now() - start_).count();
        if (seconds < 1 || !terminal_)
            return;
        (void)std::fprintf(stderr, "\r%lld s", static_cast<long long>(seconds));
        shown_ = true;
    }

private:
    const Clock::time_point start_ = Clock::now();
    const bool terminal_ = isatty(STDERR_FILENO) == 1;
    bool shown_ = false;
};

MessagePtr requestMessage(sd_bus* connection, const std::string& command, const Value::Dictionary& arguments) {
    sd_bus_message* message = nullptr;
    check(sd_bus_message_new_method_call(connection, &message, serviceName, servicePath, serviceInterface,
                                         "HandleMessage"));
    MessagePtr owner(message, sd_bus_message_unref);
    bus::appendDictionary(message, {{"messageStr", command}, {"messageDict", arguments}});
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

Answer failed(Outcome outcome, std::string why) {
    Answer answer;
    answer.report.fail(std::move(why), outcome);
    return answer;
}

Answer unreachable(std::string why) {
    return failed(Outcome::Unreachable, std::move(why));
}

// Reads a reply into an answer. A reply without response object is one to an unknown command.
Answer answerFrom(sd_bus_message* reply, const std::string& command) {
    int completed = 0;
    check(sd_bus_message_read_basic(reply, SD_BUS_TYPE_BOOLEAN, &completed));
    Value::Dictionary response = bus::readDictionary(reply);
    if (response.empty())
        return failed(Outcome::UnknownCommand, "The plug-in does not know the command \"" + command + "\".");
    hideUserInfo(response);
    Answer answer;
    answer.response = std::move(response);
    answer.report.json["response"] = jsonFromValue(answer.response);
    if (answer.response["statusCode"].integer() != 0)
        answer.report.fail("The plug-in answered \"" + command + "\" with a failure.", Outcome::Failure);
    return answer;
}

Answer answerFromError(const sd_bus_error& error, const ServiceAddress& address) {
    const std::string_view name = error.name;
    const std::string text = error.message ? error.message : error.name;
    const std::string where = " on the bus \"" + address.bus + "\"";
    if (name == SD_BUS_ERROR_INVALID_ARGS)
        return failed(Outcome::Usage, "The service refused the request: " + text);
    if (name == SD_BUS_ERROR_ACCESS_DENIED && geteuid() != 0)
        return unreachable("Only root may call the service" + where + ".");
    if (name == SD_BUS_ERROR_NO_REPLY)
        return unreachable("The service" + where + " did not answer: " + text);
    if (name == SD_BUS_ERROR_SERVICE_UNKNOWN)
        return unreachable("The service " + std::string(serviceName) + " is not running" + where + ".");
    return unreachable("The service" + where + " cannot be used: " + text);
}

std::chrono::microseconds timeLeft(const ServiceAddress& address) {
    return std::max(std::chrono::duration_cast<std::chrono::microseconds>(address.deadline() - Clock::now()),
                    std::chrono::microseconds(0));
}

std::optional<uid_t> userOf(sd_bus* connection, const char* name) {
    sd_bus_creds* credentials = nullptr;
    uid_t user = 0;
    const int result = sd_bus_get_name_creds(connection, name, SD_BUS_CREDS_EUID, &credentials);
    const CredentialsPtr owner(credentials, sd_bus_creds_unref);
    return result >= 0 && sd_bus_creds_get_euid(credentials, &user) >= 0 ? std::optional(user) : std::nullopt;
}

// What becomes of a request whose answer is not awaited any longer. The service serves whatever has reached the bus.
std::string fateOf(sd_bus* connection) {
    std::uint64_t waiting = 0;
    const bool isSent = sd_bus_get_n_queued_write(connection, &waiting) >= 0 && waiting == 0;
    return isSent ? "The service goes on with the request." : "The request was not sent.";
}

struct Pending {
    const ServiceAddress& address;
    const std::string& command;
    std::optional<Answer> answer;
    std::string sender; // of the answer
};

int onReply(sd_bus_message* reply, void* context, sd_bus_error*) {
    auto& pending = *static_cast<Pending*>(context);
    try {
        const sd_bus_error* error = sd_bus_message_get_error(reply);
        pending.answer = error ? answerFromError(*error, pending.address) : answerFrom(reply, pending.command);
        if (const char* sender = sd_bus_message_get_sender(reply); sender && !error)
            pending.sender = sender;
    } catch (const std::exception& failure) {
        pending.answer = unreachable(std::string("The answer cannot be read: ") + failure.what());
    }
    return 0;
}

// The timeout counts also while the bus itself keeps the client waiting.
Answer converse(sd_bus* connection, const ServiceAddress& address, const std::string& command,
                const Value::Dictionary& arguments) {
    constexpr std::uint64_t noTimeoutOfItsOwn = UINT64_MAX;
    constexpr std::chrono::microseconds tick = std::chrono::seconds(1);
    const MessagePtr message = requestMessage(connection, command, arguments);
    const std::int64_t logSizeBefore = logSize();
    Pending pending{address, command, {}, {}};
    sd_bus_slot* slot = nullptr;
    check(sd_bus_call_async(connection, &slot, message.get(), onReply, &pending, noTimeoutOfItsOwn));
    const SlotPtr slotOwner(slot, sd_bus_slot_unref);
    ElapsedTime elapsed;
    while (!pending.answer) {
        if (check(sd_bus_process(connection, nullptr)) > 0)
            continue;
        const auto left = timeLeft(address);
        if (left.count() == 0 || Interruption::isRaised())
            return unreachable(noAnswerReason(address) + " while the service on the bus \"" + address.bus +
                               "\" was to answer. " + fateOf(connection));
        const int waited = sd_bus_wait(connection, static_cast<std::uint64_t>(std::min(left, tick).count()));
        if (waited != -EINTR)
            check(waited);
        elapsed.show();
    }
    sd_bus_set_method_call_timeout(connection, static_cast<std::uint64_t>(std::max(timeLeft(address), tick).count()));
    if (!pending.sender.empty())
        pending.answer->serviceUser = userOf(connection, pending.sender.c_str());
    pending.answer->reasons = whereReasonsAre(address.bus, logSizeBefore);
    if (pending.answer->report.outcome == Outcome::Failure)
        pending.answer->report.problem += ' ' + pending.answer->reasons;
    return std::move(*pending.answer);
}

} // namespace

std::string noAnswerReason(const ServiceAddress& address) {
    return Interruption::isRaised() ? "Interrupted"
                                    : "Time is up (the timeout is " + std::to_string(address.timeout.count()) + " s)";
}

Answer sendRequest(const ServiceAddress& address, const std::string& command, const Value::Dictionary& arguments) {
    const Interruption interruption;
    sd_bus* opened = nullptr;
    if (const int result = bus::open(address.bus, &opened); result < 0)
        return unreachable("Cannot reach the bus \"" + address.bus + "\": " + bus::reasonOf(result));
    const BusPtr connection(opened, sd_bus_close_unref);
    try {
        return converse(connection.get(), address, command, arguments);
    } catch (const bus::Refusal& refusal) {
        return failed(Outcome::Usage, refusal.what());
    } catch (const std::system_error& failure) {
        if (const int code = failure.code().value(); code == E2BIG || code == EMSGSIZE || code == ENOBUFS)
            return failed(Outcome::Usage, std::string("The request is too large for a message: ") + failure.what());
        return unreachable("Lost the bus \"" + address.bus + "\": " + failure.what());
    }
}
