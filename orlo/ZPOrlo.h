// The client of single records of the Orlo store.
#ifndef VELTRA_ORLO_ZPORLO_H
#define VELTRA_ORLO_ZPORLO_H

#include <atomic>
#include <cstdint>
#include <optional>

#include "platform/Error.h"
#include "platform/OrloDataStore.h"
#include "platform/Value.h"

// One session of the data-store library. Lives for one request: put or get a record, then drop it. Each put and each
// get sets the permission and fetches the trust object anew; nothing is kept between them.
//
// An operation that returns an Error or nothing has succeeded when it returns nothing. No operation raises, but for
// std::bad_alloc where no error stands for that. Only the session handle may be read and written from several threads
// at once.
class ZPOrlo {
public:
    // A session with the default options.
    static ZPOrlo init();

    // A session with the default options and, in place of equal ones or beside them, those of the dictionary `options`,
    // which may be nothing. "orlo2Data", a boolean, chooses the defaults of the second-generation store and reaches the
    // library too. When there can be no session, orloRef is null, and put and get fail with "Permission String nil".
    static ZPOrlo initWithOptions(const Value& options);

    ZPOrlo(const ZPOrlo&) = delete;
    ZPOrlo& operator=(const ZPOrlo&) = delete;
    ~ZPOrlo();

    // The default options: for a remote or a local store, of the first generation or the second. "APTicket" is missing
    // when the device's boot ticket cannot be read.
    static Value::Dictionary createDefaultOrloOptions(bool isRemote, bool isOrlo2);

    // The text that grants the session an action on one record, or nothing.
    Value makePermissionsWithOrloAction(OrloAction action, const Value& dataClass, const Value& dataInstance) const;

    // Grants the session an action on one record.
    std::optional<Error> setPermissionString(OrloAction action, const Value& dataClass, const Value& dataInstance);

    // Fetches the store's trust object and sets it and its digest on the session. The session keeps the trust object
    // when the digest fails.
    std::optional<Error> setTrustObject();

    // Stores `data` as the record of a class and an instance. *response is not touched and may be null.
    std::optional<Error> orloPut(const Value& dataClass, const Value& dataInstance, const Value::Data& data,
                                 Value* response);

    // Makes the record the whole content of `data`, which stays as it is on failure. The error is the library's own.
    // *response is not touched and may be null.
    std::optional<Error> orloGet(const Value& dataClass, const Value& dataInstance, Value::Data& data, Value* response);

    // The session, which this releases at its end. A handle that is set replaces the one before it, which is then its
    // taker's to release.
    __QDOrlo* orloRef() const { return orloRef_; }
    void setOrloRef(__QDOrlo* session) { orloRef_ = session; }

private:
    explicit ZPOrlo(const Value& options);

    // Grants the action and establishes trust: what comes before each put and get.
    std::optional<Error> prepare(OrloAction action, const Value& dataClass, const Value& dataInstance);

    std::atomic<__QDOrlo*> orloRef_ = nullptr;
};

#endif
