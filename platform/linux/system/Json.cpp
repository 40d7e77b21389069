#include "platform/Json.h"

#include <algorithm>

#include "platform/Hexadecimal.h"
#include "platform/linux/system/JsonReader.h"

namespace {

constexpr char dataKey[] = "$data";

// The parser takes a NUL for the end of the text and would leave unread what follows.
bool hasNul(std::string_view text) {
    return text.find('\0') != std::string_view::npos;
}

// Makes data of each {"$data": "<hexadecimal>"}; false for one that is malformed.
bool makeData(Value& value) {
    if (Value::Array* elements = value.array())
        return std::all_of(elements->begin(), elements->end(), makeData);
    Value::Dictionary* entries = value.dictionary();
    if (!entries)
        return true;
    if (entries->size() > 1 || !entries->contains(dataKey))
        return std::all_of(entries->begin(), entries->end(), [](auto& entry) { return makeData(entry.second); });
    const std::string* digits = value[dataKey].text();
    std::optional<Value::Data> bytes = digits ? bytesOfHexadecimal(*digits) : std::nullopt;
    const bool isMade = bytes.has_value();
    if (isMade)
        value = std::move(*bytes);
    return isMade;
}

std::optional<Value> read(std::string_view text, bool nothingAllowed, std::string* refusal) {
    ValueBuilder builder(nothingAllowed);
    if (!hasNul(text) && nlohmann::json::sax_parse(text.begin(), text.end(), &builder))
        return builder.take();
    if (!refusal)
        return std::nullopt;
    *refusal = hasNul(text) ? "a NUL character" : builder.refusal();
    if (builder.malformedAt() != 0) {
        const std::string_view taken = text.substr(0, builder.malformedAt());
        const auto lines = std::count(taken.begin(), taken.end(), '\n');
        *refusal += " in line " + std::to_string(lines + 1) + " at byte " +
                    std::to_string(taken.size() - (taken.rfind('\n') + 1));
    }
    return std::nullopt;
}

} // namespace

std::optional<Value> jsonToValue(std::string_view text, std::string* refusal) {
    return read(text, true, refusal);
}

std::optional<Value> jsonToMessageValue(std::string_view text, std::string* refusal) {
    std::optional<Value> value = read(text, false, refusal);
    if (!value || makeData(*value))
        return value;
    if (refusal)
        *refusal = "a \"$data\" that is no text of pairs of hexadecimal digits";
    return std::nullopt;
}

nlohmann::ordered_json jsonFromValue(const Value& value) {
    using nlohmann::ordered_json;
    return jsonOf<ordered_json>(value, [](const Value::Data& data) {
        return ordered_json{{dataKey, hexadecimal(data)}};
    });
}

std::optional<std::string> jsonTextMember(std::string_view text, std::string_view key) {
    using Event = nlohmann::json::parse_event_t;
    // What is not wanted is dropped as soon as it is read, so that nothing of it is kept.
    const auto isWanted = [key](int depth, Event event, const nlohmann::json& parsed) {
        return depth == 0 || (depth == 1 && (event != Event::key || parsed.get_ref<const std::string&>() == key));
    };
    const auto read = hasNul(text) ? nlohmann::json() : nlohmann::json::parse(text, isWanted, false);
    const auto found = read.is_object() ? read.find(std::string(key)) : read.end();
    return found != read.end() && found->is_string() ? std::optional(found->get<std::string>()) : std::nullopt;
}
