// What the data-store client library asks of a place where records are kept. Permissions and the trust object's digest
// are the library's own to check, before it calls a backend.
#ifndef VELTRA_PLATFORM_LINUX_ORLO_STORE_BACKEND_H
#define VELTRA_PLATFORM_LINUX_ORLO_STORE_BACKEND_H

#include <cstdint>
#include <memory>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Crypto.h"
#include "platform/OrloDataStore.h"
#include "platform/ShownText.h"

// Why an operation of a backend failed. The reason does not tell user and password of a URL.
class OrloStoreFailure : public std::runtime_error {
public:
    OrloStoreFailure(QDOrloErrorCode code, const std::string& reason)
        : std::runtime_error(withoutUserInfo(reason)), code_(code) {}
    QDOrloErrorCode code() const { return code_; }

private:
    QDOrloErrorCode code_;
};

// The names of a record; neither is empty.
struct OrloRecordName {
    std::string_view dataClass;
    std::string_view instance;
};

// The options of a session, a dictionary, as they are when an operation is called.
using OrloOptions = Value;

// Belongs to one session. Every operation raises OrloStoreFailure on failure and then has changed nothing.
class OrloStoreBackend {
public:
    virtual ~OrloStoreBackend() = default;

    // The store's trust object for the session to hold, from `url` when the store is a server.
    virtual Value::Data trustObject(const OrloOptions& options, std::string_view url) = 0;

    // The store's trust object as what the session holds is measured by, before each operation: from where nobody but
    // the store can have put it.
    virtual Value::Data trustMeasure(const OrloOptions& options) = 0;

    // The library has measured the session's "TrustObjectDigest" before it calls these.
    virtual void put(const OrloOptions& options, const OrloRecordName& name, const Value::Data& data) = 0;
    virtual Value::Data copy(const OrloOptions& options, const OrloRecordName& name) = 0;
    virtual void multiExport(const OrloOptions& options, const std::vector<OrloRecordName>& names) = 0;
};

// The data version and the SHA-256 of the AP ticket, in hexadecimal, of a session's options; the library has seen to it
// that they are there. The second raises OrloStoreFailure.
inline std::int64_t dataVersionOf(const OrloOptions& options) {
    return *options["DataVersion"].integer();
}
std::string ticketDigestOf(const OrloOptions& options);

// The backend that the description names and whether it could be opened when a session was last to have it, for people.
// Opens nothing. Any thread.
std::string orloStoreState();

// A backend on the database that "path" of the description's "store" names.
std::unique_ptr<OrloStoreBackend> openEmbeddedStore(const Value& store);

// A backend on the servers that the session's options name, reached as "connectTo", "caFile" and "s3" of the
// description's "store" say.
std::unique_ptr<OrloStoreBackend> openRemoteStore(const Value& store);

#endif
