#include "tests/platform/DataStoreDouble.h"

#include "platform/Crypto.h"
#include "platform/Format.h"

struct __QDOrlo {};

namespace {

DataStoreDouble& store() {
    return dataStoreDouble();
}

template <class... Arguments>
void record(const char* call, const Arguments&... arguments) {
    store().calls.push_back(format(call, arguments...));
}

bool answer(bool succeeds, const std::optional<Error>& error, std::optional<Error>* filled) {
    if (!succeeds)
        *filled = error;
    return succeeds;
}

} // namespace

DataStoreDouble& dataStoreDouble() {
    static DataStoreDouble instance;
    return instance;
}

void QDOrloLogSetHandler(QDOrloLogHandler handler) {
    store().logHandler = handler;
}

__QDOrlo* QDOrloCreateWithOptions(Value options) {
    record("create");
    store().createdWith = store().options = *options.dictionary();
    if (!store().makesSessions)
        return nullptr;
    auto* const session = new __QDOrlo;
    ++store().liveSessions;
    return session;
}

void QDOrloSetOption(__QDOrlo*, std::string_view key, Value value) {
    record("set %@", key);
    store().options.insert_or_assign(std::string(key), std::move(value));
}

Value QDOrloDataCreatePermissionsString(__QDOrlo* session, std::int32_t action, const Value& dataClass,
                                        const Value& instance) {
    record("permit %d %@ %@", action, dataClass, instance);
    return session && store().grants ? Value(format("<%d %@ %@>", action, dataClass, instance)) : Value();
}

bool QDOrloAppendPermissionsString(std::int32_t action, const Value& dataClass, const Value& instance,
                                   std::string& permissions) {
    record("append %d %@ %@", action, dataClass, instance);
    permissions += format("<%d %@ %@>", action, dataClass, instance);
    return store().grants;
}

bool QDOrloDataCopyTrustObject(__QDOrlo*, std::string_view url, Value::Data* trustObject, std::optional<Error>* error) {
    record("trust %@", url);
    if (store().trustObject)
        *trustObject = *store().trustObject;
    return answer(store().trustObject.has_value(), store().trustError, error);
}

bool QDOrloDataPut(__QDOrlo*, const Value& dataClass, const Value& instance, const Value::Data& data,
                   std::optional<Error>* error) {
    record("put %@ %@ %@", dataClass, instance, Value(data));
    return answer(store().puts, store().putError, error);
}

std::optional<Value::Data> QDOrloDataCopy(__QDOrlo*, const Value& dataClass, const Value& instance,
                                          std::optional<Error>* error) {
    record("copy %@ %@", dataClass, instance);
    answer(store().record.has_value(), store().getError, error);
    return store().record;
}

bool QDOrloDataMultiExport(__QDOrlo*, const Value::Array& classes, const Value::Array& instances,
                           std::optional<Error>* error) {
    record("export");
    store().classes = classes;
    store().instances = instances;
    return answer(store().exports, store().exportError, error);
}

std::uint32_t QDOrloSealingMapGetOrloDataVersionForDevice(const Value::Data& apTicket) {
    record("version %@", Value(apTicket));
    return store().dataVersion;
}

std::int32_t QDSupportDigestSha256(const void* bytes, std::uint32_t length, std::uint8_t* digest) {
    crypto::sha256(bytes, length, digest);
    if (store().afterDigest)
        store().afterDigest();
    return store().digestStatus;
}

void QDSupportSafeRelease(__QDOrlo* session) {
    if (session)
        --store().liveSessions;
    delete session;
}

const KelvoDataAccessor& KelvoDataAccessor::sharedDataAccessor() {
    static const KelvoDataAccessor shared;
    return shared;
}

Value KelvoDataAccessor::copyPathForPersonalizedData(std::int64_t kind, std::optional<Error>* error) const {
    record("path %ld", kind);
    *error = store().ticketPathError;
    return store().ticketPath;
}
