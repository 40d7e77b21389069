// A scripted double of the data-store library and of the data accessor: it records each call and hands out prepared
// answers. A test that links services-double gets it in place of the real one.
#ifndef VELTRA_TESTS_DATA_STORE_DOUBLE_H
#define VELTRA_TESTS_DATA_STORE_DOUBLE_H

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "platform/OrloDataStore.h"

struct DataStoreDouble {
    // What the operations do. Where there is a result, none is a failure; the error beside it is what is then filled.
    bool makesSessions = true;
    bool grants = true;
    std::optional<Value::Data> trustObject = Value::Data{'t', 'r', 'u', 's', 't'};
    std::optional<Error> trustError;
    std::int32_t digestStatus = 0;
    std::function<void()> afterDigest; // called at the end of the digest
    bool puts = true;
    std::optional<Error> putError;
    std::optional<Value::Data> record = Value::Data{'r', 'e', 'c'};
    std::optional<Error> getError;
    bool exports = true;
    std::optional<Error> exportError;
    std::uint32_t dataVersion = 7;
    Value ticketPath = "/ticket";
    std::optional<Error> ticketPathError;

    // What happened.
    std::vector<std::string> calls;  // "<operation> <arguments>", in order; not the digest and the release
    Value::Dictionary createdWith;   // the options of the last session at its creation
    Value::Dictionary options;       // the same as they are now
    Value::Array classes, instances; // of the last export
    int liveSessions = 0;
    QDOrloLogHandler logHandler = nullptr;
};

// The one that the library uses. Assign a fresh one at the start of a test.
DataStoreDouble& dataStoreDouble();

#endif
