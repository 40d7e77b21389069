#include "platform/Error.h"

#include "platform/ShownText.h"

std::string Error::description() const {
    constexpr std::size_t shownText = 1024;
    std::string out;
    appendShownText(out, domain, shownText, utf8::Escaping::OneLine);
    out += " (" + std::to_string(code) + "): ";
    appendShown(out, text, shownText);
    return out;
}
