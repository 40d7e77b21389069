#include "plugin/ZPOrloServices.h"

#include <cstdint>
#include <exception>
#include <new>
#include <optional>
#include <utility>

#include "Daemon/Common/HSPipeUtil.h"
#include "platform/DeviceAnswers.h"
#include "platform/Format.h"
#include "platform/PropertyList.h"
#include "plugin/Commands.h"

namespace {

struct CommandRow {
    CommandRow(const char* named, Command command, std::int64_t status = -1, Value response = {},
               void (*clean)() noexcept = nullptr)
        : name(named),
          run(command),
          withoutMemory(HSMessageResponse::initWithName(named, status, std::move(response))),
          cleanUp(clean) {}

    std::string_view name;
    Command run;
    std::optional<HSMessageResponse> withoutMemory; // completes a request for which memory does not suffice
    void (*cleanUp)() noexcept; // takes away what an earlier request has left where this one's result belongs
};

// In the order in which a request's command is compared with them.
const CommandRow commands[] = {
    {"OrloExport", OrloExport},
    {"getTCRT", getTCRT},
    {"putTCRT", putTCRT},
    {"putPSD2", putPSD2},
    {"getPSD2", getPSD2},
    {"corvoSCProv", corvoSCProv},
    {"corvoSCPair", corvoSCPair},
    {"checkCorvoPostSwapEntitlement", checkCorvoPostSwapEntitlement, 0,
     Value::Dictionary{{"IsPostSwapEntitled", false}}},
    {"setGlobalbCfg", setGlobalbCfg, 0, {}, removeGlobalbCfg},
};

const CommandRow* commandNamed(const Value& name) {
    const std::string* text = name.text();
    for (const CommandRow& row : commands)
        if (text && *text == row.name)
            return &row;
    return nullptr;
}

void logRequest(const HSMessageRequest& request) try {
    serviceLog.info("Received Request : %@", request.description());
} catch (const std::bad_alloc&) {
    return; // a line that memory does not suffice for is lost, as in the log itself
}

} // namespace

std::unique_ptr<ZPOrloServices> ZPOrloServices::initWithServiceName(std::string_view serviceName) {
    auto server = std::make_unique<ZPOrloServices>();
    if (!server->VeltraPluginServer::initWithServiceName(serviceName, pluginVersion()))
        return nullptr;
    return server;
}

void ZPOrloServices::printPluginVersion() const try {
    serviceLog.info("Plugin  - version %@", pluginVersion());
} catch (const std::exception&) {
    return; // a line that memory does not suffice for is lost; the work it tells of goes on
}

void ZPOrloServices::q21isp_loadDAT() {
    const Value none = "";
    Value response;
    try {
        std::optional<Error> error;
        HSPipeUtil::HSPipeUtilExecCommand("/usr/local/bin/q21isp", {"-ns", "/tmp/q21_isp_load.txt"}, &response, &error);
    } catch (const std::bad_alloc&) {
        response = {}; // an output that memory does not suffice for is lost
    }
    const Value& output = response["Output"];
    serviceLog.info("Output: %@", ProgramOutput{output.isNothing() ? &none : &output});
}

void ZPOrloServices::handleMessage(const HSMessageRequest& request, const HSCompletion& completion) {
    const CommandRow* const command = commandNamed(request.messageStr);
    std::optional<HSMessageResponse> made;
    const std::optional<HSMessageResponse>* response = &made;
    try {
        printPluginVersion();
        logRequest(request);
        serviceLog.info("request.messageDict : %@", request.messageDict);
        const Value hardwareModel = KACopyAnswerWithError("HWModelStr", {}, nullptr);
        serviceLog.info("Hardware Model : %@", hardwareModel);
        if (command)
            made = command->run(request, hardwareModel);
    } catch (const std::exception&) {
        if (command)
            response = &command->withoutMemory;
        if (command && command->cleanUp)
            command->cleanUp();
    }
    try {
        completion(true, *response);
    } catch (const std::bad_alloc&) {
        if (!command || response != &made)
            throw;
        completion(true, command->withoutMemory);
    }
}

std::string pluginVersion() {
    const Value information = bundleInformationList();
    return format("%@.%@", information["KVBundleShortVersionString"], information["KVBundleVersion"]);
}

bool modelContains(const Value& hardwareModel, std::string_view prefix) {
    const std::string* text = hardwareModel.text();
    return text && text->find(prefix) != std::string::npos;
}
