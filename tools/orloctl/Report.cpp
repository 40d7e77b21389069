#include "tools/orloctl/Report.h"

#include <cstdint>
#include <ostream>
#include <string_view>

#include "platform/Utf8.h"

namespace {

using nlohmann::ordered_json;

// What is printed passes here, as text and as JSON, whose escapes these are too.
void printText(std::ostream& out, std::string_view text) {
    std::string shown;
    utf8::appendEscaped(shown, text, utf8::Escaping::Lines);
    out << shown;
}

class Writer {
public:
    explicit Writer(std::ostream& out) : out_(out) {}

    void value(const ordered_json& json, const Lists& lists) {
        if (json.is_binary())
            elements(lists.at(json));
        else if (json.is_object()) {
            open('{');
            for (const auto& [name, member] : json.items()) {
                next();
                scalar(name);
                out_ << ": ";
                value(member, lists);
            }
            close('}');
        } else if (json.is_array()) {
            open('[');
            for (const ordered_json& element : json) {
                next();
                value(element, lists);
            }
            close(']');
        } else
            scalar(json);
    }

private:
    void elements(const Elements& list) {
        open('[');
        list([this](const Element& element) {
            next();
            value(element.json, element.lists);
            return out_.good();
        });
        close(']');
    }

    void open(char bracket) {
        out_ << bracket;
        ++depth_;
        isFirst_ = true;
    }

    void next() {
        out_ << (isFirst_ ? "" : ",");
        newLine();
        isFirst_ = false;
    }

    void close(char bracket) {
        --depth_;
        if (!isFirst_)
            newLine();
        out_ << bracket;
        isFirst_ = false;
    }

    void newLine() { out_ << '\n' << std::string(2 * depth_, ' '); }

    void scalar(const ordered_json& json) {
        constexpr std::int64_t most = std::int64_t{1} << 53;
        const bool isLarge = json.is_number_unsigned() ? json.get<std::uint64_t>() > std::uint64_t{most}
                                                       : json.is_number_integer() && (json.get<std::int64_t>() > most ||
                                                                                      json.get<std::int64_t>() < -most);
        const std::string text = json.dump(-1, ' ', false, ordered_json::error_handler_t::replace);
        printText(out_, isLarge ? "\"" + text + "\"" : text);
    }

    std::ostream& out_;
    std::size_t depth_ = 0;
    bool isFirst_ = true;
};

} // namespace

void writeJson(std::ostream& out, const ordered_json& json, const Lists& lists) {
    Writer(out).value(json, lists);
    out << '\n';
}

void print(std::ostream& out, std::string_view text) {
    printText(out, text);
    out << '\n';
}

std::string shortened(const std::string& text, std::size_t most) {
    return text.size() > most ? std::string(utf8::beginning(text, most)) + "..." : text;
}
