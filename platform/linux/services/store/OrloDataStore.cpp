// The data-store client library: sessions, permissions and the check of the trust object, the same on every backend.
#include "platform/OrloDataStore.h"

#include <algorithm>
#include <atomic>
#include <exception>
#include <limits>
#include <memory>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include "platform/Format.h"
#include "platform/Hexadecimal.h"
#include "platform/Utf8.h"
#include "platform/linux/services/device/DeviceDescription.h"
#include "platform/linux/services/store/OrloStoreBackend.h"

struct __QDOrlo {
    OrloOptions options = Value::Dictionary{};
    std::unique_ptr<OrloStoreBackend> backend;
};

namespace {

constexpr const char* errorDomain = "QDOrloErrorDomain";
constexpr std::int64_t defaultDataVersion = 2;
constexpr std::int64_t largestDataVersion = std::numeric_limits<std::uint32_t>::max();

std::atomic<QDOrloLogHandler> logHandler = nullptr;

constexpr struct {
    std::string_view name;
    std::unique_ptr<OrloStoreBackend> (*open)(const Value& store);
} backends[] = {
    {"embedded", openEmbeddedStore},
    {"remote", openRemoteStore},
};

void libraryLog(std::string_view text) {
    if (const QDOrloLogHandler handler = logHandler)
        handler(nullptr, utf8::escaped(text).c_str());
}

bool isDataVersion(const Value& value) {
    const auto number = value.integer();
    return number && !value.isBoolean() && *number >= 0 && *number <= largestDataVersion;
}

// Raises for options without what no session can do without; the backend's own needs come on top.
void requireOptions(const OrloOptions& options) {
    const Value::Data* ticket = options["APTicket"].data();
    if (!ticket || ticket->empty())
        throw OrloStoreFailure(QDOrloErrorNotPermitted, "There is no AP ticket");
    if (!isDataVersion(options["DataVersion"]))
        throw OrloStoreFailure(QDOrloErrorNotPermitted, "There is no data version");
}

// The backend that the description names, the first one unless it names any.
std::string backendName(const Value& chosen) {
    return chosen.isNothing() ? std::string(backends[0].name) : chosen.description();
}

std::unique_ptr<OrloStoreBackend> openBackend(const Value& store) {
    const std::string name = backendName(store["backend"]);
    for (const auto& backend : backends)
        if (name == backend.name)
            return backend.open(store);
    throw OrloStoreFailure(QDOrloErrorStorage, "There is no backend " + name);
}

// How the backend that a session was last to have could be opened.
struct LastOpening {
    std::mutex mutex; // guards what follows
    std::string backend;
    std::string outcome;
};

LastOpening& lastOpening() {
    static auto* const last = new LastOpening; // never destroyed: threads may ask until the process is gone
    return *last;
}

// Leaves an older note where memory does not suffice for the new one.
void noteOpening(const Value& store, const char* outcome, const char* reason = "") noexcept try {
    LastOpening& last = lastOpening();
    const std::lock_guard lock(last.mutex);
    last.backend = backendName(store["backend"]);
    last.outcome = std::string(outcome) + reason;
} catch (const std::exception&) {
    return;
}

std::unique_ptr<OrloStoreBackend> openDescribedBackend() {
    const Value store = resolveDescribed(deviceDescription()["store"]);
    try {
        std::unique_ptr<OrloStoreBackend> backend = openBackend(store);
        noteOpening(store, "opened");
        return backend;
    } catch (const std::exception& failure) {
        noteOpening(store, "could not be opened: ", failure.what());
        throw;
    }
}

// The text of a class or an instance, or null when it names no record or would change the meaning of a grant.
const std::string* grantable(const Value& name, std::string_view separators) {
    const std::string* text = name.text();
    return text && !text->empty() && text->find_first_of(separators) == std::string::npos ? text : nullptr;
}

// Whether the option "Permissions" has exactly this grant.
bool isGranted(const OrloOptions& options, const std::string& grant) {
    const std::string* permissions = options["Permissions"].text();
    return permissions && (";" + *permissions + ";").find(";" + grant + ";") != std::string::npos;
}

// Holds the session to its permissions. What is returned are views of the arguments.
OrloRecordName requireGrant(const __QDOrlo& session, std::int32_t action, const Value& dataClass,
                            const Value& instance) {
    std::string grant;
    if (!QDOrloAppendPermissionsString(action, dataClass, instance, grant) || !isGranted(session.options, grant))
        throw OrloStoreFailure(QDOrloErrorNotPermitted, format("The session has no grant for action %d on %@ of %@",
                                                               action, dataClass, instance));
    return {*dataClass.text(), *instance.text()};
}

// Holds the session to the store's trust object.
void requireTrust(const __QDOrlo& session) {
    const Value::Data measure = session.backend->trustMeasure(session.options);
    std::uint8_t digest[crypto::sha256Size];
    if (!crypto::sha256(measure.data(), measure.size(), digest))
        throw OrloStoreFailure(QDOrloErrorStorage, "The trust object cannot be digested");
    const Value::Data* held = session.options["TrustObjectDigest"].data();
    if (!held || !std::equal(held->begin(), held->end(), std::begin(digest), std::end(digest)))
        throw OrloStoreFailure(QDOrloErrorTrustObjectMismatch,
                               "The session's trust object digest is not that of the store's trust object");
}

// Does the work of an operation on a session and reports its failure. Out of memory is a failure without an error.
template <class Work>
bool perform(const char* operation, const __QDOrlo* session, std::optional<Error>* error, Work work) try {
    try {
        if (!session)
            throw OrloStoreFailure(QDOrloErrorNotPermitted, "There is no session");
        requireOptions(session->options);
        work();
        return true;
    } catch (const OrloStoreFailure& failure) {
        libraryLog(format("%s: %s", operation, failure.what()));
        if (error)
            *error = Error{errorDomain, failure.code(), failure.what()};
        return false;
    }
} catch (const std::exception&) {
    return false;
}

} // namespace

