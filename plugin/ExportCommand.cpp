#include "orlo/ZPOrloExport.h"
#include "platform/Format.h"
#include "plugin/Commands.h"

namespace {

constexpr std::int64_t nothingGathered = 2002;

const Value::Array usualExportList = {"pfcl", "CtCl", "IfCl", "HmCl", "GpC2", "tcrt", "dCfg"};

HSMessageResponse exportInstances(const HSMessageRequest& request, const Value& instances) {
    const Value response; // the export never fills it
    const std::optional<Error> error = ZPOrloExport::orloExportCommandWithResponse(instances, request.messageDict,
                                                                                   nullptr);
    serviceLog.info("Orlo Services Plugin - Response : %@", response);
    return HSMessageResponse::initWithName(request.messageStr, error ? -1 : 0, {}, error);
}

} // namespace

HSMessageResponse OrloExport(const HSMessageRequest& request, const Value& hardwareModel) {
    const Value& given = request.messageDict["ExportList"];
    const bool isUsualList =
        given.isNothing() && !modelContains(hardwareModel, "M8") && !modelContains(hardwareModel, "M9");
    if (isUsualList) {
        serviceLog.info("Adding ExportList for overlays before M8xM9y");
    } else if (!given.array()) {
        serviceLog.error("Expected a list");
        return HSMessageResponse::initWithName(request.messageStr, -1);
    }
