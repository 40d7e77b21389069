#include "tools/orloctl/Report.h"

#include <algorithm>
#include <limits>
#include <ostream>

#include "platform/Utf8.h"

namespace {

using nlohmann::ordered_json;

// What is printed passes here, as text and as JSON, whose escapes these are too.
void printText(std::ostream& out, std::string_view text, utf8::Escaping how) {
    out << utf8::escaped(text, how);
}

std::string dump(const ordered_json& json) {
    return json.dump(-1, ' ', false, ordered_json::error_handler_t::replace);
}

bool isScalar(const ordered_json& json) {
    return !json.is_structured() && !json.is_binary();
}

class JsonWriter {
public:
    explicit JsonWriter(std::ostream& out) : out_(out) {}

    void value(const ordered_json& json, const Lists& lists) {
        if (isScalar(json)) {
            scalar(json);
            return;
        }
        bool isFirst = true;
        ++depth_;
        out_ << (json.is_object() ? '{' : '[');
        if (json.is_binary())
            lists.at(json)([&](const Element& element) {
                next(isFirst);
                value(element.json, element.lists);
                return out_.good();
            });
        else
            for (const auto& [name, member] : json.items()) {
                next(isFirst);
                if (json.is_object()) {
                    scalar(name);
                    out_ << ": ";
                }
                value(member, lists);
            }
        --depth_;
        if (!isFirst)
            newLine();
        out_ << (json.is_object() ? '}' : ']');
    }

private:
    void next(bool& isFirst) {
        out_ << (isFirst ? "" : ",");
        newLine();
        isFirst = false;
    }

    void newLine() { out_ << '\n' << std::string(2 * depth_, ' '); }

    void scalar(const ordered_json& json) {
        constexpr std::int64_t most = std::int64_t{1} << 53;
        const bool isLarge = json.is_number_unsigned() ? json.get<std::uint64_t>() > std::uint64_t{most}
                                                       : json.is_number_integer() && (json.get<std::int64_t>() > most ||
                                                                                      json.get<std::int64_t>() < -most);
        const std::string text = dump(json);
        printText(out_, isLarge ? "\"" + text + "\"" : text, utf8::Escaping::OneLine);
    }

    std::ostream& out_;
    std::size_t depth_ = 0;
};

// How people see a member. The line of an element consists of parts between strokes, each of which is left out when the
// element has no value of the name in braces: {name} is the value, {name:8} the same to the right of 8 columns and
// {"name"} in quotes when it is a text. A tab stands for the indentation, which otherwise comes first.
struct Layout {
    std::string_view name;
    std::uint64_t most;  // elements of a list, those inside them counted too
    std::size_t longest; // characters of a value in or below the member
    std::string_view line = {};
    std::string_view title = {};
};

constexpr std::uint64_t all = std::numeric_limits<std::uint64_t>::max();
constexpr std::string_view property = "{name}|  {type}| {\"value\"}|, {length} octets|: {hex}| (SHA-256 {sha256})|"
                                      "  WRONG: {fault}|  hidden {hidden}";
constexpr Layout layouts[] = {
    {"", 1000, 512},
    {"notes", 1000, 2048},
    {"result", all, SIZE_MAX},
    {"response", all, SIZE_MAX},
    {"items", 10000, 128, "{offset:8}|{headerLength:5}|{contentLength:9}|\t{tag}| {value}|  not DER: {fault}",
     "  offset  hdr  content  item"},
    {"payload", 1000, 128, "{\"key\"}|  comment {\"comment\"}|  data {data}|  string {\"string\"}|  deleted {deleted}"},
    {"metadata", 1000, 128, "{\"key\"}|  data {data}|  string {\"string\"}"},
    {"properties", 10000, 128, property},
    {"body", 10000, 128, property},
    {"manifestProperties", 10000, 128, property},
    {"certificates", 100, 128, "{length} octets| at offset {offset}"},
    {"chain", 1000, 512,
     "{number}|  {role}|  {subject}|; issuer {issuer}|; {key}|; {signatureAlgorithm}|; serial number {serialNumber}|"
     "  {fault}"},
    {"constraints", 1000, 512, "{dictionary}| {name}| {demand}|: {state}|, found {found}"},
    {"logs", all, SIZE_MAX, "{date}|{size:14}|  {panic:5}|  {name}|  copied to {copy}|  {note}",
     "  DATE                          SIZE  PANIC  NAME"},
    {"classes", all, SIZE_MAX, "{class}|  {instance}"},
    {"missed", all, SIZE_MAX, "{name}|: {note}"},
};

// That of the member, or without one of its own that of what it is in.
const Layout& layoutOf(std::string_view name, const Layout& outer) {
    const auto* const own = std::ranges::find(layouts, name, &Layout::name);
    return own == std::end(layouts) ? outer : *own;
}

std::string valueText(const ordered_json& json, std::size_t longest, bool isQuoted) {
    if (!json.is_string())
        return dump(json);
    const auto& whole = json.get_ref<const std::string&>();
    const std::string text = shortened(whole, longest);
    const std::string shown = isQuoted || whole.empty() ? utf8::quoted(text) : text;
    return text.size() == whole.size() ? shown : shown + " (" + std::to_string(whole.size()) + " characters)";
}

std::string lineOf(const ordered_json& element, const Layout& layout, const std::string& indentation) {
    const bool isIndented = layout.line.find('\t') == std::string_view::npos;
    std::string text = isIndented ? indentation : "";
    for (std::string_view rest = layout.line; !rest.empty();) {
        const std::string_view part = rest.substr(0, rest.find('|'));
        rest.remove_prefix(std::min(rest.size(), part.size() + 1));
        const std::size_t open = part.find('{'), close = part.find('}');
        const std::string_view field = part.substr(open + 1, close - open - 1);
        const bool isQuoted = field.front() == '"';
        const std::size_t colon = field.find(':');
        const auto member = element.find(isQuoted ? field.substr(1, field.size() - 2) : field.substr(0, colon));
        if (member == element.end())
            continue;
        const std::string value = valueText(*member, layout.longest, isQuoted);
        const std::size_t width = colon == field.npos ? 0 : std::stoul(std::string(field.substr(colon + 1)));
        text += part.front() == '\t' ? indentation : std::string(part.substr(0, open));
        text += std::string(width - std::min(width, value.size()), ' ') + value;
        text += part.substr(close + 1);
    }
    return text;
}

class TextWriter {
public:
    explicit TextWriter(std::ostream& out) : out_(out) {}

