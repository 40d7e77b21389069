// The data-store client library: how the plug-in reaches the Orlo store, and where the device's boot ticket is.
//
// The store keeps records. A record is the bytes under a data class, a text of four characters ("psd2"), and a data
// instance, a text that names one component (a serial number). Classes and instances travel as values, since a
// component may have no identity: a value of nothing, an empty text and every other kind name no record.
//
// A session is made from options (QDOrloCreateWithOptions), is given a permission and the store's trust object as
// further options, and then serves operations. It holds the caller to its word: put, get and export are refused unless
//   - the option "Permissions" has the exact grant for the action, the class and the instance, and
//   - the option "TrustObjectDigest" is the SHA-256 of the store's trust object, as it is at the operation or, of a
//     remote store, as "CAURL" gave it over TLS since the session last fetched it.
// A grant is the text "<action>:<class>:<instance>"; grants are joined by ";".
//
// Every operation is synchronous. A session serves one thread at a time; sessions are independent of each other, also
// of those of other processes on the same store. A session of null is one that could not be made: operations on it fail
// with an error, and setting an option does nothing. What an operation returns or fills belongs to the caller.
//
// An error out-value may be null. It is filled with an error of the domain "QDOrloErrorDomain" and one of the codes
// below when the operation fails, but another implementation may leave it as it is: test the result, not the error.
#ifndef VELTRA_PLATFORM_ORLO_DATA_STORE_H
#define VELTRA_PLATFORM_ORLO_DATA_STORE_H

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Error.h"
#include "platform/Value.h"

enum QDOrloErrorCode : std::int64_t {
    QDOrloErrorNotPermitted = 1,        // no grant for the operation, or the server refuses it (HTTP status 401, 403)
    QDOrloErrorTrustObjectMismatch = 2, // no digest, or not that of the store's trust object
    QDOrloErrorNoSuchRecord = 3,
    QDOrloErrorTransport = 4, // a server could not be reached or did not do what it was asked for
    QDOrloErrorStorage = 5,   // the store could not be read or written
};

enum OrloAction : std::int32_t {
    OrloActionGet = 0,
    OrloActionPut = 1,
    OrloActionExport = 3,
};

// A session.
struct __QDOrlo;

// Takes one line of the library's own log: a zero-terminated text without line break, which lives during the call. The
// first argument has no meaning.
using QDOrloLogHandler = void (*)(void* reserved, const char* message);

// Installs `handler` for the whole process in place of the one before it; null for none. The library logs why something
// failed. The handler is called on the thread of the operation.
void QDOrloLogSetHandler(QDOrloLogHandler handler);

// A new session with `options`, a dictionary; null on failure, and the log says why. It needs "APTicket" (data, not
// empty), "DataVersion" (an integer of 32 unsigned bits) and a store that can be opened. Unknown keys are kept and mean
// nothing. Release it with QDSupportSafeRelease.
//
// On Linux the device description says which store: its "store" has "backend", "embedded" (the default) or "remote".
// Records of different "DataVersion"s are different records.
//
// An embedded store is an SQLite database below the device root, "path" of the description's "store" (default
// "/var/lib/orlo/store.db"). Folder and database are made when they are missing.
//
// A remote store is a server, or an S3-compatible object store when the description's "store" has "s3". How the servers
// are reached stands there too: see platform/linux/services/store/OrloRemoteSettings.h. These options count:
//   "DSURL"                    https URL of the server of records and exports
//   "CAURL"                    https URL whose "/orlotrustobject" is the measure of the trust object
//   "EnableProxy"              true: http URLs are fetched through the device's proxy (ReverseProxy.h), if there is one
//   "EnableProxySsl"           "ForHttps": if "EnableProxy" is true, so are https URLs
//   "HTTPTimeout"              how many seconds an attempt may take, all in all: 1 to 3600, by default 30
//   "HTTPMaxAttempts"          how often the trust object is asked for, and a record put or got: 1 to 10, by default
//   once "MultiRequestMaxAttempts"  the same for an export
// A larger number counts as the largest, and what is no number of 1 or more as the default. What is tried again are
// failures of the network and answers with a status from 500 on.
__QDOrlo* QDOrloCreateWithOptions(Value options);

