#ifndef VELTRA_PLATFORM_JSON_H
#define VELTRA_PLATFORM_JSON_H

#include <optional>
#include <string>
#include <string_view>

#include "platform/Value.h"

// The value of a JSON text (RFC 8259). Objects are dictionaries; null, and a number that is no integer of 64 signed
// bits (1.0 is none), are values of nothing. None for anything that is not JSON, for a key that stands twice in one
// object, for a nesting of more than 32, and for more than 1048576 values; *refusal, when given, then says what was
// met.
std::optional<Value> jsonToValue(std::string_view text, std::string* refusal = nullptr);

// The same for what is to be sent in a message: {"$data": "<hexadecimal>"} is data, while null and a number that is no
// integer of 64 signed bits are refused.
std::optional<Value> jsonToMessageValue(std::string_view text, std::string* refusal = nullptr);

// The text under `key` in the JSON object `text`, whatever else it holds: fractions and any nesting are allowed here,
// and of a key that stands twice the last counts. None when `text` is no JSON object or has no text under that key.
std::optional<std::string> jsonTextMember(std::string_view text, std::string_view key);

#endif
