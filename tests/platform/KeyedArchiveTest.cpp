#include "platform/KeyedArchive.h"

#include <limits>
#include <string>

#include <gtest/gtest.h>

#include "tests/support/OwnProcess.h"

namespace {

using Data = Value::Data;
using Array = Value::Array;
using Dictionary = Value::Dictionary;

Value nested(std::size_t levels) {
    Value value = 1;
    for (std::size_t i = 0; i < levels; ++i) {
        Array around; // a list in braces would copy the graph
        around.push_back(std::move(value));
        value = std::move(around);
    }
    return value;
}

Data bytes(std::string_view text) {
    return {text.begin(), text.end()};
}

// An archive of one entry "k" whose value is encoded as `value`.
Data archiveOf(const std::string& value) {
    return bytes("\xA1\x61k" + value);
}

Value decode(const Data& archive) {
    std::optional<Error> error;
    const std::optional<ArchiveDecoder> decoder = ArchiveDecoder::create(archive, &error);
    EXPECT_TRUE(decoder && !error);
    return decoder ? decoder->decode("k") : Value();
}

TEST(KeyedArchive, isOneMapOfCBORAndEveryGraphOfTheFiveKindsComesBackEqual) {
    EXPECT_EQ(archiveEncode("k", Array{-1, true, "t", Data{0xFF}}), archiveOf("\x84\x20\xF5\x61t\x41\xFF"));
    const Value roots[] = {
        Dictionary{},
        Dictionary{{"", Array{}}, {"text", ""}, {"data", Data{}}},
        Dictionary{{"numbers", Array{std::numeric_limits<std::int64_t>::min(), -1, 0, 23, 24, 255, 256, 65536,
                                     std::numeric_limits<std::int64_t>::max(), true, false}}},
        Dictionary{{"text", std::string("é\0機", 6)}, {"long", std::string(70000, 't')}, {"data", Data(70000, 0x7F)}},
        nested(31),
    };
    for (const Value& root : roots)
        EXPECT_TRUE(decode(archiveEncode("k", root)) == root) << root.description();
    EXPECT_TRUE(decode(archiveEncode("another key", 1)).isNothing());
}

TEST(KeyedArchive, graphsThatCouldNotBeDecodedAreNotEncoded) {
    const Value roots[] = {Dictionary{{"a", Array{Value()}}}, "\xFF", nested(32)};
    for (const Value& root : roots)
        EXPECT_THROW(archiveEncode("k", root), ArchiveFailure) << root.description();

    inOwnProcess([] { // which ends without taking such a graph apart
        static const Value bottomless = nested(1 << 17);
        EXPECT_THROW(archiveEncode("k", bottomless), ArchiveFailure);
    });
}

TEST(KeyedArchive, whatNoArchiveHoldsIsADecodingFailure) {
    using namespace std::string_literals;
    const std::pair<const char*, std::string> rows[] = {
        {"double that would spell true", "\xFB\x00\x00\x00\x00\x00\x00\x00\x15"s},
        {"null", "\xF6"},
        {"simple value of two octets", "\xF8\x15"},
        {"tag", "\xC1\x01"},
        {"negative beyond 63 bits", "\x3B\x80\x00\x00\x00\x00\x00\x00\x00"s},
        {"text that is no UTF-8", "\x61\xFF"},
        {"key that is no text", "\xA1\x01\x01"},
        {"key twice", "\xA2\x61"
                      "a\x01\x61"
                      "a\x02"},
        {"indefinite texts inside each other", std::string(1 << 20, '\x7F')},
        {"one array too many", std::string(32, '\x81') + "\x01"},
        {"array longer than memory", "\x9B\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\x01"s},
        {"map whose doubled count wraps", "\xBB\x80\x00\x00\x00\x00\x00\x00\x00"s},
        {"text longer than the archive", "\x62t"},
        {"more values than a million", "\x9A\x00\x10\x00\x00"s + std::string(1 << 20, '\x01')},
        {"cut length", "\x19\x01"},
        {"nothing at all", ""},
        {"octets behind the archive", "\x01\x01"s},
    };
    for (const auto& [what, value] : rows)
        EXPECT_THROW(decode(archiveOf(value)), ArchiveFailure) << what;
}

} // namespace
