#include "platform/linux/system/Json.h"

#include "platform/linux/system/JsonReader.h"

std::optional<Value> jsonToValue(std::string_view text, std::string* refusal) {
    ValueBuilder builder(true);
    if (nlohmann::json::sax_parse(text.begin(), text.end(), &builder))
        return builder.take();
    if (refusal)
        *refusal = builder.refusal();
    return std::nullopt;
}
