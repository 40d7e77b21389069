#ifndef VELTRA_PLATFORM_ERROR_H
#define VELTRA_PLATFORM_ERROR_H

#include <cstdint>
#include <string>

// A failure as it travels through the plug-in and into a response. An operation that "returns an Error or nothing"
// returns std::optional<Error>; an Error out-value is a pointer to one, which may be null and is filled on failure
// only.
struct Error {
    std::string domain;
    std::int64_t code = 0;
    std::string text; // the description for a person

    // One line with domain, code and text, as "%@" shows it; a line end at its very end stays.
    std::string description() const;

    friend bool operator==(const Error&, const Error&) = default;
};

#endif
