// What the client of single records and the export have in common: the device's boot ticket, the store's trust object,
// and errors that stand in tables.
#ifndef VELTRA_ORLO_ORLO_SESSION_H
#define VELTRA_ORLO_ORLO_SESSION_H

#include <cstdint>
#include <memory>
#include <new>
#include <optional>
#include <string_view>

#include "Daemon/HSLog.h"
#include "platform/OrloDataStore.h"

// A session that is released at the end.
struct OrloSessionRelease {
    void operator()(__QDOrlo* session) const { QDSupportSafeRelease(session); }
};
using OrloSessionPtr = std::unique_ptr<__QDOrlo, OrloSessionRelease>;

// A row of a table of errors.
struct OrloErrorRow {
    std::int64_t code;
    const char* description; // a format
    const char* logLine;     // the line about it, of level 4; null for none
};

// The row and the line of the source file where its error is made.
struct OrloErrorHere {
    OrloErrorHere(const OrloErrorRow& errorRow, int sourceLine = __builtin_LINE()) : row(errorRow), line(sourceLine) {}
    const OrloErrorRow& row;
    int line;
};

// Makes an error from a row and logs the row's line.
template <class... Arguments>
Error makeOrloError(const LogSource& log, std::string_view domain, OrloErrorHere here, const Arguments&... arguments) {
    Error error{std::string(domain), here.row.code, format(here.row.description, arguments...)};
    if (here.row.logLine)
        log.error(LineFormat(here.row.logLine, here.line));
    return error;
}

// What `make` makes, or none when memory does not suffice for it.
template <class Make>
auto madeIfMemorySuffices(Make make) -> std::optional<decltype(make())> try {
    return make();
} catch (const std::bad_alloc&) {
    return std::nullopt;
}

// The instance "<first>-<second>" of a component that two identities name. Texts stand as they are, and data whole in
// angle brackets, in hexadecimal, since its description would leave out what tells two components apart; a number
// stands in decimal, and "(null)" for nothing. Nothing when one is a collection, which names no component.
Value joinedInstance(const Value& first, const Value& second);

// The bytes of the device's boot ticket, or none. Writes to `log` where it is, and at level 4 when it cannot be read.
std::optional<Value::Data> readApTicket(const LogSource& log);

// Sets the options "TrustObject" and "TrustObjectDigest" (its SHA-256) on the session, which keeps the trust object
// when the second fails: with `noDigest`, a format for a status, or with `noMemory`.
std::optional<Error> setTrustObjectOptions(const LogSource& log, std::string_view domain, __QDOrlo* session,
                                           const Value::Data& trustObject, OrloErrorHere noDigest,
                                           OrloErrorHere noMemory);

#endif
