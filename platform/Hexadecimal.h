// Bytes as text: two hexadecimal digits each.
#ifndef VELTRA_PLATFORM_HEXADECIMAL_H
#define VELTRA_PLATFORM_HEXADECIMAL_H

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "platform/Value.h"

// In lower case.
std::string hexadecimal(std::span<const std::uint8_t> bytes);

// The bytes of pairs of digits, in either case; none for anything else.
std::optional<Value::Data> bytesOfHexadecimal(std::string_view digits);

#endif
