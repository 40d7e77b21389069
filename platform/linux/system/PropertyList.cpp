#include "platform/PropertyList.h"

#include <charconv>
#include <cstring>
#include <filesystem>
#include <string_view>
#include <system_error>

#include <fcntl.h>
#include <pugixml.hpp>

#include "platform/Base64.h"
#include "platform/DeviceRoot.h"
#include "platform/Utf8.h"

namespace {

constexpr unsigned maximumNesting = 32;

using Result = std::optional<Value>;

Result element(const pugi::xml_node& node, unsigned nesting);

Result dictionary(const pugi::xml_node& node, unsigned nesting) {
    Value::Dictionary entries;
    for (pugi::xml_node key = node.first_child(); key;) {
        const pugi::xml_node content = key.next_sibling();
        if (std::strcmp(key.name(), "key") != 0 || !content)
            return std::nullopt;
        Result value = element(content, nesting);
        if (!value || !entries.emplace(key.child_value(), std::move(*value)).second)
            return std::nullopt;
        key = content.next_sibling();
    }
    return entries;
}

Result array(const pugi::xml_node& node, unsigned nesting) {
    Value::Array elements;
    for (const pugi::xml_node& child : node.children()) {
        Result value = element(child, nesting);
        if (!value)
            return std::nullopt;
        elements.push_back(std::move(*value));
    }
    return elements;
}

Result integer(const pugi::xml_node& node, unsigned) {
    const std::string_view digits = node.child_value();
    std::int64_t number = 0;
    const auto end = std::from_chars(digits.data(), digits.data() + digits.size(), number);
    if (end.ec != std::errc() || end.ptr != digits.data() + digits.size())
        return std::nullopt;
    return number;
}

Result data(const pugi::xml_node& node, unsigned) {
    std::optional<Value::Data> bytes = base64Decode(node.child_value());
    return bytes ? Result(std::move(*bytes)) : std::nullopt;
}

constexpr struct {
    const char* name;
    Result (*read)(const pugi::xml_node&, unsigned nesting);
} kinds[] = {
    {"dict", dictionary},
    {"array", array},
    {"string", [](const pugi::xml_node& node, unsigned) { return Result(node.child_value()); }},
    {"integer", integer},
    {"data", data},
    {"true", [](const pugi::xml_node&, unsigned) { return Result(true); }},
    {"false", [](const pugi::xml_node&, unsigned) { return Result(false); }},
    {"real", [](const pugi::xml_node&, unsigned) { return Result(Value()); }},
    {"date", [](const pugi::xml_node&, unsigned) { return Result(Value()); }},
};

Result element(const pugi::xml_node& node, unsigned nesting) {
    if (nesting == maximumNesting)
        return std::nullopt;
    for (const auto& kind : kinds) {
        if (std::strcmp(node.name(), kind.name) == 0)
            return kind.read(node, nesting + 1);
    }
    return std::nullopt;
}

} // namespace

std::optional<Value> propertyListToValue(const Value::Data& xml) {
    const std::string_view bytes(reinterpret_cast<const char*>(xml.data()), xml.size());
    if (!utf8::isValid(bytes))
        return std::nullopt;
    pugi::xml_document document;
    if (!document.load_buffer(xml.data(), xml.size(), pugi::parse_default, pugi::encoding_utf8))
        return std::nullopt;
    const pugi::xml_node root = document.child("plist").first_child();
    return root && !root.next_sibling() ? element(root, 0) : std::nullopt;
}

Value bundleInformationList() {
    constexpr std::size_t maximumSize = std::size_t{1} << 20;
    std::error_code error;
    static const std::filesystem::path executable = std::filesystem::read_symlink("/proc/self/exe", error);
    if (executable.empty())
        return {};
    // The list comes with the program and not with the device, so it does not lie below the device root.
    const std::filesystem::path list = executable.parent_path() / "Info.plist";
    const FileDescriptor file(::open(list.c_str(), O_RDONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    const std::optional<Value::Data> contents = file ? readRegularFile(file, maximumSize) : std::nullopt;
    return contents ? propertyListToValue(*contents).value_or(Value()) : Value();
}
