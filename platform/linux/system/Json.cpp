#include "platform/linux/system/Json.h"

#include <algorithm>

#include "platform/linux/system/JsonReader.h"

namespace {

// Keeps one text of the outermost object and skips the rest, in constant memory but for the parser's own stack.
class TextMemberReader : public nlohmann::json_sax<nlohmann::json> {
public:
    explicit TextMemberReader(std::string_view key) : key_(key) {}

    std::optional<std::string> take() { return std::move(found_); }

    bool null() override { return skip(); }
    bool boolean(bool) override { return skip(); }
    bool number_integer(number_integer_t) override { return skip(); }
    bool number_unsigned(number_unsigned_t) override { return skip(); }
    bool number_float(number_float_t, const string_t&) override { return skip(); }
    bool binary(binary_t&) override { return skip(); }
    bool start_object(std::size_t) override { return open(); }
    bool start_array(std::size_t) override { return open(); }
    bool end_object() override { return close(); }
    bool end_array() override { return close(); }

    bool string(string_t& value) override {
        if (wanted())
            found_ = std::move(value);
        return depth_ > 0;
    }

    bool key(string_t& value) override {
        if (depth_ == 1)
            atKey_ = value == key_;
        return true;
    }

    bool parse_error(std::size_t, const std::string&, const nlohmann::detail::exception&) override { return false; }

private:
    bool wanted() const { return depth_ == 1 && atKey_; }

    // A value of another kind. Outside of any collection it ends the reading, since the text is then no object.
    bool skip() {
        if (wanted())
            found_.reset();
        return depth_ > 0;
    }
    bool open() {
        if (wanted())
            found_.reset();
        ++depth_;
        return true;
    }
    bool close() {
        --depth_;
        return true;
    }

    const std::string_view key_;
    std::optional<std::string> found_;
    std::size_t depth_ = 0;
    bool atKey_ = false;
};

// The parser takes a NUL for the end of the text and would leave unread what follows.
bool hasNul(std::string_view text) {
    return text.find('\0') != std::string_view::npos;
}

} // namespace

std::optional<Value> jsonToValue(std::string_view text, std::string* refusal) {
    ValueBuilder builder(true);
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

std::optional<std::string> jsonTextMember(std::string_view text, std::string_view key) {
    TextMemberReader reader(key);
    if (hasNul(text) || !nlohmann::json::sax_parse(text.begin(), text.end(), &reader))
        return std::nullopt;
    return reader.take();
}
