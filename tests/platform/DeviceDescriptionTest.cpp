#include "platform/linux/services/device/DeviceDescription.h"

#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "platform/Json.h"
#include "tests/support/RecordedLog.h"
#include "tests/support/TemporaryRoot.h"

namespace {

using Data = Value::Data;
using Array = Value::Array;
using Dictionary = Value::Dictionary;

TEST(Json, textsBecomeValues) {
    const std::pair<std::string, std::optional<Value>> rows[] = {
        {R"({"a": [1, -2, true, null, "\u00e9"]})", Dictionary{{"a", Array{1, -2, true, Value(), "é"}}}},
        {"9223372036854775807", std::numeric_limits<std::int64_t>::max()},
        {std::string(33, '[') + std::string(33, ']'), std::nullopt},
        {"9223372036854775808", Value()},
        {"-9223372036854775809", Value()},
        {"[1.5]", Value::Array{Value()}},
        {R"({"a": 1, "a": 2})", std::nullopt},
        {"\"\xFF\"", std::nullopt},
        {"[1] 2", std::nullopt},
        {std::string("[1]\0", 4), std::nullopt},
        {"", std::nullopt},
    };
    for (const auto& [text, value] : rows) {
        std::string refusal;
        EXPECT_EQ(jsonToValue(text, &refusal), value) << text.substr(0, 80);
        EXPECT_EQ(refusal.empty(), value.has_value()) << text.substr(0, 80);
    }
    EXPECT_TRUE(jsonToValue(std::string(32, '[') + std::string(32, ']')));
}

// Each on the console and as an error under the framework's handle.
void expectLines(const std::vector<std::string>& lines, const char* of) {
    std::vector<std::string> expected;
    for (const std::string& line : lines)
        for (const char* destination : {"console: ", "4 "})
            expected.push_back(destination + ("Device description /etc/veltra/device.json" + line));
    EXPECT_EQ(recordedLines(), expected) << of;
}

TEST(DeviceDescription, withoutOneEachQuerySaysWhyInOneLine) {
    const TemporaryRoot root;
    const std::pair<const char*, const char*> rows[] = {
        {nullptr, " is missing or cannot be read"},
        {"[]", " is malformed: it is no object"},
        {"{\"a\": }", " is malformed: a syntax error in line 1 at byte 7"},
        {"{\n \"a\": 1\n \"b\"", " is malformed: a syntax error in line 3 at byte 4"},
        {"{\"a\": 1, \"a\": 2}", " is malformed: a key that stands twice"},
    };
    for (const auto& [contents, line] : rows) {
        if (contents)
            root.describe(contents);
        recordLog();
        EXPECT_TRUE(deviceDescription().isNothing());
        EXPECT_TRUE(deviceDescription().isNothing());
        expectLines({line, line}, line);
    }
}

TEST(DeviceDescription, itsFaultsAreSaidWhenItIsNewOrChanged) {
    const TemporaryRoot root;
    root.write("/there", "");
    root.makeDirectory("/folder");
    root.describe(R"({
        "answers": {"ChipID": {"$file": "/there", "offset": 1}, "HWModelStr": 7, "LoddenChipID": {"$data": "00"},
                    "LoddenUID": {"$file": "/missing"}, "MiravelSerialNumber": {"$file": "/there"},
                    "ScreenSerialNumbr": "S", "UniqueChipID": 1.5, "VanterUID": {"$data": "0"}},
        "componentAuth": {"mode": "kay", "key": "/missing"},
        "registry": [{"class": "A", "children": [{"clas": "B"}, 1],
                      "properties": {"AccessoryCertificate": {"$file": "/folder"}}}],
        "store": {"backend": "remote", "connectTo": {"any:1": "b:2", "other:1": 2}, "caFile": "/there",
                  "s3": {"accessKeyFile": "/there/below", "elsewhere": {"\u001b\n": 1}}},
        "vanter": {"firmware": "/missing", "done": 1},
        "\u001b\n)" +
                  std::string(100, 'x') + R"(": 1})");
    recordLog();
    EXPECT_FALSE(deviceDescription().isNothing());
    EXPECT_FALSE(deviceDescription().isNothing()); // unchanged
    expectLines(
        {": nobody reads \\u001b\\n" + std::string(62, 'x') + "...",
         R"(: answers.ChipID has a $file that is no path with nothing beside it but "as": "data" or "as": "text")",
         ": answers.HWModelStr is integer and has to be text", ": the file /missing of answers.LoddenUID is missing",
         ": answers.MiravelSerialNumber is data and has to be text",
         ": nobody reads answers.ScreenSerialNumbr; is ScreenSerialNumber meant?",
         ": answers.UniqueChipID is null or a number that is no integer of 64 bits and has to be text or integer or "
         "data",
         ": answers.VanterUID has a $data that is not pairs of hexadecimal digits alone",
         ": the file /missing of componentAuth.key is missing",
         ": componentAuth.mode is kay and has to be key, pass, fail or silent",
         ": nobody reads registry[0].children[0].clas; is class meant?",
         ": registry[0].children[1] is integer and has to be object",
         ": the file /folder of registry[0].properties.AccessoryCertificate is no regular file",
         ": store.connectTo.other:1 is integer and has to be text",
         ": the file /there/below of store.s3.accessKeyFile cannot be looked at: Not a directory",
         ": nobody reads store.s3.elsewhere"},
        "all faults");

    std::string many;
    for (int i = 0; i < 1000; ++i)
        many += (i == 0 ? "{\"" : ", \"") + std::to_string(i) + "\": 0";
    root.describe(many + "}");
    recordLog();
    (void)deviceDescription();
    ASSERT_EQ(recordedLog().size(), 21U);
    EXPECT_TRUE(recordedLog().back().ends_with(": and 980 more"));
}

TEST(DeviceDescription, describedValuesStandForDataAndFiles) {
    const TemporaryRoot root;
    root.write("/sys/uid", std::string("\x0B\xAD\0 \n", 5));
    root.write("/sys/model", std::string("M12\xFFx é \n\0\0", 12));
    root.write("/sys/blank", std::string(" \0\n", 3));
    const std::pair<const char*, Value> rows[] = {
        {R"({"$data": "0bADcafe"})", Data{0x0B, 0xAD, 0xCA, 0xFE}},
        {R"({"$data": "0bA"})", {}},
        {R"({"$data": 12})", {}},
        {R"({"$data": "00", "as": "text"})", {}},
        {R"({"$file": "/sys/uid"})", Data{0x0B, 0xAD, 0, ' ', '\n'}},
        {R"({"$file": "/sys/model", "as": "text"})", "M12\uFFFDx é"},
        {R"({"$file": "/../sys/blank", "as": "text"})", ""},
        {R"({"$file": "/sys/uid", "as": "number"})", {}},
        {R"({"$file": "/sys/uid", "offset": 1})", {}},
        {R"({"$file": 1})", {}},
        {R"([1, {"plain": {"$data": "01"}}])", Array{1, Dictionary{{"plain", Data{1}}}}},
    };
    for (const auto& [described, value] : rows) {
        const std::optional<Value> read = jsonToValue(described);
        EXPECT_EQ(resolveDescribed(*read), value) << described;
    }
}

} // namespace
