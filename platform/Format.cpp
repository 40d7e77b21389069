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

template <class... Kinds>
struct PerKind : Kinds... {
    using Kinds::operator()...;
};
// Clang 14 to 16 do not deduce an aggregate's parameters by themselves.
template <class... Kinds>
PerKind(Kinds...) -> PerKind<Kinds...>;

} // namespace

// Formats one text.
class Formatter {
public:
    explicit Formatter(bool forLog) : forLog_(forLog) {}

    std::string format(std::string_view text, std::initializer_list<FormatArgument> arguments) {
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

private:
    void append(const FormatArgument& argument, const Conversion& conversion) {
        const PerKind appendKind{
            [&](std::monostate) { out_ += noArgument; },
            [&](const Value* value) { appendValue(*value, conversion); },
            [&](std::span<const std::uint8_t> data) { out_ += Value::descriptionOf(data); },
            [&](const Error* error) { out_ += error->description(); },
            [&](FormatArgument::Literal literal) { out_ += literal.text; },
            [&](std::string_view text) { appendText(text); },
            [&](ProgramOutput output) {
                const std::string* const text = output.text->text();
                appendText(text ? *text : noArgument, utf8::Escaping::Lines);
            },
            [&](std::int64_t number) { appendNumber(number, conversion); },
            [&](std::uint64_t number) { appendNumber(number, conversion); },
            [&](const void* pointer) { appendPointer(pointer); },
        };
        std::visit(appendKind, argument.content_);
    }

    // Where more of the line follows, a line end of the argument may not stay.
    void appendOnThisLine(const FormatArgument& argument, const Conversion& conversion) {
        const std::size_t before = out_.size();
        append(argument, conversion);
        const bool keepsLines = std::holds_alternative<FormatArgument::Literal>(argument.content_) ||
                                std::holds_alternative<ProgramOutput>(argument.content_);
        if (!keepsLines && out_.size() > before && out_.back() == '\n')
            out_.replace(out_.size() - 1, 1, "\\n");
    }

    void appendValue(const Value& value, const Conversion& conversion) {
        const bool asBoolean =
            value.isBoolean() && std::string_view("@sp").find(conversion.letter) != std::string_view::npos;
        if (const std::string* text = value.text())
            appendText(*text);
        else if (const std::optional<std::int64_t> number = value.integer(); number && !asBoolean)
            appendNumber(*number, conversion);
        else
            out_ += value.description();
    }

    void appendText(std::string_view text, utf8::Escaping how = utf8::Escaping::OneLine) {
        if (forLog_)
            appendShown(out_, text, longestShownText, how);
        else
            out_ += text;
    }

    template <class Number>
    void appendNumber(Number number, const Conversion& conversion) {
        if (conversion.letter == 'd' || conversion.letter == 'i')
            out_ += std::to_string(conversion.is64Bit ? static_cast<std::int64_t>(number)
                                                      : static_cast<std::int32_t>(number));
        else if (conversion.letter == 'u')
            out_ += std::to_string(conversion.is64Bit ? static_cast<std::uint64_t>(number)
                                                      : static_cast<std::uint32_t>(number));
        else
            out_ += std::to_string(number);
    }

    void appendPointer(const void* pointer) {
        char digits[2 * sizeof pointer];
        const auto end =
            std::to_chars(std::begin(digits), std::end(digits), reinterpret_cast<std::uintptr_t>(pointer), 16);
        out_.append("0x").append(digits, end.ptr);
    }

    const bool forLog_;
    std::string out_;
};

std::string Formatting::operator()(std::string_view text, std::initializer_list<FormatArgument> arguments) const {
    return Formatter(false).format(text, arguments);
}

std::string formatForLog(std::string_view text, std::initializer_list<FormatArgument> arguments) {
    return Formatter(true).format(text, arguments);
}
