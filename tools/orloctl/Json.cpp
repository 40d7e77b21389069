#include "tools/orloctl/Json.h"

#include <limits>

#include "Daemon/Conversions.h"
#include "platform/linux/system/Json.h"

namespace {

using nlohmann::ordered_json;

constexpr int maximumNesting = 32;

Value valueFrom(const ordered_json& json, int nesting);

Value dataFrom(const ordered_json& hexadecimal) {
    const std::string digits = hexadecimal.is_string() ? hexadecimal.get<std::string>() : "-";
    if (digits.size() % 2 != 0 || digits.find_first_not_of("0123456789abcdefABCDEF") != std::string::npos)
        throw JsonFailure("\"$data\" takes a text of pairs of hexadecimal digits");
    return hexString2Binary(digits);
}

Value dictionaryFrom(const ordered_json& json, int nesting) {
    if (json.size() == 1 && json.contains("$data"))
        return dataFrom(json["$data"]);
    Value::Dictionary dictionary;
    for (const auto& [key, element] : json.items())
        dictionary.emplace(key, valueFrom(element, nesting));
    return dictionary;
}

Value arrayFrom(const ordered_json& json, int nesting) {
    Value::Array array;
    for (const auto& element : json)
        array.push_back(valueFrom(element, nesting));
    return array;
}

Value valueFrom(const ordered_json& json, int nesting) {
    if (nesting > maximumNesting)
        throw JsonFailure("nests more than " + std::to_string(maximumNesting) + " arrays and objects");
    switch (json.type()) {
    case ordered_json::value_t::string:
        return json.get<std::string>();
    case ordered_json::value_t::boolean:
        return json.get<bool>();
    case ordered_json::value_t::number_integer:
        return json.get<std::int64_t>();
    case ordered_json::value_t::number_unsigned:
        if (json.get<std::uint64_t>() > std::uint64_t{std::numeric_limits<std::int64_t>::max()})
            throw JsonFailure("holds a number beyond 64 signed bits");
        return json.get<std::int64_t>();
    case ordered_json::value_t::array:
        return arrayFrom(json, nesting + 1);
    case ordered_json::value_t::object:
        return dictionaryFrom(json, nesting + 1);
    case ordered_json::value_t::number_float:
        throw JsonFailure("holds a number that is no 64-bit integer");
    default:
        throw JsonFailure("holds null, which a request cannot carry");
    }
}

} // namespace

ordered_json jsonFromValue(const Value& value) {
    if (const std::string* text = value.text())
        return *text;
    if (const Value::Data* data = value.data()) {
        const Value hexadecimal = DatatoHexString(*data);
        return {{"$data", hexadecimal.isNothing() ? "" : *hexadecimal.text()}};
    }
    if (const Value::Array* array = value.array()) {
        ordered_json json = ordered_json::array();
        for (const Value& element : *array)
            json.push_back(jsonFromValue(element));
        return json;
    }
    if (const Value::Dictionary* dictionary = value.dictionary()) {
        ordered_json json = ordered_json::object();
        for (const auto& [key, element] : *dictionary)
            json[key] = jsonFromValue(element);
        return json;
    }
    if (value.isBoolean())
        return *value.boolean();
    return value.isNothing() ? ordered_json() : ordered_json(*value.integer());
}

Value valueFromJson(const std::string& text) {
    std::string refusal;
    if (!jsonToValue(text, &refusal))
        throw JsonFailure("holds " + refusal);
    try {
        return valueFrom(ordered_json::parse(text), 0);
    } catch (const ordered_json::exception& failure) {
        throw JsonFailure(failure.what());
    }
}
