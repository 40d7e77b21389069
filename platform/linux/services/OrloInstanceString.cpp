#include "platform/OrloDataStore.h"

#include <string>

Value QDOrloCreateInstanceString(const Value& answer) {
    if (const std::string* text = answer.text())
        return text->empty() ? Value() : answer;
    if (const Value::Data* data = answer.data()) {
        constexpr char digits[] = "0123456789abcdef";
        std::string text;
        for (const std::uint8_t byte : *data)
            (text += digits[byte >> 4]) += digits[byte & 0xF];
        return text.empty() ? Value() : Value(text);
    }
    if (answer.isBoolean() || !answer.isNumber())
        return {};
    return std::to_string(*answer.integer());
}
