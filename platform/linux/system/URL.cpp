#include "platform/URL.h"

#include <algorithm>
#include <string>

#include <arpa/inet.h>

namespace {

constexpr std::string_view subDelims = "!$&'()*+,;=";

bool isAlpha(char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z');
}
bool isDigit(char c) {
    return c >= '0' && c <= '9';
}
bool isHexDigit(char c) {
    return isDigit(c) || (c >= 'a' && c <= 'f') || (c >= 'A' && c <= 'F');
}
bool isUnreserved(char c) {
    return isAlpha(c) || isDigit(c) || c == '-' || c == '.' || c == '_' || c == '~';
}

// Whether a component holds unreserved characters, sub-delims, percent-encoded octets and those in `more` only.
bool consistsOf(std::string_view component, std::string_view more) {
    for (std::size_t i = 0; i < component.size(); ++i) {
        const char c = component[i];
        if (c == '%') {
            if (component.size() - i < 3 || !isHexDigit(component[i + 1]) || !isHexDigit(component[i + 2]))
                return false;
            i += 2;
        } else if (!isUnreserved(c) && subDelims.find(c) == std::string_view::npos &&
                   more.find(c) == std::string_view::npos) {
            return false;
        }
    }
    return true;
}

// RFC 3986, 3.2.2: what stands in the brackets of an IP literal.
bool isAddress(std::string_view text) {
    in6_addr address;
    if (::inet_pton(AF_INET6, std::string(text).c_str(), &address) == 1)
        return text.find('\0') == std::string_view::npos;
    if (text.empty() || (text[0] != 'v' && text[0] != 'V'))
        return false;
    const std::size_t dot = text.find('.');
    if (dot == std::string_view::npos || dot < 2 || dot + 1 == text.size())
        return false;
    return std::ranges::all_of(text.substr(1, dot - 1), isHexDigit) && text.find('%') == std::string_view::npos &&
           consistsOf(text.substr(dot + 1), ":");
}

bool isAuthority(std::string_view authority) {
    const std::size_t at = authority.find('@');
    if (at != std::string_view::npos) {
        if (!consistsOf(authority.substr(0, at), ":"))
            return false;
        authority.remove_prefix(at + 1);
    }
    std::string_view port;
    if (authority.starts_with('[')) {
        const std::size_t bracket = authority.find(']');
        if (bracket == std::string_view::npos || !isAddress(authority.substr(1, bracket - 1)))
            return false;
        port = authority.substr(bracket + 1);
    } else {
        const std::size_t colon = std::min(authority.find(':'), authority.size());
        if (!consistsOf(authority.substr(0, colon), ""))
            return false;
        port = authority.substr(colon);
    }
    return port.empty() || (port[0] == ':' && std::ranges::all_of(port.substr(1), isDigit));
}

bool isScheme(std::string_view scheme) {
    return !scheme.empty() && isAlpha(scheme[0]) && std::ranges::all_of(scheme, [](char c) {
        return isAlpha(c) || isDigit(c) || c == '+' || c == '-' || c == '.';
    });
}

// Cuts `text` at the first `mark` and returns what stands behind it.
std::string_view cutAt(std::string_view& text, char mark) {
    const std::size_t position = text.find(mark);
    if (position == std::string_view::npos)
        return {};
    const std::string_view behind = text.substr(position + 1);
    text = text.substr(0, position);
    return behind;
}

} // namespace

bool isWellFormedURL(std::string_view text) {
    if (text.empty())
        return false;
    // RFC 3986, appendix B: the components follow from the first of each mark. A colon in the first segment of a path
    // can only end a scheme (4.2).
    const std::string_view fragment = cutAt(text, '#');
    const std::string_view query = cutAt(text, '?');
    const std::size_t colon = text.find(':');
    if (colon < text.find('/')) {
        if (!isScheme(text.substr(0, colon)))
            return false;
        text.remove_prefix(colon + 1);
    }
    if (text.starts_with("//")) {
        text.remove_prefix(2);
        const std::size_t end = std::min(text.find('/'), text.size());
        if (!isAuthority(text.substr(0, end)))
            return false;
        text.remove_prefix(end);
    }
    return consistsOf(text, ":@/") && consistsOf(query, ":@/?") && consistsOf(fragment, ":@/?");
}
