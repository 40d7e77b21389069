// Byte strings for test tables.
#ifndef VELTRA_TESTS_DER_BYTES_H
#define VELTRA_TESTS_DER_BYTES_H

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "der/DERTypes.h"

using Bytes = std::vector<std::uint8_t>;

// Reads "30 03 02 01 05". The result has no spare capacity, so that the address sanitizer sees a read beyond it.
inline Bytes bytes(std::string_view hex) {
    Bytes read;
    for (std::size_t i = 0; i + 2 <= hex.size(); i += 3)
        read.push_back(static_cast<std::uint8_t>(std::stoul(std::string(hex.substr(i, 2)), nullptr, 16)));
    return {read.begin(), read.end()};
}

inline std::string hexOf(const std::uint8_t* data, std::uint64_t length) {
    constexpr std::string_view digits = "0123456789ABCDEF";
    std::string text;
    for (std::uint64_t i = 0; i < length; ++i) {
        if (i != 0)
            text += ' ';
        text += {digits[data[i] >> 4], digits[data[i] & 0xF]};
    }
    return text;
}

inline std::string hexOf(const Bytes& bytes) {
    return hexOf(bytes.data(), bytes.size());
}

inline std::string hexOf(const DERItem& item) {
    return item.data == nullptr ? "absent" : hexOf(item.data, item.length);
}

inline DERItem itemOf(const Bytes& bytes) {
    return {bytes.data(), bytes.size()};
}

inline Bytes bytesOf(const DERItem& item) {
    return {item.data, item.data + item.length};
}

// Octets of a table, written as for `bytes`, and their view.
struct Hex {
    Hex(const char* hex) : text(hex), octets(bytes(hex)), item(itemOf(octets)) {}
    Hex(Hex&&) = default; // leaves the octets where they are

    const char* text;
    Bytes octets;
    DERItem item;
};

#endif
