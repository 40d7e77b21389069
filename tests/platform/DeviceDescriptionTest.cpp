#include "platform/linux/system/DeviceDescription.h"

#include <string>

#include <gtest/gtest.h>

#include "platform/linux/system/Json.h"
#include "tests/support/TemporaryRoot.h"

namespace {

using Data = Value::Data;
using Array = Value::Array;
using Dictionary = Value::Dictionary;

constexpr char path[] = "/etc/veltra/device.json";

TEST(Json, textsBecomeValues) {
    Value deepest = Array{};
    for (int i = 1; i < 32; ++i)
        deepest = Array{std::move(deepest)};
    const std::pair<std::string, std::optional<Value>> rows[] = {
        {R"({"a": [1, -2, true, null, "\u00e9"]})", Dictionary{{"a", Array{1, -2, true, Value(), "é"}}}},
        {"9223372036854775807", std::numeric_limits<std::int64_t>::max()},
        {std::string(32, '[') + std::string(32, ']'), deepest},
        {std::string(33, '[') + std::string(33, ']'), std::nullopt},
        {std::string(1 << 20, '['), std::nullopt},
        {"9223372036854775808", Value()},
        {"-9223372036854775809", Value()},
        {"[1.5]", Value::Array{Value()}},
        {"[1.0]", Value::Array{Value()}},
        {"[1e3]", Value::Array{Value()}},
        {R"({"a": 1, "a": 2})", std::nullopt},
        {"\"\xFF\"", std::nullopt},
        {"[1] 2", std::nullopt},
        {std::string("[1]\0", 4), std::nullopt},
        {"[1", std::nullopt},
        {"", std::nullopt},
    };
    for (const auto& [text, value] : rows) {
        std::string refusal;
        EXPECT_EQ(jsonToValue(text, &refusal), value) << text.substr(0, 80);
        EXPECT_EQ(refusal.empty(), value.has_value()) << text.substr(0, 80);
    }
}

TEST(DeviceDescription, isReadAtEveryCall) {
    const TemporaryRoot root;
    for (const int number : {1, 2}) {
        root.write(path, R"({"UniqueChipID": )" + std::to_string(number) + "}");
        EXPECT_EQ(deviceDescription()["UniqueChipID"], Value(number));
    }
}

TEST(DeviceDescription, withoutOneTheConsoleSaysWhyInOneLine) {
    const TemporaryRoot root;
    const struct {
        const char* contents; // null: no file
        const char* line;
    } rows[] = {
        {nullptr, "missing or cannot be read\n"},
        {"[]", "malformed: it is no object\n"},
        {"{\"a\": }", "malformed: a syntax error at byte 7\n"},
        {"{\"a\": 1, \"a\": 2}", "malformed: a key that stands twice\n"},
    };
    for (const auto& row : rows) {
        if (row.contents)
            root.write(path, row.contents);
        testing::internal::CaptureStderr();
        EXPECT_TRUE(deviceDescription().isNothing());
        EXPECT_EQ(testing::internal::GetCapturedStderr(),
                  std::string("Device description /etc/veltra/device.json is ") + row.line);
    }
}

TEST(DeviceDescription, describedValuesStandForDataAndFiles) {
    const TemporaryRoot root;
    root.write("/sys/uid", std::string("\x0B\xAD\0 \n", 5));
    root.write("/sys/model", std::string("M12\xFFx é \n\0\0", 12));
    root.write("/sys/blank", std::string(" \0\n", 3));
    const std::pair<const char*, Value> rows[] = {
        {R"({"$data": "0bADcafe"})", Data{0x0B, 0xAD, 0xCA, 0xFE}},
        {R"({"$data": ""})", Data{}},
        {R"({"$data": "0bA"})", {}},
        {R"({"$data": "0x12"})", {}},
        {R"({"$data": "-1+1"})", {}},
        {R"({"$data": 12})", {}},
        {R"({"$data": "00", "as": "text"})", {}},
        {R"({"$file": "/sys/uid"})", Data{0x0B, 0xAD, 0, ' ', '\n'}},
        {R"({"$file": "/sys/uid", "as": "data"})", Data{0x0B, 0xAD, 0, ' ', '\n'}},
        {R"({"$file": "/sys/model", "as": "text"})", "M12\uFFFDx é"},
        {R"({"$file": "/../sys/blank", "as": "text"})", ""},
        {R"({"$file": "/sys/uid", "as": "number"})", {}},
        {R"({"$file": "/sys/uid", "offset": 1})", {}},
        {R"({"$file": "/sys"})", {}},
        {R"({"$file": "/missing"})", {}},
        {R"({"$file": 1})", {}},
        {R"([1, {"plain": {"$data": "01"}}])", Array{1, Dictionary{{"plain", Data{1}}}}},
    };
    for (const auto& [described, value] : rows) {
        const std::optional<Value> read = jsonToValue(described);
        ASSERT_TRUE(read) << described;
        EXPECT_EQ(resolveDescribed(*read), value) << described;
    }
}

} // namespace
