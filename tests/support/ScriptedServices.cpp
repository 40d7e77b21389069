#include "tests/support/ScriptedServices.h"

#include <chrono>
#include <thread>
#include <utility>
#include <vector>

#include "platform/Crypto.h"
#include "platform/Format.h"
#include "platform/HostFramework.h"
#include "platform/OrloDataStore.h"
#include "platform/Pairing.h"
#include "platform/Pause.h"
#include "platform/VanterUpdater.h"
#include "tests/support/FailingAllocation.h"
#include "tests/support/RecordedLog.h"

struct __QDOrlo {};
class VanterUpdater {};
struct VeltraPluginServer::Connection {};

std::map<std::string, Outcome, std::less<>> outcomes;
Value::Dictionary sessionOptions;
int liveSessions = 0;
RPAvailabilityCallback availabilityCallback;

namespace {

QDOrloLogHandler logHandler = nullptr;

const Outcome& outcomeOf(std::string_view operation) {
    static const Outcome usual;
    const auto found = outcomes.find(operation);
    return found == outcomes.end() ? usual : found->second;
}

// Records a call, with its arguments, and says what it does.
template <class... Arguments>
const Outcome& called(const char* operation, const char* shown = "", const Arguments&... arguments) {
    recordCall(operation + format(shown, arguments...));
    return outcomeOf(operation);
}

// Records a release, which nobody expects to raise.
void released(const char* operation) try { recordCall(operation); } catch (const std::bad_alloc&) {
    return;
}

bool answer(const Outcome& outcome, std::optional<Error>* error, Value* output = nullptr) {
    if (outcome.error)
        *error = outcome.error;
    if (output)
        *output = outcome.output;
    return outcome.result;
}

Value::Data bytesOf(const Value& value) {
    if (const std::string* text = value.text())
        return {text->begin(), text->end()};
    return value.data() ? *value.data() : Value::Data();
}

std::string grant(std::int32_t action, const Value& dataClass, const Value& instance) {
    return format("%d:%@:%@", action, dataClass, instance);
}

} // namespace

void arrangeServices() {
    sessionOptions.clear();
    outcomes = {
        {"QDOrloDataCopyTrustObject", {.output = "trust"}},
        {"QDOrloDataCopy", {.output = "record"}},
        {"QDOrloSealingMapGetOrloDataVersionForDevice", {.output = 7}},
        {"copyPathForPersonalizedData", {.output = "/ticket"}},
        {"RPRegistrationResume", {.output = Value::Array{1}}},
        {"RPCopyProxyDictionaryWithOptions", {.output = Value::Dictionary{{"HTTPSEnable", 1}}}},
        {"BWCPairCorvoWithProxy", {.output = Value::Array{"tick"}}},
        {"VanterUpdaterIsDone", {.result = false}},
        {"queryInfo", {.output = Value::Dictionary{{"Digest", Value::Data{0xAB, 0x0C}}}}},
        {"performNextStage", {.output = Value::Dictionary{{"Stage", 1}}}},
    };
}

void QDOrloLogSetHandler(QDOrloLogHandler handler) {
    logHandler = handler;
}

__QDOrlo* QDOrloCreateWithOptions(Value given) {
    const bool result = called("QDOrloCreateWithOptions").result;
    logHandler(nullptr, "from the library");
    sessionOptions = *given.dictionary();
    auto* const session = result ? new __QDOrlo : nullptr;
    liveSessions += result;
    return session;
}

void QDOrloSetOption(__QDOrlo*, std::string_view key, Value value) {
    called("QDOrloSetOption", " %@", key);
    sessionOptions.insert_or_assign(std::string(key), std::move(value));
}

Value QDOrloDataCreatePermissionsString(__QDOrlo* session, std::int32_t action, const Value& dataClass,
                                        const Value& instance) {
    const std::string permissions = grant(action, dataClass, instance);
    return called("QDOrloDataCreatePermissionsString", " %@", permissions).result && session ? permissions : Value();
}

bool QDOrloAppendPermissionsString(std::int32_t action, const Value& dataClass, const Value& instance,
                                   std::string& permissions) {
    const std::string more = grant(action, dataClass, instance);
    permissions += more + ";";
    return called("QDOrloAppendPermissionsString", " %@", more).result;
}

bool QDOrloDataCopyTrustObject(__QDOrlo*, std::string_view url, Value::Data* trustObject, std::optional<Error>* error) {
    const Outcome& outcome = called("QDOrloDataCopyTrustObject", " %@", url);
    *trustObject = bytesOf(outcome.output);
    return answer(outcome, error);
}

bool QDOrloDataPut(__QDOrlo*, const Value& dataClass, const Value& instance, const Value::Data& data,
                   std::optional<Error>* error) {
    return answer(called("QDOrloDataPut", " %@ %@ %@", dataClass, instance, Value(data)), error);
}

std::optional<Value::Data> QDOrloDataCopy(__QDOrlo*, const Value& dataClass, const Value& instance,
                                          std::optional<Error>* error) {
    const Outcome& outcome = called("QDOrloDataCopy", " %@ %@", dataClass, instance);
    return answer(outcome, error) ? std::optional(bytesOf(outcome.output)) : std::nullopt;
}

