#include <chrono>
#include <cstring>
#include <exception>
#include <memory>
#include <optional>
#include <string>
#include <utility>

#include "Daemon/Conversions.h"
#include "device/ZPDevice.h"
#include "platform/Files.h"
#include "platform/Format.h"
#include "platform/Pairing.h"
#include "platform/Pause.h"
#include "platform/SystemLog.h"
#include "platform/URL.h"
#include "platform/VanterUpdater.h"
#include "plugin/Commands.h"
#include "plugin/ZPOrloServices.h"

namespace {

constexpr const char* updaterName = "Vanter";
constexpr const char* patchPath = "/var/mobile/Vanter.BE-Prod.fw";
constexpr std::chrono::seconds pauseAfterPatch{10};

constexpr std::int32_t patchLoaded = 0;
constexpr std::int32_t patchNotLoaded = -1;

using UpdaterPtr = std::unique_ptr<VanterUpdater, decltype(&VanterUpdaterRelease)>;

// The lines about loading the patch go to the framework's handle of the system log and not to the plug-in's log.
void writeToFramework(SystemLogType type, std::string_view text, std::initializer_list<FormatArgument> arguments) try {
    SystemLog* const log = getLogHandle(1);
    if (systemLogTypeEnabled(log, type))
        systemLogWrite(log, type, formatForLog(text, arguments));
} catch (const std::exception&) {
    return; // a line that memory does not suffice for is lost
}

template <class... Arguments>
void trace(std::string_view text, const Arguments&... arguments) {
    writeToFramework(SystemLogType::Default, text, {FormatArgument(arguments)...});
}

template <class... Arguments>
void traceError(std::string_view text, const Arguments&... arguments) {
    writeToFramework(SystemLogType::Error, text, {FormatArgument(arguments)...});
}

void vanterUpdaterLog(const std::string& context, const std::string& message) {
    serviceLog.info("%s: %s", context, message);
}

// The updater options, with the ticket unless it is empty; nothing when memory does not suffice.
Value updaterOptions(const std::uint8_t* ticket, std::size_t length) try {
    Value::Dictionary options;
    if (length > 0) {
        Value::Data copy(length);
        std::memcpy(copy.data(), ticket, length);
        options["Vanter,Ticket"] = std::move(copy);
    }
    options["Options"] = Value::Dictionary{{"WaftonPairingOption", true},
                                           {"PersonalizedFirmwareRootPath", "/usr/local/share/firmware/isp/"},
                                           {"RestoreSystemPartition", "/private/var/mobile/"},
                                           {"RestoreInternal", true}};
    return Value(std::move(options));
} catch (const std::exception&) { // the length is beyond memory, or beyond what any memory could hold
    return {};
}

void logTicket(const Value& ticket) {
    const Value empty = Value::Data{};
    traceError("value of ticket is:%@", ticket.data() ? ticket : empty);
    if (ticket.data())
        serviceLog.error("added ticket");
}

// Whether the chip told about itself; what it told is only logged.
bool logDeviceInformation(const Value& information) {
    trace("Device Info Dict is %@", information);
    if (information.isNothing()) {
        traceError("empty DGST");
        return false;
    }
    const Value& digest = information["Digest"];
    trace("extracted patch digest:%@", digest);
    trace("extracted patch digest string:%@", DatatoHexString(digest));
    return true;
}

std::optional<Error> installPatch(VanterUpdater* updater, Value options) {
    std::optional<Value::Data> patch = files::readWhole(patchPath);
    if (!patch || patch->empty()) {
        trace("Files not found");
        return std::nullopt;
    }
    trace("Patch found successfully");
    options.dictionary()->insert_or_assign("FirmwareData", std::move(*patch));
    std::optional<Error> error;
    Value output;
    if (!VanterUpdaterExecCommand(updater, "performNextStage", options, &output, &error) || error)
        traceError("VanterUpdaterExecCommand failed: %@:%@", error, output);
    else
        trace("Vanter Firmware Update Successful");
    return error;
}

// Brings the chip's firmware up to the patch. Only an Error of the updater library is a failure; whatever else keeps
// the patch from being installed is a line in the log.
std::optional<Error> updateVanter(const std::uint8_t* ticket, std::size_t length) {
    Value options = updaterOptions(ticket, length);
    if (options.isNothing()) {
        traceError("updaterOptions failed to allocate");
        return std::nullopt;
    }
    traceError("updaterOptions created successfully");
    logTicket(options["Vanter,Ticket"]);

    std::optional<Error> error;
    const UpdaterPtr updater(VanterUpdaterCreate(options, vanterUpdaterLog, updaterName, &error), VanterUpdaterRelease);
    if (!updater || error) {
        serviceLog.error("Failed to create %s obj::error:%@", updaterName, error);
        return error;
    }
    trace("Created the Vanter Updater");
    if (VanterUpdaterIsDone(updater.get(), &error))
        return std::nullopt;
    Value information;
    if (error || !VanterUpdaterExecCommand(updater.get(), "queryInfo", {}, &information, &error) || error) {
        traceError("VanterUpdaterExecCommand failed:%@", error);
        return error;
    }
    if (!logDeviceInformation(information))
        return std::nullopt;
    return installPatch(updater.get(), std::move(options));
}

std::int32_t loadVanterPatch(const std::uint8_t* ticket, std::size_t length) {
    trace("Inside Loadpatch");
    if (const std::optional<Error> error = updateVanter(ticket, length)) {
        traceError("loadVanterPatch fail. Error: %@", error);
        return patchNotLoaded;
    }
    pauseFor(pauseAfterPatch);
    trace("loadVanterPatch success.");
    ZPOrloServices::q21isp_loadDAT();
    return patchLoaded;
}

bool provision(const std::string& url, const Value& proxy, std::optional<Error>* error) {
    return BWCProvisionCorvoWithProxy(url, proxy, error);
}

bool pair(const std::string& url, const Value& proxy, std::optional<Error>* error) {
    return BWCPairCorvoWithProxy(url, proxy, error, loadVanterPatch);
}

// What the two commands do not share.
struct PairingCommand {
    const char* name;
    const char* purpose; // as the log lines name it
    bool (*run)(const std::string& url, const Value& proxy, std::optional<Error>* error);
};

constexpr PairingCommand provisionCommand{"corvoSCProv", "provisioning", provision};
constexpr PairingCommand pairCommand{"corvoSCPair", "pairing", pair};

HSMessageResponse run(const PairingCommand& command, const HSMessageRequest& request) {
    serviceLog.info("%s:%d - Received %s", handlerName, __LINE__, command.name);
    const Value& argument = request.messageDict["waftonUrl"];
    const Value url = argument.text() ? argument : Value();
    serviceLog.info("URL for %s: %@", command.purpose, url);
    if (!url.text() || !isWellFormedURL(*url.text())) {
        serviceLog.error("Wafton URL not a valid URL");
        return HSMessageResponse::initWithName(
            request.messageStr, -1, {}, Error{"CorvoSCErrorDomain", 500, format("Wafton URL not a valid URL:%@", url)});
    }
    serviceLog.info("Setting up reverse proxy");
    const Value proxy = ZPDevice::sharedSingleton().setupReverseProxy(*url.text());
    serviceLog.info("Calling the %s", command.purpose);
    std::optional<Error> error;
    if (!command.run(*url.text(), proxy, &error)) {
        serviceLog.error("Corvo SC %s failed!!!", command.purpose);
        return HSMessageResponse::initWithName(request.messageStr, -1, {}, error);
    }
    serviceLog.info("Corvo SC %s passed.", command.purpose);
    return HSMessageResponse::initWithName(request.messageStr, 0, {});
}

} // namespace

HSMessageResponse corvoSCProv(const HSMessageRequest& request, const Value&) {
    return run(provisionCommand, request);
}

HSMessageResponse corvoSCPair(const HSMessageRequest& request, const Value&) {
    return run(pairCommand, request);
}
