#include "platform/OrloDataStore.h"

#include <string>

#include "platform/Hexadecimal.h"

Value QDOrloCreateInstanceString(const Value& answer) {
    if (const std::string* text = answer.text())
        return text->empty() ? Value() : answer;
    if (const Value::Data* data = answer.data())
        return data->empty() ? Value() : Value(hexadecimal(*data));
    if (answer.isBoolean() || !answer.isNumber())
        return {};
    return std::to_string(*answer.integer());
}
