#include "platform/ShownText.h"

#include <algorithm>

#include <strings.h>

namespace {

constexpr std::string_view digits = "0123456789";

// Where an authority begins when one does at `at`, otherwise npos. It stands behind the slashes that follow a scheme or
// begin a reference. Readers of URLs take any number of slashes for two, also none behind a scheme that they know.
std::size_t authorityAt(std::string_view text, std::size_t at) {
    if (text[at] == '/' && (at == 0 ? text.starts_with("//") : text[at - 1] == ':'))
        return text.find_first_not_of('/', at);
    if (text[at] != ':' || text.substr(at + 1).starts_with('/'))
        return text.npos;
    for (const std::string_view scheme : {"http", "https"})
        if (at >= scheme.size() && strncasecmp(&text[at - scheme.size()], scheme.data(), scheme.size()) == 0)
            return at + 1;
    return text.npos;
}

// Calls `take` for the parts of `text` before, between and behind the user information of URLs (RFC 3986, 3.2.1).
template <class Take>
void splitAtUserInfo(std::string_view text, Take take) {
    const std::size_t lastAt = text.rfind('@');
    std::size_t start = 0;
    for (std::size_t at = 0; lastAt != text.npos && at < lastAt;) {
        const std::size_t begin = authorityAt(text, at);
        if (begin == text.npos) {
            ++at;
            continue;
        }
        const std::string_view authority = text.substr(begin, text.find_first_of("/?#", begin) - begin);
        std::size_t end = authority.rfind('@');
        if (end != authority.npos) {
            end += begin;
        } else if (const std::size_t colon = authority.rfind(':');
                   colon != authority.npos && authority.back() != ']' &&
                   authority.find_first_not_of(digits, colon + 1) != authority.npos) {
            end = lastAt; // no port: a password that should have been percent-encoded
        } else {
            at = begin + authority.size();
            continue;
        }
        take(text.substr(start, begin - start), true);
        start = at = end;
    }
    take(text.substr(start), false);
}

} // namespace

bool appendShownText(std::string& out, std::string_view text, std::size_t longest, utf8::Escaping how) {
    const char* const end = text.data() + utf8::beginning(text, longest).size();
    const auto append = [&](std::string_view part, bool userInfoFollows) {
        if (part.data() >= end)
            return;
        const auto left = static_cast<std::size_t>(end - part.data());
        utf8::appendEscaped(out, part.substr(0, left), how);
        if (userInfoFollows && part.size() <= left)
            out += "...";
    };
    const bool isWhole = end == text.data() + text.size();
    // Where lines stay, no URL goes on in the next one.
    while (how == utf8::Escaping::Lines && text.find('\n') != text.npos) {
        const std::size_t line = text.find('\n') + 1;
        splitAtUserInfo(text.substr(0, line), append);
        text.remove_prefix(line);
    }
    splitAtUserInfo(text, append);
    return isWhole;
}

void appendCutMark(std::string& out, std::string_view text) {
    out += "... (" + std::to_string(text.size()) + " bytes)";
}

void appendShown(std::string& out, std::string_view text, std::size_t longest, utf8::Escaping how) {
    const bool lineEnds = how == utf8::Escaping::OneLine && text.size() <= longest && text.ends_with('\n');
    if (lineEnds)
        text.remove_suffix(1);
    if (!appendShownText(out, text, longest, how))
        appendCutMark(out, text);
    if (lineEnds)
        out += '\n';
}

std::string withoutUserInfo(std::string_view text) {
    std::string out;
    splitAtUserInfo(text, [&](std::string_view part, bool userInfoFollows) {
        out += part;
        out += userInfoFollows ? "..." : "";
    });
    return out;
}
