#include <optional>
#include <utility>

#include "device/ZPDevice.h"
#include "orlo/ZPOrlo.h"
#include "platform/Files.h"
#include "plugin/Commands.h"

namespace {

constexpr const char* dataClass = "psd2";
constexpr const char* putErrorKey = "psd2 put error";
constexpr const char* getErrorKey = "psd2 get error";

const Value::Dictionary sessionOptions = {{"orlo2Data", true}};

HSMessageResponse fail(const HSMessageRequest& request, const char* key, const char* reason,
                       std::optional<Error> error = {}) {
    return HSMessageResponse::initWithName(request.messageStr, -1, Value::Dictionary{{key, reason}}, std::move(error));
}

bool exists(const Value& path) {
    return path.text() && files::kindOf(*path.text()) != files::Kind::Nothing;
}

// Writes the record over the file at `path`.
HSMessageResponse writeRecord(const HSMessageRequest& request, const Value& path, const Value::Data& record) {
    std::optional<Error> writeError;
    if (path.text() && files::replace(*path.text(), record, &writeError)) {
        serviceLog.info("psd2 data successfully writen");
        return HSMessageResponse::initWithName(request.messageStr, 0, {});
    }
    serviceLog.info(writeError ? "Failed to write psd2 to file" : "Failed to open psd2 file handler");
    return HSMessageResponse::initWithName(request.messageStr, -1, {}, std::move(writeError));
}

} // namespace

HSMessageResponse putPSD2(const HSMessageRequest& request, const Value&) {
    serviceLog.info("%s:%d - Received putPSD2", handlerName, __LINE__);
    const Value& path = request.messageDict["psd2DataPath"];
    if (!exists(path))
        return fail(request, putErrorKey, "psd2 path in request is wrong");
    std::optional<Value::Data> contents = files::readWhole(*path.text());
    if (!contents)
        return fail(request, putErrorKey, "psd2 data not found in request");

    ZPOrlo orlo = ZPOrlo::initWithOptions(sessionOptions);
    const Value instance = ZPDevice::sharedSingleton().getVanterSerialNumber();
    const Value record = std::move(*contents);
    serviceLog.info("psd2- : %@", instance);
    serviceLog.info("psd2 data: %@", record);
    if (std::optional<Error> error = orlo.orloPut(dataClass, instance, *record.data(), nullptr)) {
        serviceLog.info("psd2 put returned an error");
        return fail(request, putErrorKey, "Could not put in Orlo", std::move(error));
    }
    serviceLog.info("psd2 put was successful");
    return HSMessageResponse::initWithName(request.messageStr, 0, {});
}

HSMessageResponse getPSD2(const HSMessageRequest& request, const Value&) {
    serviceLog.info("%s:%d - Received getPSD2", handlerName, __LINE__);
    Value::Data record;
    const Value& path = request.messageDict["psd2V4DataPath"];

    ZPOrlo orlo = ZPOrlo::initWithOptions(sessionOptions);
    const Value instance = ZPDevice::sharedSingleton().getVanterSerialNumber();
    serviceLog.info("psd2 instance : %@", instance);
    if (std::optional<Error> error = orlo.orloGet(dataClass, instance, record, nullptr)) {
        serviceLog.info("psd2 get returned an error");
        return fail(request, getErrorKey, "Could not get from Orlo", std::move(error));
    }
    serviceLog.info("psd2 get was successful");
    return writeRecord(request, path, record);
}
