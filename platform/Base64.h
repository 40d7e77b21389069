#ifndef VELTRA_PLATFORM_BASE64_H
#define VELTRA_PLATFORM_BASE64_H

#include <optional>
#include <string>
#include <string_view>

#include "platform/Value.h"

// The base64 encoding (RFC 4648, section 4) of the whole data, padded and in one line.
std::string base64Encode(const Value::Data& data);

// The bytes of padded base64; white space between the characters is ignored. None for anything else.
std::optional<Value::Data> base64Decode(std::string_view text);

#endif
