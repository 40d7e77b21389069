#include "platform/Value.h"

#include "platform/Hexadecimal.h"
#include "platform/ShownText.h"

namespace {

constexpr std::size_t shownText = 256;        // bytes of one text or key inside a collection
constexpr std::size_t wholeData = 64;         // bytes of data that is shown whole
constexpr std::size_t shownData = 16;         // bytes at each end of longer data
constexpr std::size_t shownCollection = 4096; // a collection takes up no further element from here on
constexpr unsigned shownNesting = 32;

void appendData(std::string& out, std::span<const std::uint8_t> data) {
    if (data.size() <= wholeData)
        out += "<" + hexadecimal(data) + ">";
    else
        out += "<" + std::to_string(data.size()) + " bytes: " + hexadecimal(data.first(shownData)) + "..." +
               hexadecimal(data.last(shownData)) + ">";
}

void appendText(std::string& out, std::string_view text) {
    out += '"';
    const bool whole = appendShownText(out, text, shownText, utf8::Escaping::Quotes);
    out += '"';
    if (!whole)
        appendCutMark(out, text);
}

void append(std::string& out, const Value& value, unsigned nesting);

template <class Collection, class Append>
void appendCollection(std::string& out, const Collection& collection, const char (&brackets)[3], unsigned nesting,
                      Append appendElement) {
    out += brackets[0];
    std::size_t left = collection.size();
    for (const auto& element : collection) {
        if (left < collection.size())
            out += ", ";
        if (nesting == shownNesting || out.size() >= shownCollection) {
            out += "... (" + std::to_string(left) + " more)";
            break;
        }
        appendElement(element);
        --left;
    }
    out += brackets[1];
}

void appendEntry(std::string& out, std::string_view key, const Value& value, unsigned nesting) {
    appendText(out, key);
    out += ": ";
    append(out, value, nesting);
}

void append(std::string& out, const Value& value, unsigned nesting) {
    if (const Value::Dictionary* dictionary = value.dictionary())
        appendCollection(out, *dictionary, "{}", nesting,
                         [&](const auto& entry) { appendEntry(out, entry.first, entry.second, nesting + 1); });
    else if (const Value::Array* array = value.array())
        appendCollection(out, *array, "[]", nesting, [&](const Value& element) { append(out, element, nesting + 1); });
    else if (const Value::Data* data = value.data())
        appendData(out, *data);
    else if (const std::string* text = value.text())
        appendText(out, *text);
    else if (value.isBoolean())
        out += *value.boolean() ? "true" : "false";
    else if (value.isNumber())
        out += std::to_string(*value.integer());
    else
        out += "(null)";
}

} // namespace

std::optional<std::int64_t> Value::integer() const {
    if (const bool* value = std::get_if<bool>(&content_))
        return *value ? 1 : 0;
    if (const std::int64_t* value = std::get_if<std::int64_t>(&content_))
        return *value;
    return std::nullopt;
}

std::optional<bool> Value::boolean() const {
    const std::optional<std::int64_t> number = integer();
    return number ? std::optional(*number != 0) : std::nullopt;
}

const Value& Value::operator[](std::string_view key) const {
    static const Value nothing;
    const Dictionary* entries = dictionary();
    if (!entries)
        return nothing;
    const auto entry = entries->find(key);
    return entry == entries->end() ? nothing : entry->second;
}

std::string Value::description() const {
    std::string out;
    if (const std::string* content = text())
        appendShown(out, *content);
    else
        append(out, *this, 0);
    return out;
}

std::string Value::descriptionOf(std::span<const std::uint8_t> data) {
    std::string out;
    appendData(out, data);
    return out;
}

std::string Value::descriptionOf(BorrowedEntries entries) {
    std::string out;
    appendCollection(out, entries, "{}", 0,
                     [&](const auto& entry) { appendEntry(out, entry.first, *entry.second, 1); });
    return out;
}
