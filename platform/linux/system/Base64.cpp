#include "platform/Base64.h"

#include <algorithm>

#include <openssl/evp.h>

std::string base64Encode(const Value::Data& data) {
    constexpr std::size_t piece = 3 << 20;                // OpenSSL counts in int
    std::string out((data.size() + 2) / 3 * 4 + 1, '\0'); // OpenSSL writes a NUL behind the last character
    std::size_t filled = 0;
    for (std::size_t at = 0; at < data.size(); at += piece) {
        const int length = static_cast<int>(std::min(piece, data.size() - at));
        auto* const place = reinterpret_cast<unsigned char*>(out.data() + filled);
        filled += static_cast<std::size_t>(EVP_EncodeBlock(place, data.data() + at, length));
    }
    out.resize(filled);
    return out;
}

std::optional<Value::Data> base64Decode(std::string_view text) {
    constexpr std::size_t piece = 4 << 20;
    std::string characters(text);
    std::erase_if(characters, [](char c) { return c == ' ' || c == '\t' || c == '\n' || c == '\r'; });
    if (characters.size() % 4 != 0)
        return std::nullopt;
    const std::size_t padding = characters.ends_with("==") ? 2 : characters.ends_with('=') ? 1 : 0;
    // OpenSSL takes padding wherever a group ends and reads it as zero bits.
    if (characters.find('=') < characters.size() - padding)
        return std::nullopt;

    Value::Data out(characters.size() / 4 * 3);
    for (std::size_t at = 0; at < characters.size(); at += piece) {
        const int length = static_cast<int>(std::min(piece, characters.size() - at));
        const auto* const place = reinterpret_cast<const unsigned char*>(characters.data() + at);
        if (EVP_DecodeBlock(out.data() + at / 4 * 3, place, length) != length / 4 * 3)
            return std::nullopt;
    }
    out.erase(out.end() - static_cast<std::ptrdiff_t>(padding), out.end());
    return out;
}