std::string orloStoreState() {
    const std::string name = backendName(resolveDescribed(deviceDescriptionUnreported()["store"]["backend"]));
    LastOpening& last = lastOpening();
    const std::lock_guard lock(last.mutex);
    return name + ": " + (name == last.backend ? last.outcome : "not opened yet");
}

std::string ticketDigestOf(const OrloOptions& options) {
    const Value::Data& ticket = *options["APTicket"].data();
    std::uint8_t digest[crypto::sha256Size];
    if (!crypto::sha256(ticket.data(), ticket.size(), digest))
        throw OrloStoreFailure(QDOrloErrorStorage, "The AP ticket cannot be digested");
    return hexadecimal(digest);
}

void QDOrloLogSetHandler(QDOrloLogHandler handler) {
    logHandler = handler;
}

__QDOrlo* QDOrloCreateWithOptions(Value options) try {
    auto session = std::make_unique<__QDOrlo>();
    if (options.dictionary())
        session->options = std::move(options);
    try {
        requireOptions(session->options);
        session->backend = openDescribedBackend();
    } catch (const OrloStoreFailure& failure) {
        libraryLog(format("Session: %s", failure.what()));
        return nullptr;
    }
    return session.release();
} catch (const std::exception&) {
    return nullptr;
}

void QDOrloSetOption(__QDOrlo* session, std::string_view key, Value value) {
    if (session)
        session->options.dictionary()->insert_or_assign(std::string(key), std::move(value));
}

Value QDOrloDataCreatePermissionsString(__QDOrlo* session, std::int32_t action, const Value& dataClass,
                                        const Value& dataInstance) {
    std::string permissions;
    if (!session || !QDOrloAppendPermissionsString(action, dataClass, dataInstance, permissions))
        return {};
    return permissions;
}

bool QDOrloAppendPermissionsString(std::int32_t action, const Value& dataClass, const Value& dataInstance,
                                   std::string& permissions) {
    const std::string* const classText = grantable(dataClass, ":;");
    const std::string* const instanceText = grantable(dataInstance, ";");
    if (!classText || !instanceText)
        return false;
    if (!permissions.empty())
        permissions += ';';
    permissions += std::to_string(action);
    (permissions += ':') += *classText;
    (permissions += ':') += *instanceText;
    return true;
}

bool QDOrloDataCopyTrustObject(__QDOrlo* session, std::string_view url, Value::Data* trustObject,
                               std::optional<Error>* error) {
    return perform("Trust object", session, error,
                   [&] { *trustObject = session->backend->trustObject(session->options, url); });
}

bool QDOrloDataPut(__QDOrlo* session, const Value& dataClass, const Value& dataInstance, const Value::Data& data,
                   std::optional<Error>* error) {
    return perform("Put", session, error, [&] {
        const OrloRecordName name = requireGrant(*session, OrloActionPut, dataClass, dataInstance);
        requireTrust(*session);
        session->backend->put(session->options, name, data);
    });
}

std::optional<Value::Data> QDOrloDataCopy(__QDOrlo* session, const Value& dataClass, const Value& dataInstance,
                                          std::optional<Error>* error) {
    std::optional<Value::Data> data;
    perform("Get", session, error, [&] {
        const OrloRecordName name = requireGrant(*session, OrloActionGet, dataClass, dataInstance);
        requireTrust(*session);
        data = session->backend->copy(session->options, name);
    });
    return data;
}

bool QDOrloDataMultiExport(__QDOrlo* session, const Value::Array& classes, const Value::Array& instances,
                           std::optional<Error>* error) {
    return perform("Export", session, error, [&] {
        if (classes.size() != instances.size())
            throw OrloStoreFailure(QDOrloErrorNotPermitted, "There are not as many instances as classes");
        std::vector<OrloRecordName> names;
        for (std::size_t i = 0; i < classes.size(); ++i)
            names.push_back(requireGrant(*session, OrloActionExport, classes[i], instances[i]));
        requireTrust(*session);
        session->backend->multiExport(session->options, names);
    });
}

std::uint32_t QDOrloSealingMapGetOrloDataVersionForDevice(const Value::Data&) {
    const Value version = resolveDescribed(deviceDescription()["store"]["dataVersion"]);
    return static_cast<std::uint32_t>(isDataVersion(version) ? *version.integer() : defaultDataVersion);
}

std::int32_t QDSupportDigestSha256(const void* bytes, std::uint32_t length, std::uint8_t* digest) {
    return crypto::sha256(bytes, length, digest) ? 0 : 1;
}

void QDSupportSafeRelease(__QDOrlo* session) {
    delete session;
}

const KelvoDataAccessor& KelvoDataAccessor::sharedDataAccessor() {
    static const KelvoDataAccessor shared;
    return shared;
}

Value KelvoDataAccessor::copyPathForPersonalizedData(std::int64_t kind, std::optional<Error>* error) const {
    if (kind == apTicketKind)
        return "/System/Library/Caches/apticket.der";
    if (error)
        *error = Error{"KelvoErrorDomain", 1, format("The device keeps no personalised data of kind %ld", kind)};
    return {};
}
