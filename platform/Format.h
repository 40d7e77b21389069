// Formatting with printf-style formats and typed arguments: for texts, which are to hold what they were given, and for
// log lines, in which what comes from outside must do no harm.
#ifndef VELTRA_PLATFORM_FORMAT_H
#define VELTRA_PLATFORM_FORMAT_H

#include <concepts>
#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>
#include <variant>

#include "platform/Error.h"
#include "platform/Value.h"

// What a program wrote: a log keeps its lines.
struct ProgramOutput {
    const Value* text;
};

// One argument of a format. It knows its kind, so a conversion never reads memory that the argument does not have. It
// refers to what it was made from, which has to live until the text is formatted; making one never fails.
class FormatArgument {
public:
    FormatArgument(std::nullptr_t) {}
    FormatArgument(const Value& value) : content_(&value) {}
    FormatArgument(std::span<const std::uint8_t> data) : content_(data) {}
    FormatArgument(const Error& error) : content_(&error) {}
    FormatArgument(const std::optional<Error>& error) {
        if (error)
            content_ = &*error;
    }
    FormatArgument(const char* text) { // the program's own words, which a log shows as they stand; null is nothing
        if (text)
            content_ = Literal{text};
    }
    FormatArgument(std::string_view text) : content_(text) {}
    FormatArgument(const std::string& text) : content_(std::string_view(text)) {}
    FormatArgument(ProgramOutput output) : content_(output) {}
    template <std::integral Integer>
    FormatArgument(Integer number)
        : content_(static_cast<std::conditional_t<std::is_signed_v<Integer>, std::int64_t, std::uint64_t>>(number)) {}
    FormatArgument(const void* pointer) : content_(pointer) {}

private:
    friend class Formatter;
    struct Literal {
        const char* text;
    };

    std::variant<std::monostate, const Value*, std::span<const std::uint8_t>, const Error*, Literal, std::string_view,
                 ProgramOutput, std::int64_t, std::uint64_t, const void*>
        content_;
};

// Replaces each conversion of `text` by its argument, in order:
//   %@            any argument: its description, "(null)" for nothing
//   %s            a text
//   %d %i         a number, signed, 32 bits; with l or z 64 bits
//   %u            a number, unsigned, 32 bits; with l or z 64 bits
//   %p            a pointer
//   %%            a per cent sign
// An argument of another kind than the conversion asks for is written as "%@" would; a missing one is "(null)"; an
// unknown conversion stands as it is. A text stands as it is, every other value and an error as its description.
struct Formatting {
    std::string operator()(std::string_view text, std::initializer_list<FormatArgument> arguments) const;

    template <class... Arguments>
    std::string operator()(std::string_view text, const Arguments&... arguments) const {
        return (*this)(text, std::initializer_list<FormatArgument>{FormatArgument(arguments)...});
    }
};

// An object, since beside a function std::format would be a candidate wherever an argument is of namespace std.
inline constexpr Formatting format;

// The same for a log line, which is the one place where text from outside is made harmless: texts stand as appendShown
// (platform/ShownText.h) shows them, without a line end where more of the line follows; so does what a program wrote,
// but for its line ends.
std::string formatForLog(std::string_view text, std::initializer_list<FormatArgument> arguments);

#endif
