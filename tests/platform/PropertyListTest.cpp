#include "platform/PropertyList.h"

#include <string>

#include <gtest/gtest.h>

namespace {

using Data = Value::Data;
using Array = Value::Array;
using Dictionary = Value::Dictionary;

std::optional<Value> read(const std::string& text) {
    return propertyListToValue(Data(text.begin(), text.end()));
}

TEST(PropertyList, elementsBecomeValues) {
    const std::pair<std::string, std::optional<Value>> rows[] = {
        {"<dict><key>a</key><string>x &amp; y</string><key>b</key><array><true/><false/></array></dict>",
         Dictionary{{"a", "x & y"}, {"b", Array{true, false}}}},
        {"<integer>-9223372036854775808</integer>", std::numeric_limits<std::int64_t>::min()},
        {"<data>\n\tAKs=\n\t</data>", Data{0x00, 0xAB}},
        {"<array><real>1.5</real><date>2024-03-05T02:07:09Z</date></array>", Array{Value(), Value()}},
        {"<integer>9223372036854775808</integer>", std::nullopt},
        {"<integer>12x</integer>", std::nullopt},
        {"<data>AK==AKs=</data>", std::nullopt},
        {"<data>*Ks=</data>", std::nullopt},
        {"<dict><key>a</key></dict>", std::nullopt},
        {"<dict><key>a</key><true/><key>a</key><true/></dict>", std::nullopt},
        {"<set/>", std::nullopt},
        {"<true/><true/>", std::nullopt},
        {"<string>\xFF</string>", std::nullopt},
        {"<array>", std::nullopt},
    };
    for (const auto& [element, value] : rows)
        EXPECT_EQ(read("<?xml version=\"1.0\"?><plist version=\"1.0\">" + element + "</plist>"), value) << element;
    EXPECT_FALSE(read("<dict/>"));
}

TEST(PropertyList, deepNestingAndEntitiesAreHarmless) {
    std::string starts = "<plist>", ends;
    for (int level = 0; level < 100000; ++level) {
        starts += "<array>";
        ends += "</array>";
    }
    EXPECT_FALSE(read(starts + ends + "</plist>"));
    EXPECT_EQ(read("<!DOCTYPE plist [<!ENTITY file SYSTEM \"/etc/passwd\">]><plist><string>&file;</string></plist>"),
              Value("&file;"));
}

} // namespace
