#include "plugin/ZPOrloServices.h"

#include <new>
#include <optional>

#include "Daemon/Common/HSPipeUtil.h"
#include "platform/BundleInfo.h"
#include "platform/DeviceAnswers.h"
#include "platform/Format.h"
#include "plugin/Commands.h"

namespace {

struct CommandRow {
    std::string_view name;
    Command run;
};

// In the order in which a request's command is compared with them.
constexpr CommandRow commands[] = {
    {"OrloExport", OrloExport},
    {"getTCRT", getTCRT},
    {"putTCRT", putTCRT},
    {"putPSD2", putPSD2},
    {"getPSD2", getPSD2},
    {"corvoSCProv", corvoSCProv},
    {"corvoSCPair", corvoSCPair},
    {"checkCorvoPostSwapEntitlement", checkCorvoPostSwapEntitlement},
    {"setGlobalbCfg", setGlobalbCfg},
};

Command commandNamed(const Value& name) {
    const std::string* text = name.text();
    for (const CommandRow& row : commands)
        if (text && *text == row.name)
            return row.run;
    return nullptr;
}

} // namespace

std::unique_ptr<ZPOrloServices> ZPOrloServices::initWithServiceName(std::string_view serviceName) {
    auto server = std::make_unique<ZPOrloServices>();
    if (!server->VeltraPluginServer::initWithServiceName(serviceName))
        return nullptr;
    return server;
}

void ZPOrloServices::printPluginVersion() const {
    serviceLog.info("Plugin  - version %@", pluginVersion());
}

void ZPOrloServices::q21isp_loadDAT() try {
    Value response;
    Error error;
    HSPipeUtil::HSPipeUtilExecCommand("/usr/local/bin/q21isp", {"-ns", "/tmp/q21_isp_load.txt"}, &response, &error);
    serviceLog.info("Output: %@", response["Output"]);
} catch (const std::bad_alloc&) {
    return; // an output that memory does not suffice for is lost; the load has happened all the same
}

void ZPOrloServices::handleMessage(const HSMessageRequest& request, const HSCompletion& completion) {
    printPluginVersion();
    serviceLog.info("Received Request : %@", request.description());
    serviceLog.info("request.messageDict : %@", request.messageDict);
    const Value hardwareModel = KACopyAnswerWithError("HWModelStr", {}, nullptr);
    serviceLog.info("Hardware Model : %@", hardwareModel);

    std::optional<HSMessageResponse> response;
    if (const Command run = commandNamed(request.messageStr))
        response = run(request, hardwareModel);
    completion(true, response);
}

std::string pluginVersion() {
    const Value information = bundleInformationList();
    return format("%@.%@", information["KVBundleShortVersionString"], information["KVBundleVersion"]);
}

bool modelContains(const Value& hardwareModel, std::string_view prefix) {
    const std::string* text = hardwareModel.text();
    return text && text->find(prefix) != std::string::npos;
}
