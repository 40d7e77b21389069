#include "orlo/ZPOrloExport.h"
#include "platform/Format.h"
#include "plugin/Commands.h"

namespace {

constexpr const char* errorDomain = "OrloExport";
constexpr std::int64_t nothingGathered = 2002;

const Value::Array defaultExportList = {"pfcl", "CtCl", "IfCl", "HmCl", "GpC2", "tcrt", "dCfg"};

const Value response; // of the export, which never fills it

HSMessageResponse fail(const HSMessageRequest& request, std::optional<Error> error) {
    return HSMessageResponse::initWithName(request.messageStr, -1, {}, std::move(error));
}

HSMessageResponse exportInstances(const HSMessageRequest& request, const Value& instances) {
    std::optional<Error> error = ZPOrloExport::orloExportCommandWithResponse(instances, request.messageDict, nullptr);
    serviceLog.info("Orlo Services Plugin - Response : %@", response);
    return error ? fail(request, std::move(error)) : HSMessageResponse::initWithName(request.messageStr, 0, {});
}

HSMessageResponse exportList(const HSMessageRequest& request, const Value::Array& list, bool isDefault) {
    Value reason;
    const Value instances = ZPOrloExport::getDataInstances(list, &reason);
    serviceLog.info("Export Dict : %@", instances);
    if (!instances.isNothing())
        return exportInstances(request, instances);
    if (isDefault)
        serviceLog.error("Key doesn't exist or Error reading IDs");
    else
        serviceLog.error("Orlo Export Failed due to - %@", reason);
    return fail(request, Error{errorDomain, nothingGathered, format("Orlo Export Failed due to - %@", reason)});
}

} // namespace

HSMessageResponse OrloExport(const HSMessageRequest& request, const Value& hardwareModel) {
    const Value& given = request.messageDict["ExportList"];
    if (given.isNothing() && !modelContains(hardwareModel, "M8") && !modelContains(hardwareModel, "M9")) {
        serviceLog.info("Adding ExportList for overlays before M8xM9y");
        return exportList(request, defaultExportList, true);
    }
    if (!given.array()) {
        serviceLog.error("Expected a list");
        return HSMessageResponse::initWithName(request.messageStr, -1);
    }
    HSMessageResponse answer = exportList(request, *given.array(), false);
    serviceLog.info("Orlo Services Plugin - Response : %@", response);
    return answer;
}
