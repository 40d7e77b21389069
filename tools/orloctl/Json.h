// Values as JSON on the command line. Data is {"$data": "<hexadecimal>"}, as in the device description.
#ifndef VELTRA_TOOLS_ORLOCTL_JSON_H
#define VELTRA_TOOLS_ORLOCTL_JSON_H

#include <stdexcept>
#include <string>

#include <nlohmann/json.hpp>

#include "platform/Value.h"

class JsonFailure : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

nlohmann::ordered_json jsonFromValue(const Value& value);

// The value of a JSON text. Raises JsonFailure for malformed JSON and for what no Value can hold: null, a number with a
// fraction or beyond 64 bits, a key that stands twice in one object, a nesting of more than 32.
Value valueFromJson(const std::string& text);

#endif
