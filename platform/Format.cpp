#include "platform/Format.h"

#include <algorithm>
#include <charconv>

namespace {

constexpr unsigned widest = 64;
constexpr std::string_view noArgument = "(null)";

// A conversion as it stands behind a per cent sign.
struct Conversion {
    bool zeroPadded = false;
    unsigned width = 0;
    bool wide = false;
    char letter = 0;
    std::size_t length = 0; // of the text that was read, the letter included; 0 for an unknown conversion
};

Conversion readConversion(std::string_view text) {
    Conversion conversion;
    std::size_t at = 0;
    if (at < text.size() && text[at] == '0') {
        conversion.zeroPadded = true;
        ++at;
    }
    for (; at < text.size() && text[at] >= '0' && text[at] <= '9'; ++at)
        conversion.width = std::min(conversion.width * 10 + static_cast<unsigned>(text[at] - '0'), widest);
    for (const std::string_view size : {"ll", "l", "z"}) {
        if (text.substr(at).starts_with(size)) {
            conversion.wide = true;
            at += size.size();
            break;
        }
    }
    if (at < text.size() && std::string_view("@sdiuxXp").find(text[at]) != std::string_view::npos) {
        conversion.letter = text[at];
        conversion.length = at + 1;
    }
    return conversion;
}

std::string digits(std::uint64_t number, int base) {
    char buffer[20];
    const auto end = std::to_chars(std::begin(buffer), std::end(buffer), number, base);
    return std::string(buffer, end.ptr);
}

void appendPadded(std::string& out, std::string_view sign, const std::string& number, bool zeroPadded, unsigned width) {
    const std::size_t length = sign.size() + number.size();
    const std::size_t padding = width > length ? width - length : 0;
    if (!zeroPadded)
        out.append(padding, ' ');
    out += sign;
    if (zeroPadded)
        out.append(padding, '0');
    out += number;
}

} // namespace

FormatArgument::FormatArgument(const Value& value) {
    if (const std::optional<std::int64_t> number = value.integer()) {
        content_ = static_cast<std::uint64_t>(*number);
        negative_ = *number < 0;
        boolean_ = value.isBoolean();
    } else if (!value.isNothing()) {
        content_ = value.description();
    }
}

FormatArgument::FormatArgument(const Error& error) : content_(error.description()) {}

FormatArgument::FormatArgument(const std::optional<Error>& error) {
    if (error)
        content_ = error->description();
}

FormatArgument::FormatArgument(const char* text) {
    if (text)
        content_ = std::string(text);
}

FormatArgument::FormatArgument(std::string_view text) : content_(std::string(text)) {}

FormatArgument::FormatArgument(const std::string& text) : content_(text) {}

void FormatArgument::append(std::string& out, char conversion, bool wide, bool zeroPadded, unsigned width) const {
    if (const std::string* text = std::get_if<std::string>(&content_)) {
        out += *text;
        return;
    }
    if (const void* const* pointer = std::get_if<const void*>(&content_)) {
        appendPadded(out, "0x", digits(reinterpret_cast<std::uintptr_t>(*pointer), 16), zeroPadded, width);
        return;
    }
    const std::uint64_t* number = std::get_if<std::uint64_t>(&content_);
    if (!number) {
        out += noArgument;
        return;
    }

    const std::uint64_t unsignedNumber = wide ? *number : static_cast<std::uint32_t>(*number);
    switch (conversion) {
    case 'd':
    case 'i': {
        const bool negative = wide ? static_cast<std::int64_t>(*number) < 0 : static_cast<std::int32_t>(*number) < 0;
        const std::uint64_t magnitude = !negative ? unsignedNumber
                                        : wide    ? 0 - *number
                                                  : static_cast<std::uint32_t>(0 - *number);
        appendPadded(out, negative ? "-" : "", digits(magnitude, 10), zeroPadded, width);
        return;
    }
    case 'u':
        appendPadded(out, "", digits(unsignedNumber, 10), zeroPadded, width);
        return;
    case 'x':
        appendPadded(out, "", digits(unsignedNumber, 16), zeroPadded, width);
        return;
    case 'X': {
        std::string upper = digits(unsignedNumber, 16);
        std::transform(upper.begin(), upper.end(), upper.begin(),
                       [](char digit) { return digit >= 'a' ? static_cast<char>(digit - 'a' + 'A') : digit; });
        appendPadded(out, "", upper, zeroPadded, width);
        return;
    }
    default:
        if (boolean_)
            out += *number != 0 ? "true" : "false";
        else
            appendPadded(out, negative_ ? "-" : "", digits(negative_ ? 0 - *number : *number, 10), zeroPadded, width);
    }
}

std::string format(std::string_view text, std::initializer_list<FormatArgument> arguments) {
    std::string out;
    auto argument = arguments.begin();
    while (true) {
        const std::size_t percent = text.find('%');
        out += text.substr(0, percent);
        if (percent == std::string_view::npos)
            return out;
        text.remove_prefix(percent + 1);
        if (text.starts_with('%')) {
            out += '%';
            text.remove_prefix(1);
            continue;
        }
        const Conversion conversion = readConversion(text);
        if (conversion.length == 0) {
            out += '%';
            continue;
        }
        text.remove_prefix(conversion.length);
        if (argument == arguments.end()) {
            out += noArgument;
            continue;
        }
        argument->append(out, conversion.letter, conversion.wide, conversion.zeroPadded, conversion.width);
        ++argument;
    }
}