    void members(const ordered_json& object, const Lists& lists, const Layout& outer, std::size_t depth) {
        for (const auto& [name, member] : object.items()) {
            const Layout& layout = layoutOf(name, outer);
            if (isScalar(member))
                line(indented(depth, name + ": " + valueText(member, layout.longest, false)));
            else if (member.empty())
                line(indented(depth, name + ": none"));
            else {
                line(indented(depth, name + ":"));
                if (member.is_object())
                    members(member, lists, layout, depth + 1);
                else
                    list(member, lists, layout, depth + 1);
            }
        }
    }

private:
    // Of the elements of a list and those inside them.
    struct Progress {
        bool isCounted = false; // beforehand
        std::uint64_t shown = 0;
        std::uint64_t leftOut = 0;
    };

    static std::string indented(std::size_t depth, const std::string& text = {}) {
        return std::string(2 * depth, ' ') + text;
    }

    void line(const std::string& text) {
        printText(out_, text, utf8::Escaping::OneLine);
        out_ << '\n';
    }

    void list(const ordered_json& json, const Lists& lists, const Layout& layout, std::size_t depth) {
        const auto count = json.is_binary() ? lists.countAt(json) : std::nullopt;
        const Progress outer = std::exchange(progress_, {count.has_value()});
        if (!layout.title.empty())
            line(std::string(layout.title));
        elements(json, lists, layout, depth);
        if (progress_.shown == 0)
            line(indented(depth, "none"));
        if (const std::uint64_t more = count ? *count - progress_.shown : progress_.leftOut; more != 0)
            line(indented(depth, "... and " + std::to_string(more) + " more"));
        progress_ = outer;
    }

    void elements(const ordered_json& json, const Lists& lists, const Layout& layout, std::size_t depth) {
        if (json.is_binary())
            lists.at(json)([&](const Element& made) { return element(made.json, made.lists, layout, depth); });
        else
            for (const ordered_json& made : json)
                element(made, lists, layout, depth);
    }

    // False when no others need to be looked at.
    bool element(const ordered_json& json, const Lists& lists, const Layout& layout, std::size_t depth) {
        const bool isShown = progress_.shown < layout.most;
        ++(isShown ? progress_.shown : progress_.leftOut);
        if (isShown)
            line(isScalar(json)        ? indented(depth, valueText(json, layout.longest, false))
                 : layout.line.empty() ? indented(depth, "-")
                                       : lineOf(json, layout, indented(depth)));
        if (json.is_array())
            elements(json, lists, layout, depth + 1);
        else if (json.is_object() && layout.line.empty() && isShown)
            members(json, lists, layout, depth + 1);
        else if (json.is_object())
            for (const ordered_json& member : json)
                if (!isScalar(member))
                    elements(member, lists, layout, depth + 1);
        return !progress_.isCounted || progress_.shown < layout.most;
    }

    std::ostream& out_;
    Progress progress_;
};

} // namespace

void writeJson(std::ostream& out, const Report& report) {
    JsonWriter writer(out);
    ordered_json json{{"exitStatus", static_cast<int>(report.outcome)}};
    json.update(report.json);
    if (!report.problem.empty())
        json["problem"] = report.problem;
    if (!report.note.empty())
        json["note"] = report.note;
    if (!report.messages.is_null())
        json["messages"] = report.messages;
    writer.value(json, report.lists);
    out << '\n';
}

void writeText(std::ostream& out, const Report& report) {
    TextWriter(out).members(report.json, report.lists, layouts[0], 0);
}

void print(std::ostream& out, std::string_view text) {
    printText(out, text, utf8::Escaping::Lines);
    out << '\n';
}

std::string shortened(const std::string& text, std::size_t most) {
    return text.size() > most ? std::string(utf8::beginning(text, most)) + "..." : text;
}
