#include "orlo/ZPOrloExport.h"

#include <chrono>
#include <string>
#include <utility>

#include "Daemon/HSLog.h"
#include "orlo/OrloEndpoints.h"
#include "orlo/OrloSession.h"
#include "platform/Pause.h"

namespace {

constexpr LogSource zplog{"ZPOrloExport"};
constexpr const char* errorDomain = "OrloExport";
constexpr const char* operationName = "+[ZPOrloExport orloExportCommandWithResponse:options:response:]";
constexpr std::int64_t dataVersion = 1;
constexpr std::chrono::milliseconds pauseAfterFailure{10};
constexpr std::size_t expectedGrantLength = 32;

constexpr OrloErrorRow noInstances{2002, "Orlo Export Failed Not being able to get data instances due to %@",
                                   "Could not generate data instances"};
constexpr OrloErrorRow noClassList{2002, "Orlo Export Failed due to - DataClass allocation failure",
                                   "DataClass allocation failure"};
constexpr OrloErrorRow noInstanceList{2003, "Orlo Export Failed due to - Data Instance is NULL",
                                      "Data Instance is NULL"};
constexpr OrloErrorRow noPermissions{2004, "Orlo Export Failed due to - Permissions allocation error", nullptr};
constexpr OrloErrorRow noGrant{2004, "Orlo Export Failed due to - Permissions creation error",
                               "QDOrloCreatePermissionsString failed"};
constexpr OrloErrorRow noSession{2006, "ZephyrineExport Upload Failed due to - Orlo Object Create Error",
                                 "QDOrloCreateWithOptions failed"};
// Without a boot ticket the library is not asked, and the line is the one about the ticket.
constexpr OrloErrorRow noTicket{noSession.code, noSession.description, nullptr};
constexpr OrloErrorRow trustObjectFailed{
    2007, "Orlo Export Failed due to - Trust Object Copy from Server failed with Reason --> %@",
    "QDOrloDataCopyTrustObject failed"};
constexpr OrloErrorRow trustObjectFailedSilently{2007,
                                                 "Orlo Export Failed due to - Trust Object Copy from Server failed "
                                                 "with Reason --> Unknown due to unfilled error",
                                                 "QDOrloDataCopyTrustObject failed"};
constexpr OrloErrorRow countsDiffer{2007, "Data Instances count does not match Data classes count",
                                    "Data Instances count does not match Data classes count"};
constexpr OrloErrorRow digestFailed{
    2008, "Orlo Export Failed due to - Trust Object Digest Generation failed with Status --> %d",
    "QDSupportDigestSha256 failed"};
constexpr OrloErrorRow digestValueFailed{2009, "Orlo Export Failed due to - Trust Object Digest Create failed",
                                         "KVDataCreate failed"};
constexpr OrloErrorRow exportFailed{2012, "Orlo Export Failed due to - Data Upload to server failed with Reason --> %@",
                                    "QDOrloDataExport failed"};
constexpr OrloErrorRow exportFailedSilently{2012,
                                            "Orlo Export Failed due to - Data Upload to server failed with Reason --> "
                                            "Unknown due to unfilled error for key %@ and instance %@",
                                            "QDOrloDataExport failed"};

template <class... Arguments>
Error makeError(OrloErrorHere here, const Arguments&... arguments) {
    return makeOrloError(zplog, errorDomain, here, arguments...);
}

void orloExportLogHandler(void*, const char* message) {
    zplog.info("%s\n", std::string_view(message));
}

const std::pair<const char*, Value> fixedOptions[] = {
    {"CAURL", certificateAuthorityURL},
    {"DSURL", dataStoreURL},
    {"VerifyData", false},
    {"StripImg4", true},
    {"EnableProxy", true},
    {"EnableProxySsl", "ForHttps"},
    {"OrganizationalUnit", "Devices - Stations"},
    {"DataStore", "Remote"},
    {"UseSikDataInstance", false},
    {"DataVersion", dataVersion},
};

// The export of one dictionary, step by step; each step may end it with an error.
class Export {
public:
    explicit Export(const Value::Dictionary& instances) : dictionary_(instances) {}

