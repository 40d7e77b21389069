// Formatting with printf-style formats and typed arguments.
#ifndef VELTRA_PLATFORM_FORMAT_H
#define VELTRA_PLATFORM_FORMAT_H

#include <concepts>
#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <optional>
#include <string>
#include <string_view>
#include <variant>

#include "platform/Error.h"
#include "platform/Value.h"

// One argument of a format. It knows its kind, so a conversion never reads memory that the argument does not own.
class FormatArgument {
public:
    FormatArgument(std::nullptr_t) {}
    FormatArgument(const Value& value);
    FormatArgument(const Error& error);
    FormatArgument(const std::optional<Error>& error);
    FormatArgument(const char* text); // null is nothing
    FormatArgument(std::string_view text);
    FormatArgument(const std::string& text);
    template <std::integral Integer>
    FormatArgument(Integer number) : content_(static_cast<std::uint64_t>(number)), negative_(number < Integer{}) {}
    FormatArgument(const void* pointer) : content_(pointer) {}

    // Appends the argument under the conversion described by the remaining arguments; used by format().
    void append(std::string& out, char conversion, bool wide, bool zeroPadded, unsigned width) const;

private:
    std::variant<std::monostate, std::string, std::uint64_t, const void*> content_;
    bool negative_ = false;
    bool boolean_ = false;
};

// Replaces each conversion of `text` by its argument, in order:
//   %@            any argument: its description, "(null)" for nothing
//   %s            a text
//   %d %i         a number, signed, 32 bits; with l, ll or z 64 bits
//   %u %x %X      a number, unsigned, 32 bits, decimal or hexadecimal; with l, ll or z 64 bits
//   %p            a pointer
//   %%            a per cent sign
// A width with or without a leading 0 pads numbers ("%02x"), to 64 places at most. An argument of another kind than the
// conversion asks for is written as "%@" would; a missing one is "(null)"; an unknown conversion stands as it is.
std::string format(std::string_view text, std::initializer_list<FormatArgument> arguments);

template <class... Arguments>
std::string format(std::string_view text, const Arguments&... arguments) {
    return format(text, std::initializer_list<FormatArgument>{FormatArgument(arguments)...});
}

#endif
