#include "Daemon/Conversions.h"

#include <algorithm>
#include <charconv>
#include <optional>

#include "Daemon/HSLog.h"
#include "platform/Base64.h"
#include "platform/Format.h"
#include "platform/Hexadecimal.h"
#include "platform/KeyedArchive.h"
#include "platform/Utf8.h"

namespace {

constexpr char rootKey[] = "HSArchiverKey";

// One byte for each character of `text`, so that pairs can be counted: those beyond ASCII, none of which is a
// hexadecimal digit or white space here, become 0xFF.
std::string oneByteEach(std::string_view text) {
    std::string characters;
    characters.reserve(text.size());
    while (!text.empty()) {
        const utf8::Step step = utf8::next(text);
        characters += step.kind == utf8::Step::Character && step.point < 0x80 ? static_cast<char>(step.point) : '\xFF';
        text.remove_prefix(step.length);
    }
    return characters;
}

void removeEvery(std::string& text, std::string_view part) {
    std::string kept;
    kept.reserve(text.size());
    std::size_t at = 0;
    for (std::size_t found; (found = text.find(part, at)) != std::string::npos; at = found + part.size())
        kept.append(text, at, found - at);
    kept.append(text, at);
    text = std::move(kept);
}

// The number that the hexadecimal digits of a pair form, which white space may precede and anything may follow; none
// without a digit. A "0x" is the digit 0 and what follows it.
std::optional<std::uint8_t> scanPair(std::string_view pair) {
    pair.remove_prefix(std::min(pair.find_first_not_of(" \t\n\v\f\r"), pair.size()));
    std::uint8_t number = 0;
    const auto end = std::from_chars(pair.data(), pair.data() + pair.size(), number, 16);
    return end.ec == std::errc() ? std::optional(number) : std::nullopt;
}

} // namespace

Value convertDictionaryToData(const Value& dictionary) try {
    if (dictionary.isNothing())
        return {};
    return archiveEncode(rootKey, dictionary);
} catch (const ArchiveFailure&) {
    return {};
}

Value convertDataToDictionary(const Value& data) {
    if (!data.data())
        return {};
    std::optional<Error> error;
    const std::optional<ArchiveDecoder> decoder = ArchiveDecoder::create(*data.data(), &error);
    consoleLine("Unarchive Error : %@", {error});
    if (error)
        consoleLine("Error : %@", {error});
    Value object = decoder ? decoder->decode(rootKey) : Value();
    consoleLine("recvDict : %@", {object});
    consoleLine("err : %@", {error});
    return object;
}

Value DatatoHexString(const Value& data) {
    if (!data.data() || data.data()->empty())
        return {};
    return hexadecimal(*data.data());
}

Value stringFromHexString(std::string_view text) {
    const std::string characters = oneByteEach(text);
    if (characters.size() % 2 != 0)
        return {};
    std::string out;
    for (std::size_t at = 0; at < characters.size(); at += 2) {
        const std::uint8_t code = scanPair(std::string_view(characters).substr(at, 2)).value_or(0);
        if (code < 0x80) {
            out += static_cast<char>(code);
        } else {
            out += static_cast<char>(0xC0 | code >> 6);
            out += static_cast<char>(0x80 | (code & 0x3F));
        }
    }
    return out;
}

Value::Data hexString2Binary(std::string_view text) {
    std::string characters = oneByteEach(text);
    for (const std::string_view part : {"0x", "0X", " "})
        removeEvery(characters, part);
    if (characters.size() % 2 != 0)
        throw ConversionFailure("IllegalInput", "Text does not have 2-digit hex chars for every byte");
    Value::Data bytes;
    bytes.reserve(characters.size() / 2);
    for (std::size_t at = 0; at < characters.size(); at += 2) {
        const std::optional<std::uint8_t> byte = scanPair(std::string_view(characters).substr(at, 2));
        if (!byte)
            throw ConversionFailure("IllegalInput", "Text has illegal hexadecimal characters");
        bytes.push_back(*byte);
    }
    return bytes;
}

std::string base64EncodedString(const Value::Data& data) {
    return base64Encode(data);
}

std::string stringFromLXError(const Error& error) {
    return format("LXError domain:%@, error code: %d. Description: %@", error.domain, error.code, error.text);
}

Value isLXNumber(const Value& value) {
    return value.isNumber() ? value : Value();
}
