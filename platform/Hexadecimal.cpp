#include "platform/Hexadecimal.h"

#include <charconv>

std::string hexadecimal(std::span<const std::uint8_t> bytes) {
    constexpr char digits[] = "0123456789abcdef";
    std::string text;
    text.reserve(bytes.size() * 2);
    for (const std::uint8_t byte : bytes) {
        text += digits[byte >> 4];
        text += digits[byte & 0xF];
    }
    return text;
}

std::optional<Value::Data> bytesOfHexadecimal(std::string_view digits) {
    if (digits.size() % 2 != 0)
        return std::nullopt;
    Value::Data bytes(digits.size() / 2);
    const char* pair = digits.data();
    for (std::uint8_t& byte : bytes) {
        if (std::from_chars(pair, pair + 2, byte, 16).ptr != pair + 2)
            return std::nullopt;
        pair += 2;
    }
    return bytes;
}
