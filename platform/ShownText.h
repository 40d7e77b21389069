// Text from outside as a log line or a terminal shows it. Whatever it holds, it cannot begin a line of its own, work a
// terminal or turn the writing direction, it does not tell the password of a URL, and it has a bounded length.
#ifndef VELTRA_PLATFORM_SHOWN_TEXT_H
#define VELTRA_PLATFORM_SHOWN_TEXT_H

#include <cstddef>
#include <string>
#include <string_view>

#include "platform/Utf8.h"

constexpr std::size_t longestShownText = std::size_t{1} << 20;

// Appends at most the first `longest` bytes of `text`, escaped, with "..." in place of the user and password of each
// URL, and a mark with the length when that is not all. On one line, a line feed at the very end stays.
void appendShown(std::string& out, std::string_view text, std::size_t longest = longestShownText,
                 utf8::Escaping how = utf8::Escaping::OneLine);

// The parts of that: the text, true when it is all there, and the mark.
bool appendShownText(std::string& out, std::string_view text, std::size_t longest, utf8::Escaping how);
void appendCutMark(std::string& out, std::string_view text);

// The text with "..." in place of the user and password of each URL, otherwise as it stands.
std::string withoutUserInfo(std::string_view text);

#endif