// Sets or replaces one option of the session.
void QDOrloSetOption(__QDOrlo* session, std::string_view key, Value value);

// The text that grants `session` the action on the one record, or nothing: for no session, for a class or an instance
// that names no record, and for one that holds a ";" (a class also a ":"), since its grant would read as another's.
Value QDOrloDataCreatePermissionsString(__QDOrlo* session, std::int32_t action, const Value& dataClass,
                                        const Value& dataInstance);

// Appends the grant for one record to `permissions`. False, with `permissions` as it was, when there is no grant.
bool QDOrloAppendPermissionsString(std::int32_t action, const Value& dataClass, const Value& dataInstance,
                                   std::string& permissions);

// Fetches the store's trust object into *trustObject, from `url` when the store is a server. On failure *trustObject is
// as it was. The trust object of an embedded store is a file beside the database, "<path>.trust", made from 64 random
// bytes at first use.
bool QDOrloDataCopyTrustObject(__QDOrlo* session, std::string_view url, Value::Data* trustObject,
                               std::optional<Error>* error);

// Stores `data` as the record, in place of one that is there. After success the record outlasts a crash and a power
// cut, as far as a remote store keeps its word. After failure the store is as it was, with one exception: when the
// answer of a server got lost (QDOrloErrorTransport) it may have stored the record, as a whole, or may do so later. In
// an object store a put is conditional on what was found before it, so that such a one is dropped once a later put has
// been answered; in a plain one it may replace what that put.
//
// A remote store takes no record of more than 64 MiB, nor one whose class or instance is "." or "..", has a NUL in it,
// a slash with nothing, "." or ".." on either side, or more than 512 bytes; an object store none whose class has a
// slash or whose class or instance has a control character (QDOrloErrorStorage).
bool QDOrloDataPut(__QDOrlo* session, const Value& dataClass, const Value& dataInstance, const Value::Data& data,
                   std::optional<Error>* error);

// The record's bytes, or none.
std::optional<Value::Data> QDOrloDataCopy(__QDOrlo* session, const Value& dataClass, const Value& dataInstance,
                                          std::optional<Error>* error);

// Exports the pairs of classes[i] and instances[i], all or none. Arrays of different lengths are a failure; two empty
// ones are an export of nothing.
bool QDOrloDataMultiExport(__QDOrlo* session, const Value::Array& classes, const Value::Array& instances,
                           std::optional<Error>* error);

// The data version of the device that the ticket describes. On Linux it is "dataVersion" of the device description's
// "store", 2 when that names none.
std::uint32_t QDOrloSealingMapGetOrloDataVersionForDevice(const Value::Data& apTicket);

// The store's text for a device answer, by which a component's records are found: a text as it is, an integer in
// decimal, data in lower-case hexadecimal. Nothing for an empty text, empty data and every other kind. Pure; any
// thread.
Value QDOrloCreateInstanceString(const Value& answer);

// SHA-256 (FIPS 180-4) of `length` octets at `bytes` into the 32 octets at `digest`. 0 on success; another status
// leaves 32 zeros. Any thread.
std::int32_t QDSupportDigestSha256(const void* bytes, std::uint32_t length, std::uint8_t* digest);

// Ends a session and frees it; nothing for null.
void QDSupportSafeRelease(__QDOrlo* session);

// The software-update data accessor: where the device keeps data that was made for it alone. Any thread.
class KelvoDataAccessor {
public:
    static constexpr std::int64_t apTicketKind = 2; // the personalised boot ticket

    static const KelvoDataAccessor& sharedDataAccessor();

    // The device path of the file with the data of this kind, as text, whether or not the file is there. Nothing, and
    // *error filled, for a kind that the device does not keep. `error` may be null.
    Value copyPathForPersonalizedData(std::int64_t kind, std::optional<Error>* error) const;

    KelvoDataAccessor(const KelvoDataAccessor&) = delete;
    KelvoDataAccessor& operator=(const KelvoDataAccessor&) = delete;

private:
    KelvoDataAccessor() = default;
};

#endif
