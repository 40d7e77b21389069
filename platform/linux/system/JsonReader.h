// Values as JSON and CBOR through the one library that knows both.
#ifndef VELTRA_PLATFORM_LINUX_JSON_READER_H
#define VELTRA_PLATFORM_LINUX_JSON_READER_H

#include <cstdint>
#include <limits>
#include <string>
#include <utility>
#include <vector>

#include <nlohmann/json.hpp>

#include "platform/Utf8.h"
#include "platform/Value.h"

// Builds a Value from the events of the library's parser. Refuses what a Value cannot hold or what no honest writer
// sends: fractions and integers beyond 64 signed bits (unless they may be nothing), texts that are no UTF-8, a key that
// stands twice in one dictionary, collections nested deeper than `maximumNesting`, and more than `maximumValues`
// values, since the smallest of them takes one byte of input but some fifty of memory. Declared sizes are never
// believed.
class ValueBuilder : public nlohmann::json_sax<nlohmann::json> {
public:
    static constexpr std::size_t maximumNesting = 32;
    static constexpr std::size_t maximumValues = std::size_t{1} << 20;

    // `nothingAllowed`: whether null and numbers that do not fit stand for a value of nothing or are refused.
    explicit ValueBuilder(bool nothingAllowed) : nothingAllowed_(nothingAllowed) {}

    // The value, once the parser has accepted the whole input.
    Value take() { return std::move(root_); }

    // What the input was refused for, and how many bytes the parser had taken when it was no longer well-formed.
    const std::string& refusal() const { return refusal_; }
    std::size_t malformedAt() const { return malformedAt_; }

    bool null() override { return nothingAllowed_ ? add(Value()) : refuse("a value of nothing"); }
    bool boolean(bool value) override { return add(Value(value)); }
    bool number_integer(number_integer_t value) override { return add(Value(value)); }
    bool number_unsigned(number_unsigned_t value) override {
        if (value > static_cast<number_unsigned_t>(std::numeric_limits<std::int64_t>::max()))
            return unfitting("an integer beyond 64 signed bits");
        return add(Value(value));
    }
    bool number_float(number_float_t, const string_t&) override {
        return unfitting("a number that is no integer of 64 signed bits");
    }
    bool string(string_t& value) override {
        return utf8::isValid(value) ? add(Value(std::move(value))) : refuse("a text that is no UTF-8");
    }
    bool binary(binary_t& value) override { return add(Value(Value::Data(std::move(value)))); }
    bool start_object(std::size_t) override { return open(Level{.isDictionary = true}); }
    bool start_array(std::size_t) override { return open(Level{}); }
    bool end_object() override { return close(); }
    bool end_array() override { return close(); }

    bool key(string_t& value) override {
        Level& level = levels_.back();
        if (!utf8::isValid(value))
            return refuse("a key that is no UTF-8");
        if (level.dictionary.contains(value))
            return refuse("a key that stands twice");
        level.key = std::move(value);
        return true;
    }

    bool parse_error(std::size_t position, const std::string&, const nlohmann::detail::exception&) override {
        malformedAt_ = position;
        return refuse("a syntax error");
    }

private:
    // A collection whose end has not come yet.
    struct Level {
        bool isDictionary = false;
        Value::Dictionary dictionary = {};
        Value::Array array = {};
        std::string key = {};
    };

    bool refuse(std::string what) {
        refusal_ = std::move(what);
        return false;
    }

    // A number that no Value holds.
    bool unfitting(const char* what) { return nothingAllowed_ ? add(Value()) : refuse(what); }

    bool open(Level level) {
        if (levels_.size() == maximumNesting)
            return refuse("a nesting of more than " + std::to_string(maximumNesting));
        levels_.push_back(std::move(level));
        return true;
    }

    bool close() {
        Level level = std::move(levels_.back());
        levels_.pop_back();
        return add(level.isDictionary ? Value(std::move(level.dictionary)) : Value(std::move(level.array)));
    }

    bool add(Value value) {
        if (++values_ > maximumValues)
            return refuse("more than " + std::to_string(maximumValues) + " values");
        if (levels_.empty()) {
            root_ = std::move(value);
            return true;
        }
        Level& level = levels_.back();
        if (level.isDictionary)
            level.dictionary.emplace(std::move(level.key), std::move(value));
        else
            level.array.push_back(std::move(value));
        return true;
    }

    const bool nothingAllowed_;
    std::vector<Level> levels_;
    std::size_t values_ = 0;
    Value root_;
    std::string refusal_;
    std::size_t malformedAt_ = 0;
};

// A value as JSON, with what `fromData` makes of data. Null is nothing, and what stands in more than `nestingLeft`
// collections, which no reader here takes.
template <class Json, class FromData>
Json jsonOf(const Value& value, FromData fromData, std::size_t nestingLeft = 2 * ValueBuilder::maximumNesting) {
    if (const std::string* text = value.text())
        return *text;
    if (const Value::Data* data = value.data())
        return fromData(*data);
    if (value.isBoolean())
        return *value.boolean();
    if (value.isNumber())
        return *value.integer();
    Json json;
    if (nestingLeft-- == 0)
        return json;
    if (const Value::Array* array = value.array()) {
        json = Json::array();
        for (const Value& element : *array)
            json.push_back(jsonOf<Json>(element, fromData, nestingLeft));
    } else if (const Value::Dictionary* dictionary = value.dictionary()) {
        json = Json::object();
        for (const auto& [key, element] : *dictionary)
            json[key] = jsonOf<Json>(element, fromData, nestingLeft);
    }
    return json;
}

// The same as jsonToMessageValue (platform/Json.h) reads it.
nlohmann::ordered_json jsonFromValue(const Value& value);

#endif
