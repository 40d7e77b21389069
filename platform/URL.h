#ifndef VELTRA_PLATFORM_URL_H
#define VELTRA_PLATFORM_URL_H

#include <string_view>

// Whether `text` is a URI or a relative reference by the syntax of RFC 3986, and not empty. Neither scheme nor host is
// asked for. Characters beyond ASCII have to be percent-encoded.
bool isWellFormedURL(std::string_view text);

#endif
