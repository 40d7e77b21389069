// Gathers the identities of the device's components and exports them to the Orlo store.
#ifndef VELTRA_ORLO_ZPORLO_EXPORT_H
#define VELTRA_ORLO_ZPORLO_EXPORT_H

#include <optional>

#include "platform/Error.h"
#include "platform/Value.h"

// Keeps no state. No operation raises, but for std::bad_alloc where no error stands for that, and no failure is
// retried.
class ZPOrloExport {
public:
    // The data instance of each class in `exportList`: a dictionary from class to instance, read from the device in the
    // list's order. Nothing, and *error a text that says why, for the first class that is unknown or whose component
    // has no identity. A few classes go on without one: their instance has "(null)" in its place, and *error is set
    // although there is a dictionary, so look at it only when there is none. `error` may be null.
    static Value getDataInstances(const Value::Array& exportList, Value* error);

    // Exports all pairs of the dictionary `dataInstances` in a session of its own, in one attempt. `options` and
    // *response are not looked at; the session's options are fixed. An error has the domain "OrloExport".
    static std::optional<Error> orloExportCommandWithResponse(const Value& dataInstances, const Value& options,
                                                              Value* response);
};

#endif