bool QDOrloDataMultiExport(__QDOrlo*, const Value::Array& classes, const Value::Array& instances,
                           std::optional<Error>* error) {
    return answer(called("QDOrloDataMultiExport", " %@ %@", Value(classes), Value(instances)), error);
}

std::uint32_t QDOrloSealingMapGetOrloDataVersionForDevice(const Value::Data& apTicket) {
    const Outcome& outcome = called("QDOrloSealingMapGetOrloDataVersionForDevice", " %@", Value(apTicket));
    return static_cast<std::uint32_t>(outcome.output.integer().value_or(0));
}

std::int32_t QDSupportDigestSha256(const void* bytes, std::uint32_t length, std::uint8_t* digest) {
    const Outcome& outcome = called("QDSupportDigestSha256", " of %u bytes", length);
    crypto::sha256(bytes, length, digest);
    if (outcome.memoryEnds)
        failAllocation(1);
    return static_cast<std::int32_t>(outcome.output.integer().value_or(0));
}

void QDSupportSafeRelease(__QDOrlo* session) {
    if (!session)
        return;
    released("QDSupportSafeRelease");
    --liveSessions;
    delete session;
}

const KelvoDataAccessor& KelvoDataAccessor::sharedDataAccessor() {
    static const KelvoDataAccessor shared;
    return shared;
}

Value KelvoDataAccessor::copyPathForPersonalizedData(std::int64_t kind, std::optional<Error>* error) const {
    Value path;
    answer(called("copyPathForPersonalizedData", " %ld", kind), error, &path);
    return path;
}

// Allocates nothing, since nobody would catch what a thread raises.
static void deliver(const Value& output) {
    if (const Value::Array* statuses = output.array())
        for (const Value& status : *statuses)
            availabilityCallback(static_cast<std::int32_t>(*status.integer()));
}

// Delivers the statuses of a resume on a thread of its own, those of an invalidation while it is invalidated.
class RPRegistration {
public:
    std::chrono::steady_clock::time_point resumed;
    std::jthread deliverer;
};

RPRegistration* RPRegisterForAvailability(RPAvailabilityCallback given) {
    availabilityCallback = std::move(given);
    return called("RPRegisterForAvailability").result ? new RPRegistration : nullptr;
}

void RPRegistrationResume(RPRegistration* registration) {
    const Value output = called("RPRegistrationResume").output;
    registration->resumed = std::chrono::steady_clock::now();
    registration->deliverer = std::jthread([output] { deliver(output); });
}

// Says after how many seconds, in steps of five, since on a busy machine a thread may be late.
void RPRegistrationInvalidate(RPRegistration* registration) {
    const auto waited = std::chrono::steady_clock::now() - registration->resumed;
    deliver(outcomeOf("RPRegistrationInvalidate").output);
    const std::string shown = format(" after %ld s", waited / std::chrono::seconds(5) * 5);
    called("RPRegistrationInvalidate", shown.c_str());
}

void RPRelease(RPRegistration* registration) {
    released("RPRelease");
    delete registration;
}

Value RPCopyProxyDictionaryWithOptions(const std::string& url, const Value& given) {
    return called("RPCopyProxyDictionaryWithOptions", " %@ %@", url, given).output;
}

SystemLog* getLogHandle(int number) {
    return number == 1 ? systemLogCreate("host", "framework") : nullptr;
}

void pauseFor(std::chrono::milliseconds duration) {
    called("pauseFor", " %ld ms", duration.count());
}

bool BWCProvisionCorvoWithProxy(const std::string& url, const Value& proxy, std::optional<Error>* error) {
    return answer(called("BWCProvisionCorvoWithProxy", " %@ %@", url, proxy), error);
}

bool BWCPairCorvoWithProxy(const std::string& url, const Value& proxy, std::optional<Error>* error,
                           const BWCPatchLoad& loadPatch) {
    const Outcome& outcome = called("BWCPairCorvoWithProxy", " %@ %@", url, proxy);
    for (const Value& ticket : *outcome.output.array()) {
        const Value::Data bytes = bytesOf(ticket);
        const auto length = static_cast<std::size_t>(ticket.integer().value_or(std::ssize(bytes)));
        recordCall(format("the patch load returned %d", loadPatch(bytes.data(), length)));
    }
    return answer(outcome, error);
}

VanterUpdater* VanterUpdaterCreate(const Value& given, VanterUpdaterLog log, std::string_view name,
                                   std::optional<Error>* error) {
    const Outcome& outcome = called("VanterUpdaterCreate", " %@ %@", name, given);
    log("first", "second");
    return answer(outcome, error) ? new VanterUpdater : nullptr;
}

bool VanterUpdaterIsDone(VanterUpdater*, std::optional<Error>* error) {
    return answer(called("VanterUpdaterIsDone"), error);
}

bool VanterUpdaterExecCommand(VanterUpdater*, std::string_view step, const Value& given, Value* output,
                              std::optional<Error>* error) {
    called("VanterUpdaterExecCommand", " %@ %@", step, given);
    return answer(outcomeOf(step), error, output);
}

void VanterUpdaterRelease(VanterUpdater* updater) {
    if (updater)
        released("VanterUpdaterRelease");
    delete updater;
}

VeltraPluginServer::~VeltraPluginServer() = default;

bool VeltraPluginServer::initWithServiceName(std::string_view, std::string_view) {
    return true;
}

void VeltraPluginServer::resume() {}