    std::optional<Error> run() {
        for (const auto step : {&Export::makeLists, &Export::makePermissions, &Export::openSession,
                                &Export::setTrustObject, &Export::upload})
            if (std::optional<Error> error = (this->*step)())
                return error;
        return std::nullopt;
    }

private:
    std::optional<Error> makeLists() {
        zplog.info("%s:%d", operationName, __LINE__);
        if (!madeIfMemorySuffices([this] {
                for (const auto& entry : dictionary_)
                    classes_.emplace_back(entry.first);
                return true;
            }))
            return makeError(noClassList);
        zplog.info("%s:%d", operationName, __LINE__);
        if (!madeIfMemorySuffices([this] {
                for (const auto& entry : dictionary_)
                    instances_.push_back(entry.second);
                return true;
            }))
            return makeError(noInstanceList);
        zplog.info("%s:%d", operationName, __LINE__);
        return std::nullopt;
    }

    std::optional<Error> makePermissions() {
        if (!madeIfMemorySuffices([this] {
                permissions_.reserve(dictionary_.size() * expectedGrantLength);
                return true;
            }))
            return makeError(noPermissions);
        for (const auto& [dataClass, instance] : dictionary_)
            if (!QDOrloAppendPermissionsString(OrloActionExport, dataClass, instance, permissions_))
                return makeError(noGrant);
        zplog.info(" Exporting with this Permission String: %@ ", permissions_);
        return std::nullopt;
    }

    std::optional<Error> openSession() {
        std::optional<Value::Data> ticket = readApTicket(zplog);
        if (!ticket)
            return makeError(noTicket);
        zplog.info("Adding apTicket Data  : %lu", ticket->size());
        zplog.info("Setting Data Local Encode version to : %u", dataVersion);
        Value::Dictionary options(std::begin(fixedOptions), std::end(fixedOptions));
        options.emplace("Permissions", std::move(permissions_));
        options.emplace("APTicket", std::move(*ticket));
        session_.reset(QDOrloCreateWithOptions(std::move(options)));
        if (!session_)
            return makeError(noSession);
        return std::nullopt;
    }

    std::optional<Error> setTrustObject() {
        Value::Data trustObject;
        if (!QDOrloDataCopyTrustObject(session_.get(), trustObjectURL, &trustObject, &libraryError_))
            return libraryError_ ? makeError(trustObjectFailed, libraryError_->text)
                                 : makeError(trustObjectFailedSilently);
        return setTrustObjectOptions(zplog, errorDomain, session_.get(), trustObject, digestFailed, digestValueFailed);
    }

    std::optional<Error> upload() {
        zplog.info("Classes [%lu] : %@ Instances [%lu] : %@", classes_.size(), Value(classes_), instances_.size(),
                   Value(instances_));
        if (classes_.size() != instances_.size())
            return makeError(countsDiffer);
        zplog.info("Orlo Export Attempt #%d... ", 1);
        if (QDOrloDataMultiExport(session_.get(), classes_, instances_, &libraryError_)) {
            zplog.info("Successfully exported Orlo Data");
            return std::nullopt;
        }
        pauseFor(pauseAfterFailure);
        return libraryError_ ? makeError(exportFailed, libraryError_->text)
                             : makeError(exportFailedSilently, nullptr, nullptr);
    }

    const Value::Dictionary& dictionary_;
    Value::Array classes_;
    Value::Array instances_;
    std::string permissions_;
    OrloSessionPtr session_;
    std::optional<Error> libraryError_;
};

} // namespace

std::optional<Error> ZPOrloExport::orloExportCommandWithResponse(const Value& dataInstances, const Value&, Value*) {
    QDOrloLogSetHandler(orloExportLogHandler);
    const Value::Dictionary* dictionary = dataInstances.dictionary();
    if (!dictionary)
        return makeError(noInstances, nullptr);
    zplog.info("Generated data instance dict %@", dataInstances);
    return Export(*dictionary).run();
}
