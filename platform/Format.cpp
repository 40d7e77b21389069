#include "platform/Format.h"

#include <charconv>
#include <iterator>

#include "platform/ShownText.h"

namespace {

constexpr std::string_view noArgument = "(null)";

// A conversion as it stands behind a per cent sign.
struct Conversion {
    bool is64Bit = false;
    char letter = 0;
    std::size_t length = 0; // of the text that was read, the letter included; 0 for an unknown conversion
};

Conversion readConversion(std::string_view text) {
    Conversion conversion;
    conversion.is64Bit = text.starts_with('l') || text.starts_with('z');
    const std::size_t at = conversion.is64Bit ? 1 : 0;
    if (at < text.size() && std::string_view("@sdiup").find(text[at]) != std::string_view::npos) {
        conversion.letter = text[at];
        conversion.length = at + 1;
    }
    return conversion;
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
    void appendPointer(const void* pointer);

    const bool forLog_;
    std::string out_;
};

void Formatter::append(const FormatArgument& argument, const Conversion& conversion) {
    if (const Value* const* value = std::get_if<const Value*>(&argument.content_))
        appendValue(**value, conversion);
    else if (const auto* data = std::get_if<std::span<const std::uint8_t>>(&argument.content_))
        out_ += Value::descriptionOf(*data);
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
        appendPointer(*pointer);
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
    const auto signedNumber = static_cast<std::int64_t>(number);
    if (conversion.letter == 'd' || conversion.letter == 'i')
        out_ += std::to_string(conversion.is64Bit ? signedNumber : static_cast<std::int32_t>(number));
    else if (conversion.letter == 'u')
        out_ += std::to_string(conversion.is64Bit ? number : static_cast<std::uint32_t>(number));
    else
        out_ += negative ? std::to_string(signedNumber) : std::to_string(number);
}

void Formatter::appendPointer(const void* pointer) {
    char digits[2 * sizeof pointer];
    const auto end = std::to_chars(std::begin(digits), std::end(digits), reinterpret_cast<std::uintptr_t>(pointer), 16);
    out_.append("0x").append(digits, end.ptr);
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
