#include "platform/Format.h"

#include <algorithm>
#include <charconv>

#include "platform/ShownText.h"

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

// Formats one text.
class Formatter {
public:
    explicit Formatter(bool forLog) : forLog_(forLog) {}

    std::string format(std::string_view text, std::initializer_list<FormatArgument> arguments);

private:
    void append(const FormatArgument& argument, const Conversion& conversion);
    void appendOnThisLine(const FormatArgument& argument, const Conversion& conversion);
    void appendValue(const Value& value, const Conversion& conversion);
    void appendText(std::string_view text, utf8::Escaping how = utf8::Escaping::OneLine);
    void appendNumber(std::uint64_t number, bool negative, const Conversion& conversion);

    const bool forLog_;
    std::string out_;
};

void Formatter::append(const FormatArgument& argument, const Conversion& conversion) {
    if (const Value* const* value = std::get_if<const Value*>(&argument.content_))
        appendValue(**value, conversion);
    else if (const Error* const* error = std::get_if<const Error*>(&argument.content_))
        out_ += (*error)->description();
    else if (const auto* literal = std::get_if<FormatArgument::Literal>(&argument.content_))
        out_ += literal->text;
    else if (const auto* text = std::get_if<std::string_view>(&argument.content_))
        appendText(*text);
    else if (const auto* output = std::get_if<ProgramOutput>(&argument.content_); output && output->text->text())
        appendText(*output->text->text(), utf8::Escaping::Lines);
    else if (const auto* number = std::get_if<std::uint64_t>(&argument.content_))
        appendNumber(*number, argument.negative_, conversion);
    else if (const void* const* pointer = std::get_if<const void*>(&argument.content_))
        appendPadded(out_, "0x", digits(reinterpret_cast<std::uintptr_t>(*pointer), 16), conversion.zeroPadded,
                     conversion.width);
    else
        out_ += noArgument;
}

// Where more of the line follows, a line end of the argument may not stay.
void Formatter::appendOnThisLine(const FormatArgument& argument, const Conversion& conversion) {
    const std::size_t before = out_.size();
    append(argument, conversion);
    const bool keepsLines = std::holds_alternative<FormatArgument::Literal>(argument.content_) ||
                            std::holds_alternative<ProgramOutput>(argument.content_);
    if (!keepsLines && out_.size() > before && out_.back() == '\n')
        out_.replace(out_.size() - 1, 1, "\\n");
}

void Formatter::appendValue(const Value& value, const Conversion& conversion) {
    const bool asBoolean =
        value.isBoolean() && std::string_view("@sp").find(conversion.letter) != std::string_view::npos;
    if (const std::string* text = value.text())
        appendText(*text);
    else if (const std::optional<std::int64_t> number = value.integer(); number && !asBoolean)
        appendNumber(static_cast<std::uint64_t>(*number), *number < 0, conversion);
    else
        out_ += value.description();
}

void Formatter::appendText(std::string_view text, utf8::Escaping how) {
    if (forLog_)
        appendShown(out_, text, longestShownText, how);
    else
        out_ += text;
}

void Formatter::appendNumber(std::uint64_t number, bool negative, const Conversion& conversion) {
    const std::uint64_t unsignedNumber = conversion.wide ? number : static_cast<std::uint32_t>(number);
    std::string sign, text;
    switch (conversion.letter) {
    case 'd':
    case 'i': {
        const bool below =
            conversion.wide ? static_cast<std::int64_t>(number) < 0 : static_cast<std::int32_t>(number) < 0;
        sign = below ? "-" : "";
        text = digits(!below            ? unsignedNumber
                      : conversion.wide ? 0 - number
                                        : static_cast<std::uint32_t>(0 - number),
                      10);
        break;
    }
    case 'u':
        text = digits(unsignedNumber, 10);
        break;
    case 'x':
        text = digits(unsignedNumber, 16);
        break;
    case 'X':
        text = digits(unsignedNumber, 16);
        std::transform(text.begin(), text.end(), text.begin(),
                       [](char digit) { return digit >= 'a' ? static_cast<char>(digit - 'a' + 'A') : digit; });
        break;
    default:
        sign = negative ? "-" : "";
        text = digits(negative ? 0 - number : number, 10);
    }
    appendPadded(out_, sign, text, conversion.zeroPadded, conversion.width);
}

std::string Formatter::format(std::string_view text, std::initializer_list<FormatArgument> arguments) {
    auto argument = arguments.begin();
    while (true) {
        const std::size_t percent = text.find('%');
        out_ += text.substr(0, percent);
        if (percent == std::string_view::npos)
            return std::move(out_);
        text.remove_prefix(percent + 1);
        if (text.starts_with('%')) {
            out_ += '%';
            text.remove_prefix(1);
            continue;
        }
        const Conversion conversion = readConversion(text);
        if (conversion.length == 0) {
            out_ += '%';
            continue;
        }
        text.remove_prefix(conversion.length);
        if (argument == arguments.end()) {
            out_ += noArgument;
            continue;
        }
        if (forLog_ && !text.empty())
            appendOnThisLine(*argument, conversion);
        else
            append(*argument, conversion);
        ++argument;
    }
}

std::string Formatting::operator()(std::string_view text, std::initializer_list<FormatArgument> arguments) const {
    return Formatter(false).format(text, arguments);
}

std::string formatForLog(std::string_view text, std::initializer_list<FormatArgument> arguments) {
    return Formatter(true).format(text, arguments);
}
