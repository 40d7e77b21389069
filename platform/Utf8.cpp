#include "platform/Utf8.h"

#include <algorithm>
#include <iterator>

#include "platform/Hexadecimal.h"

namespace utf8 {

namespace {

constexpr std::string_view replacement = "\xEF\xBF\xBD"; // U+FFFD

// The first bytes of the characters beyond ASCII, with what may follow (RFC 3629, section 4).
struct Lead {
    unsigned char first, last;
    unsigned char lowest, highest; // the second byte
    std::size_t length;
};
constexpr Lead leads[] = {
    {0xC2, 0xDF, 0x80, 0xBF, 2}, {0xE0, 0xE0, 0xA0, 0xBF, 3}, {0xE1, 0xEC, 0x80, 0xBF, 3}, {0xED, 0xED, 0x80, 0x9F, 3},
    {0xEE, 0xEF, 0x80, 0xBF, 3}, {0xF0, 0xF0, 0x90, 0xBF, 4}, {0xF1, 0xF3, 0x80, 0xBF, 4}, {0xF4, 0xF4, 0x80, 0x8F, 4},
};

bool leavesTheLine(char32_t point) {
    return point < 0x20 || (point >= 0x7F && point < 0xA0) || (point >= 0x2028 && point <= 0x202E) ||
           (point >= 0x2066 && point <= 0x2069) || point == 0x200E || point == 0x200F || point == 0x061C;
}

void appendEscape(std::string& out, char32_t point) {
    constexpr std::string_view named = "\n\r\t", letters = "nrt";
    const std::size_t index = point < 0x80 ? named.find(static_cast<char>(point)) : std::string_view::npos;
    out += '\\';
    if (index != std::string_view::npos)
        out += letters[index];
    else
        out += 'u' + hexadecimal({{static_cast<std::uint8_t>(point >> 8), static_cast<std::uint8_t>(point)}});
}

} // namespace

void appendEscaped(std::string& out, std::string_view text, Escaping how) {
    while (!text.empty()) {
        const Step step = next(text);
        const std::string_view bytes = text.substr(0, step.length);
        text.remove_prefix(step.length);
        if (step.kind != Step::Character) {
            for (const char byte : bytes)
                out += "\\x" + hexadecimal({{static_cast<std::uint8_t>(byte)}});
        } else if (leavesTheLine(step.point) && !(how == Escaping::Lines && step.point == '\n')) {
            appendEscape(out, step.point);
        } else {
            if (how == Escaping::Quotes && (step.point == '"' || step.point == '\\'))
                out += '\\';
            out += bytes;
        }
    }
}

Step next(std::string_view text) {
    const auto byte = [text](std::size_t index) { return static_cast<unsigned char>(text[index]); };
    if (byte(0) < 0x80)
        return {Step::Character, 1, byte(0)};
    const Lead* const lead = std::find_if(std::begin(leads), std::end(leads), [first = byte(0)](const Lead& candidate) {
        return first >= candidate.first && first <= candidate.last;
    });
    if (lead == std::end(leads))
        return {Step::Bad, 1, 0};

    char32_t point = byte(0) & (0x7FU >> lead->length);
    for (std::size_t i = 1; i < lead->length; ++i) {
        if (i == text.size())
            return {Step::Incomplete, i, 0};
        const unsigned char lowest = i == 1 ? lead->lowest : 0x80, highest = i == 1 ? lead->highest : 0xBF;
        if (byte(i) < lowest || byte(i) > highest)
            return {Step::Bad, i, 0};
        point = point << 6 | (byte(i) & 0x3FU);
    }
    return {Step::Character, lead->length, point};
}

bool isValid(std::string_view text) {
    while (!text.empty()) {
        const Step step = next(text);
        if (step.kind != Step::Character)
            return false;
        text.remove_prefix(step.length);
    }
    return true;
}

std::string repaired(std::string_view text) {
    std::string out;
    out.reserve(text.size());
    while (!text.empty()) {
        const Step step = next(text);
        out += step.kind == Step::Character ? text.substr(0, step.length) : replacement;
        text.remove_prefix(step.length);
    }
    return out;
}

std::string_view beginning(std::string_view text, std::size_t limit) {
    if (text.size() <= limit)
        return text;
    // A character is at most four bytes long, so three steps back find its first one; bytes that are no character may
    // be cut anywhere.
    for (std::size_t end = limit; end > 0 && limit - end < 4; --end) {
        if ((static_cast<unsigned char>(text[end]) & 0xC0) != 0x80)
            return text.substr(0, end);
    }
    return text.substr(0, limit);
}

std::string escaped(std::string_view text, Escaping how) {
    std::string out;
    appendEscaped(out, text, how);
    return out;
}

std::string quoted(std::string_view text) {
    return '"' + escaped(text, Escaping::Quotes) + '"';
}

} // namespace utf8
