#include "orlo/ZPOrlo.h"

#include <utility>

#include "Daemon/HSLog.h"
#include "orlo/OrloEndpoints.h"
#include "orlo/OrloSession.h"

namespace {

constexpr LogSource zplog{"ZPOrlo"};
constexpr const char* errorDomain = "Orlo Error Domain";

constexpr OrloErrorRow permissionNil{1008, "Permission String nil", "permission string nil"};
constexpr OrloErrorRow trustObjectFailed{1008, " Trust Object Copy from Server failed with Reason --> %@",
                                         "QDOrloDataCopyTrustObject failed\n"};
constexpr OrloErrorRow trustObjectFailedSilently{
    1008, " Trust Object Copy from Server failed with Reason --> Unknown due to unfilled error",
    "QDOrloDataCopyTrustObject failed\n"};
constexpr OrloErrorRow digestFailed{1009, "Trust Object Digest Generation failed with Status --> %d",
                                    "QDSupportDigestSha256 failed\n"};
constexpr OrloErrorRow digestValueFailed{1010, " Trust Object Digest Create failed", "KVDataCreate failed\n"};
constexpr OrloErrorRow putFailed{1011, "Unable to upload data error", "Orlo Put failed . returning error"};
// For a get that fails and does not say why, so that its caller does not take it for a success.
constexpr OrloErrorRow getFailedSilently{1012, "Unable to download data error", nullptr};

template <class... Arguments>
Error makeError(OrloErrorHere here, const Arguments&... arguments) {
    return makeOrloError(zplog, errorDomain, here, arguments...);
}

void orloLogHandler(void*, const char* message) {
    zplog.info("%s\n", std::string_view(message));
}

// The options that are the same whatever the ticket says and wherever the records are.
struct DefaultOption {
    const char* key;
    Value value;       // for the first generation
    Value secondValue; // for the second; nothing when it is the same
};

const DefaultOption defaultOptions[] = {
    {"DSURL", dataStoreURL, {}},
    {"CAURL", certificateAuthorityURL, {}},
    {"EnableProxy", true, {}},
    {"EnableProxySsl", "ForHttps", {}},
    {"VerifyData", false, {}},
    {"OrganizationalUnit", "Devices - Stations", {}},
    {"DataVersion", 1, {}}, // for the second generation it depends on the device
    {"UseSikDataInstance", false, true},
    {"HTTPTimeout", 30, {}},
    {"HTTPMaxAttempts", 1, {}},
    {"MultiRequestMaxAttempts", 1, {}},
};

} // namespace

ZPOrlo ZPOrlo::init() {
    zplog.info("Calling init");
    return initWithOptions({});
}

ZPOrlo ZPOrlo::initWithOptions(const Value& options) {
    return ZPOrlo(options);
}

ZPOrlo::ZPOrlo(const Value& options) {
    QDOrloLogSetHandler(orloLogHandler);
    zplog.info("Calling initWithOptions : %@", options);
    const bool isOrlo2 = options["orlo2Data"].boolean().value_or(false);
    Value merged = createDefaultOrloOptions(true, isOrlo2);
    zplog.info("Default Orlo Options: %@", merged);
    if (const Value::Dictionary* given = options.dictionary())
        for (const auto& [key, value] : *given)
            merged.dictionary()->insert_or_assign(key, value);
    setOrloRef(QDOrloCreateWithOptions(std::move(merged)));
}

ZPOrlo::~ZPOrlo() {
    QDSupportSafeRelease(orloRef_);
}

Value::Dictionary ZPOrlo::createDefaultOrloOptions(bool isRemote, bool isOrlo2) {
    std::optional<Value::Data> ticket = readApTicket(zplog);
    const Value::Data none;
    const std::uint32_t dataVersion = QDOrloSealingMapGetOrloDataVersionForDevice(ticket ? *ticket : none);
    zplog.info("Setting Data Local Encode version to : %u", dataVersion);

    Value::Dictionary options;
    for (const DefaultOption& option : defaultOptions)
        options.emplace(option.key, isOrlo2 && !option.secondValue.isNothing() ? option.secondValue : option.value);
    if (isOrlo2)
        options.insert_or_assign("DataVersion", dataVersion);
    if (ticket)
        options.emplace("APTicket", std::move(*ticket));
    options.emplace("DataStore", isRemote ? "Remote" : "Local");
    return options;
}

Value ZPOrlo::makePermissionsWithOrloAction(OrloAction action, const Value& dataClass,
                                            const Value& dataInstance) const {
    return QDOrloDataCreatePermissionsString(orloRef(), action, dataClass, dataInstance);
}

std::optional<Error> ZPOrlo::setPermissionString(OrloAction action, const Value& dataClass, const Value& dataInstance) {
    Value permissions = makePermissionsWithOrloAction(action, dataClass, dataInstance);
    if (permissions.isNothing())
        return makeError(permissionNil);
    zplog.info("permission string : %@", permissions);
    QDOrloSetOption(orloRef(), "Permissions", std::move(permissions));
    return std::nullopt;
}

std::optional<Error> ZPOrlo::setTrustObject() {
    Value::Data trustObject;
    std::optional<Error> libraryError;
    const bool copied = QDOrloDataCopyTrustObject(orloRef(), trustObjectURL, &trustObject, &libraryError);
    zplog.info("QDOrloDataCopyTrustObject retVal : %u", copied ? 1 : 0);
    if (!copied && libraryError)
        return makeError(trustObjectFailed, libraryError->text);
    if (!copied)
        return makeError(trustObjectFailedSilently);
    return setTrustObjectOptions(zplog, errorDomain, orloRef(), trustObject, digestFailed, digestValueFailed);
}

std::optional<Error> ZPOrlo::prepare(OrloAction action, const Value& dataClass, const Value& dataInstance) {
    zplog.info("setting up permissions");
    if (std::optional<Error> error = setPermissionString(action, dataClass, dataInstance)) {
        zplog.info("setting up permissions failure");
        return error;
    }
    zplog.info("setting up trust object");
    if (std::optional<Error> error = setTrustObject()) {
        zplog.info("trust object failure");
        return error;
    }
    return std::nullopt;
}

std::optional<Error> ZPOrlo::orloPut(const Value& dataClass, const Value& dataInstance, const Value::Data& data,
                                     Value*) {
    if (std::optional<Error> error = prepare(OrloActionPut, dataClass, dataInstance))
        return error;
    zplog.info("Performing Orlo Put");
    std::optional<Error> libraryError;
    const bool stored = QDOrloDataPut(orloRef(), dataClass, dataInstance, data, &libraryError);
    zplog.info("orloPut : %u", stored ? 1 : 0);
    if (!stored)
        return makeError(putFailed);
    zplog.info("Orlo Put was successful : %u", 1);
    return std::nullopt;
}

std::optional<Error> ZPOrlo::orloGet(const Value& dataClass, const Value& dataInstance, Value::Data& data, Value*) {
    if (std::optional<Error> error = prepare(OrloActionGet, dataClass, dataInstance))
        return error;
    zplog.info("Performing Orlo Get");
    zplog.info("dataClass : %@", dataClass);
    zplog.info("dataInstance : %@", dataInstance);
    std::optional<Error> libraryError;
    std::optional<Value::Data> fetched = QDOrloDataCopy(orloRef(), dataClass, dataInstance, &libraryError);
    if (fetched) {
        zplog.info("orloGet  - SUCCESS ");
        data = std::move(*fetched);
        return std::nullopt;
    }
    zplog.error("orloGet  - Failure : %@", libraryError);
    return libraryError ? libraryError : makeError(getFailedSilently);
}
