#include "Daemon/Conversions.h"

#include <optional>
#include <string>

#include <gtest/gtest.h>

#include "platform/KeyedArchive.h"

namespace {

using Data = Value::Data;
using Array = Value::Array;
using Dictionary = Value::Dictionary;

Data bytes(std::string_view text) {
    return {text.begin(), text.end()};
}

TEST(Conversions, bytesBecomeTwoLowerCaseDigitsEach) {
    EXPECT_EQ(DatatoHexString(Data{0x00, 0xAB, 0x10, 0x0F}), Value("00ab100f"));
    EXPECT_TRUE(DatatoHexString(Data{}).isNothing());
    EXPECT_TRUE(DatatoHexString({}).isNothing());
    EXPECT_TRUE(DatatoHexString("text").isNothing());
}

TEST(Conversions, pairsOfDigitsBecomeCharacters) {
    const std::pair<const char*, Value> rows[] = {
        {"", ""},
        {"4142", "AB"},
        {"414", {}},
        {" 4\t1", std::string("\x04\x01")},
        {"4g", std::string("\x04")},
        {"zz41", std::string("\0A", 2)},
        {"-1+1", std::string("\0\0", 2)},
        {"80ffE9", "\u0080\u00FF\u00E9"},
        {"é141", std::string("\0A", 2)}, // characters are counted, not bytes
    };
    for (const auto& [text, expected] : rows)
        EXPECT_EQ(stringFromHexString(text), expected) << text;
}

TEST(Conversions, pairsOfDigitsBecomeBytes) {
    const std::pair<const char*, Data> rows[] = {
        {"0x1F 2a", {0x1F, 0x2A}}, {"0X1f0x2A", {0x1F, 0x2A}}, {" 0x ", {}}, {"1g", {0x01}},
        {"\t1", {0x01}},           {"00xx", {0x00}}, // what the removal of "0x" brings together stays
        {"00Xx", {0x00}},                            // "0x" goes before "0X"
        {"0 x", {0x00}},                             // blanks go last
    };
    for (const auto& [text, expected] : rows)
        EXPECT_EQ(hexString2Binary(text), expected) << text;
}

TEST(Conversions, textThatIsNoPairsOfDigitsRaises) {
    constexpr char oddReason[] = "Text does not have 2-digit hex chars for every byte";
    constexpr char digitReason[] = "Text has illegal hexadecimal characters";
    const std::pair<const char*, const char*> rows[] = {
        {"zzz", oddReason},    {"0x1", oddReason},    {"1 ", oddReason},
        {"12g1", digitReason}, {"\t\n", digitReason}, {"éé", digitReason},
    };
    for (const auto& [text, reason] : rows) {
        try {
            hexString2Binary(text);
            ADD_FAILURE() << text;
        } catch (const ConversionFailure& failure) {
            EXPECT_EQ(failure.name(), "IllegalInput");
            EXPECT_STREQ(failure.what(), reason) << text;
        }
    }
}

// The test vectors of RFC 4648, section 10.
TEST(Conversions, base64IsPaddedAndInOneLine) {
    const std::pair<const char*, const char*> rows[] = {{"", ""},        {"f", "Zg=="},          {"fo", "Zm8="},
                                                        {"foo", "Zm9v"}, {"foobar", "Zm9vYmFy"}, {"\xFB\xFF", "+/8="}};
    for (const auto& [text, expected] : rows)
        EXPECT_EQ(base64EncodedString(bytes(text)), expected);
    constexpr std::size_t groups = 1400000;
    EXPECT_TRUE(base64EncodedString(Data(groups * 3 + 1)) == std::string(groups * 4 + 2, 'A') + "==");
}

TEST(Conversions, errorsBecomeOneTextAndOnlyNumbersAreNumbers) {
    EXPECT_EQ(stringFromLXError({"Orlo Error Domain", 0x100000001, "Gerät"}),
              "LXError domain:Orlo Error Domain, error code: 1. Description: Gerät");
    for (const Value& number : {Value(0), Value(-7), Value(false)})
        EXPECT_EQ(isLXNumber(number), number);
    for (const Value& other : {Value(), Value("1"), Value(Data{1}), Value(Array{1}), Value(Dictionary{})})
        EXPECT_TRUE(isLXNumber(other).isNothing());
}

TEST(Conversions, dictionariesBecomeArchivesWhoseReadingTellsTheConsoleWhatWasMet) {
    EXPECT_TRUE(convertDictionaryToData({}).isNothing());
    EXPECT_TRUE(convertDictionaryToData(Dictionary{{"a", Value()}}).isNothing());
    const Value dictionary = Dictionary{{"text", "x\ny"}, {"data", Data{1}}, {"texts", Array{"a", "b"}}};
    const std::string empty = "KeyedArchiveErrorDomain (1): The archive is empty\n";
    const std::string notAnArchive = "KeyedArchiveErrorDomain (2): The data is not a keyed archive\n";
    const struct {
        const char* what;
        Value data;
        std::optional<Value> object;
        std::string console;
    } rows[] = {
        {"a dictionary", convertDictionaryToData(dictionary), dictionary,
         "Unarchive Error : (null)\n"
         R"(recvDict : {"data": <01>, "text": "x\ny", "texts": ["a", "b"]})"
         "\nerr : (null)\n"},
        {"nothing", {}, Value(), ""},
        {"empty", Data{}, Value(),
         "Unarchive Error : " + empty + "Error : " + empty + "recvDict : (null)\nerr : " + empty},
        {"no archive", bytes("text"), Value(),
         "Unarchive Error : " + notAnArchive + "Error : " + notAnArchive + "recvDict : (null)\nerr : " + notAnArchive},
        {"another key", bytes("\xA1\x61k\x01"), Value(), "Unarchive Error : (null)\nrecvDict : (null)\nerr : (null)\n"},
        {"another kind", bytes("\xA1\x6DHSArchiverKey\xF6"), std::nullopt, "Unarchive Error : (null)\n"},
        {"a text that would forge lines",
         bytes("\xA1\x6DHSArchiverKey\x66"
               "a\nerr:"),
         Value("a\nerr:"), "Unarchive Error : (null)\nrecvDict : a\\nerr:\nerr : (null)\n"},
    };
    for (const auto& row : rows) {
        testing::internal::CaptureStderr();
        std::optional<Value> object;
        try {
            object = convertDataToDictionary(row.data);
        } catch (const ArchiveFailure&) { // as of an object of another kind
        }
        EXPECT_EQ(testing::internal::GetCapturedStderr(), row.console) << row.what;
        EXPECT_EQ(object, row.object) << row.what;
    }
}

} // namespace
