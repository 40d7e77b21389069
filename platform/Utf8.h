// UTF-8 (RFC 3629) as the service reads it from devices, programs and requests: any bytes may come.
#ifndef VELTRA_PLATFORM_UTF8_H
#define VELTRA_PLATFORM_UTF8_H

#include <cstddef>
#include <string>
#include <string_view>

namespace utf8 {

// One step through a text.
struct Step {
    enum Kind {
        Character,  // `length` bytes are the well-formed character `point`
        Bad,        // `length` bytes, at least one, are no part of a well-formed character
        Incomplete, // the text ends after `length` bytes of a character that could still become well-formed
    };
    Kind kind;
    std::size_t length;
    char32_t point;
};

// The step at the start of `text`, which must not be empty. A bad sequence is as long as the beginning of a character
// that it holds, so that each one is replaced by one U+FFFD, as the Unicode standard recommends.
Step next(std::string_view text);

// Whether the whole text is well-formed.
bool isValid(std::string_view text);

// The text with U+FFFD in place of each bad sequence.
std::string repaired(std::string_view text);

// The longest beginning of `text` of at most `limit` bytes that does not cut a character in two.
std::string_view beginning(std::string_view text, std::size_t limit);

// What appendEscaped leaves as it is, or escapes beside the rest.
enum class Escaping {
    OneLine,
    Lines,  // line feeds stay
    Quotes, // \" and \\ for the quote and the backslash
};

// Appends `text` so that it does no harm to whatever shows it: control characters, line and paragraph separators,
// characters that turn the writing direction, and bad sequences are written as \n, \r, \t, \u followed by four or \x
// followed by two hexadecimal digits.
void appendEscaped(std::string& out, std::string_view text, Escaping how);

// The text so escaped, and in double quotes.
std::string escaped(std::string_view text, Escaping how = Escaping::OneLine);
std::string quoted(std::string_view text);

} // namespace utf8

#endif
