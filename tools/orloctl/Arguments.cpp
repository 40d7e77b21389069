#include "tools/orloctl/Arguments.h"

#include <optional>
#include <utility>

#include "platform/Json.h"
#include "tools/orloctl/LocalFiles.h"

namespace {

Value parseJson(const std::string& key, const std::string& json) {
    std::string refusal;
    if (std::optional<Value> value = jsonToMessageValue(json, &refusal))
        return std::move(*value);
    throw UsageError(key + ":= holds " + refusal);
}

// Splits at the first "=": what stands before it tells how the rest is read.
std::pair<std::string, Value> parseWord(const std::string& word) {
    const std::size_t equals = word.find('=');
    if (equals == std::string::npos || equals == 0)
        throw UsageError("\"" + word + "\" is none of KEY=TEXT, KEY:=JSON and KEY@=FILE");
    const std::string rest = word.substr(equals + 1);
    const char form = word[equals - 1];
    if (form != ':' && form != '@')
        return {word.substr(0, equals), rest};
    const std::string key = word.substr(0, equals - 1);
    if (key.empty())
        throw UsageError("\"" + word + "\" has no key");
    return {key, form == ':' ? parseJson(key, rest) : Value(readLocalFile(rest))};
}

} // namespace

Value::Dictionary parseArguments(const std::vector<std::string>& words) {
    Value::Dictionary arguments;
    for (const std::string& word : words) {
        auto [key, value] = parseWord(word);
        if (!arguments.emplace(key, std::move(value)).second)
            throw UsageError("The key \"" + key + "\" is given twice");
    }
    return arguments;
}
