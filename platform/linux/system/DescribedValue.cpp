#include "platform/linux/system/DescribedValue.h"

#include <string>
#include <utility>

#include "platform/Files.h"
#include "platform/Hexadecimal.h"
#include "platform/Utf8.h"

namespace {

constexpr char dataKey[] = "$data", fileKey[] = "$file", kindKey[] = "as";

std::string_view characters(const Value::Data& bytes) {
    return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

Value fromHexadecimal(const Value& digits) {
    std::optional<Value::Data> bytes = digits.text() ? bytesOfHexadecimal(*digits.text()) : std::nullopt;
    return bytes ? Value(std::move(*bytes)) : Value();
}

Value fromFile(const Value& path, const Value& kind) {
    const bool asText = kind == Value("text");
    if (!path.text() || (!asText && !kind.isNothing() && kind != Value("data")))
        return {};
    std::optional<Value::Data> contents = files::readWhole(*path.text());
    if (!contents)
        return {};
    if (!asText)
        return std::move(*contents);
    constexpr std::string_view atTheEnd(" \t\n\v\f\r\0", 7);
    const std::string_view text = characters(*contents);
    return utf8::repaired(text.substr(0, text.find_last_not_of(atTheEnd) + 1));
}

Value resolveDictionary(const Value& described) {
    const Value::Dictionary& entries = *described.dictionary();
    if (entries.contains(dataKey))
        return entries.size() == 1 ? fromHexadecimal(described[dataKey]) : Value();
    if (entries.contains(fileKey))
        return entries.size() == 1 + entries.count(kindKey) ? fromFile(described[fileKey], described[kindKey])
                                                            : Value();
    Value::Dictionary resolved;
    for (const auto& [key, value] : entries)
        resolved.emplace_hint(resolved.end(), key, resolveDescribed(value));
    return resolved;
}

} // namespace

Value resolveDescribed(const Value& described) {
    if (described.dictionary())
        return resolveDictionary(described);
    if (!described.array())
        return described;
    Value::Array resolved;
    for (const Value& element : *described.array())
        resolved.push_back(resolveDescribed(element));
    return resolved;
}
