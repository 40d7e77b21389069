// The dynamically typed value in which requests, responses, options and device answers travel.
#ifndef VELTRA_PLATFORM_VALUE_H
#define VELTRA_PLATFORM_VALUE_H

#include <concepts>
#include <cstdint>
#include <initializer_list>
#include <map>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

// A regular value: copied, moved and compared as a whole. Texts are UTF-8. A boolean is a number too: as an integer it
// is 1 or 0, but it does not compare equal to that integer. Reading another kind than the one a value holds gives
// nothing, so that a chain of look-ups in a hostile request needs no checks in between.
class Value {
public:
    using Data = std::vector<std::uint8_t>;
    using Array = std::vector<Value>;
    using Dictionary = std::map<std::string, Value, std::less<>>;

    // Entries of a dictionary that stay where they are.
    using BorrowedEntries = std::initializer_list<std::pair<std::string_view, const Value*>>;

    Value() = default; // nothing
    Value(bool value) : content_(value) {}
    template <std::integral Integer>
    requires(!std::same_as<Integer, bool>) Value(Integer value) : content_(static_cast<std::int64_t>(value)) {}
    Value(const char* text) : content_(std::string(text)) {}
    Value(std::string_view text) : content_(std::string(text)) {}
    Value(std::string text) : content_(std::move(text)) {}
    Value(Data data) : content_(std::move(data)) {}
    Value(Array array) : content_(std::move(array)) {}
    Value(Dictionary dictionary) : content_(std::move(dictionary)) {}

    bool isNothing() const { return std::holds_alternative<std::monostate>(content_); }
    bool isBoolean() const { return std::holds_alternative<bool>(content_); }
    bool isNumber() const { return isBoolean() || std::holds_alternative<std::int64_t>(content_); }

    // The content when the value is of that kind, null otherwise. The pointer lives as long as the value is unchanged.
    const std::string* text() const { return std::get_if<std::string>(&content_); }
    const Data* data() const { return std::get_if<Data>(&content_); }
    const Array* array() const { return std::get_if<Array>(&content_); }
    const Dictionary* dictionary() const { return std::get_if<Dictionary>(&content_); }
    Array* array() { return std::get_if<Array>(&content_); } // these two to be changed in place
    Dictionary* dictionary() { return std::get_if<Dictionary>(&content_); }

    // A number as an integer or as true (not 0) or false.
    std::optional<std::int64_t> integer() const;
    std::optional<bool> boolean() const;

    // The value under `key`, or a value of nothing when there is none or this is no dictionary.
    const Value& operator[](std::string_view key) const;

    // The value for a reader of the log: "(null)" for nothing, a text as appendShown (platform/ShownText.h) shows it,
    // everything else on one line of bounded length. Data longer than 64 bytes shows its length and its first and last
    // bytes. Texts inside a collection stand in quotes with control characters escaped and URLs without user and
    // password.
    std::string description() const;

    // The same of data, and of a dictionary with these entries, in their order.
    static std::string descriptionOf(std::span<const std::uint8_t> data);
    static std::string descriptionOf(BorrowedEntries entries);

    friend bool operator==(const Value&, const Value&) = default;

private:
    std::variant<std::monostate, bool, std::int64_t, std::string, Data, Array, Dictionary> content_;
};

#endif
