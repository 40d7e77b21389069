#include "platform/Error.h"

#include "platform/Utf8.h"

std::string Error::description() const {
    constexpr std::size_t shownText = 1024;
    std::string out;
    utf8::appendOnOneLine(out, utf8::beginning(domain, shownText));
    out += " (" + std::to_string(code) + "): ";
    utf8::appendOnOneLine(out, utf8::beginning(text, shownText));
    if (text.size() > shownText)
        out += "... (" + std::to_string(text.size()) + " bytes)";
    return out;
}
