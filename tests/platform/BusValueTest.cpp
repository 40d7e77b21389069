#include "platform/linux/services/bus/BusValue.h"

#include <cstdint>
#include <functional>
#include <limits>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "tests/support/LooseBus.h"

namespace {

using Dictionary = Value::Dictionary;

LooseBus::Message messageWith(const std::function<int(sd_bus_message*)>& write) {
    LooseBus::Message message = LooseBus::message();
    LooseBus::require(sd_bus_message_open_container(message.get(), 'a', "{sv}"));
    LooseBus::require(write(message.get()));
    LooseBus::require(sd_bus_message_close_container(message.get()));
    LooseBus::finish(message);
    return message;
}

template <class... Arguments>
std::function<int(sd_bus_message*)> entry(const char* types, Arguments... arguments) {
    return [=](sd_bus_message* message) { return sd_bus_message_append(message, "{sv}", "k", types, arguments...); };
}

TEST(BusValue, everyTypeThatAHostMaySendBecomesItsValue) {
    const std::pair<std::function<int(sd_bus_message*)>, Value> rows[] = {
        {entry("s", "Grüße"), "Grüße"},
        {entry("o", "/a/b"), "/a/b"},
        {entry("g", "a{sv}"), "a{sv}"},
        {entry("b", 1), true},
        {entry("y", 255), 255},
        {entry("n", -1), -1},
        {entry("q", 65535), 65535},
        {entry("i", std::numeric_limits<std::int32_t>::min()), std::numeric_limits<std::int32_t>::min()},
        {entry("u", 4294967295U), 4294967295U},
        {entry("x", std::numeric_limits<std::int64_t>::min()), std::numeric_limits<std::int64_t>::min()},
        {entry("t", std::uint64_t{1} << 62), std::int64_t{1} << 62},
        {entry("ay", 3, 1, 0, 255), Value::Data{1, 0, 255}},
        {entry("as", 2, "a", "b"), Value::Array{"a", "b"}},
        {entry("av", 2, "s", "a", "b", 0), Value::Array{"a", false}},
        {entry("a{sas}", 2, "a", 1, "b", "c", 0), Dictionary{{"a", Value::Array{"b"}}, {"c", Value::Array{}}}},
        {entry("aa{sv}", 1, 1, "a", "b", 1), Value::Array{Dictionary{{"a", true}}}},
        {entry("aaay", 1, 2, 0, 1, 255), Value::Array{Value(Value::Array{Value::Data{}, Value::Data{255}})}},
    };
    for (const auto& [write, expected] : rows) {
        const LooseBus::Message message = messageWith(write);
        EXPECT_EQ(Value(bus::readDictionary(message.get())), Value(Dictionary{{"k", expected}}));
    }
}

// An array inside an array, `depth` times.
int nested(sd_bus_message* message, int depth) {
    LooseBus::require(sd_bus_message_open_container(message, 'e', "sv"));
    LooseBus::require(sd_bus_message_append_basic(message, 's', "k"));
    for (int i = 0; i < depth; ++i) {
        LooseBus::require(sd_bus_message_open_container(message, 'v', "av"));
        LooseBus::require(sd_bus_message_open_container(message, 'a', "v"));
    }
    for (int i = 0; i < 2 * depth + 1; ++i)
        LooseBus::require(sd_bus_message_close_container(message));
    return 0;
}

TEST(BusValue, whatNoValueHoldsIsRefusedWithItsKey) {
    const std::pair<std::function<int(sd_bus_message*)>, const char*> rows[] = {
        {entry("d", 1.5), "\"k\" has the D-Bus type \"d\""},
        {entry("(ss)", "a", "b"), "\"k\" has the D-Bus type \"(ss)\""},
        {entry("a{saad}", 0), "\"k\" has the D-Bus type \"a{saad}\""},
        {entry("v", "s", "a"), "\"k\" has the D-Bus type \"v\""},
        {entry("a{us}", 1, 1, "a"), "\"k\" has the D-Bus type \"a{us}\""},
        {entry("t", ~std::uint64_t{0}), "\"k\" does not fit a signed 64-bit integer"},
        {entry("a{sv}", 1, "in", "a{sv}", 1, "side", "d", 1.5), "\"k.in.side\" has the D-Bus type \"d\""},
        {[](sd_bus_message* message) { return nested(message, bus::maximumNesting); }, "\"k\" nests more than 32"},
        {[](sd_bus_message* m) { return sd_bus_message_append(m, "{sv}{sv}", "k", "b", 0, "k", "b", 0); },
         "\"k\" is given twice"},
    };
    for (const auto& [write, says] : rows) {
        const LooseBus::Message message = messageWith(write);
        try {
            bus::readDictionary(message.get());
            ADD_FAILURE() << "was accepted instead of: " << says;
        } catch (const bus::Refusal& refusal) {
            EXPECT_NE(std::string(refusal.what()).find(says), std::string::npos) << says << refusal.what();
        }
    }
    const LooseBus::Message message = messageWith([](sd_bus_message* m) { return nested(m, bus::maximumNesting - 1); });
    EXPECT_NO_THROW(bus::readDictionary(message.get()));
}

TEST(BusValue, aMessageOfVeryManyValuesIsRefused) {
    for (const bool tooMany : {false, true}) {
        const LooseBus::Message message = LooseBus::message();
        bus::appendDictionary(message.get(), {{"k", Value::Array(bus::maximumValues - 1 + tooMany, "")}});
        LooseBus::finish(message);
        if (tooMany)
            EXPECT_THROW(bus::readDictionary(message.get()), bus::Refusal);
        else
            EXPECT_NO_THROW(bus::readDictionary(message.get()));
    }
}

TEST(BusValue, nothingIsWrittenThatNestsDeeperThanABusLetsThrough) {
    Value allowed = Value::Array{}, tooDeep = Value::Array{true};
    for (int level = 1; level < 31; ++level) {
        allowed = Value::Array{allowed};
        tooDeep = Value::Array{tooDeep};
    }
    const LooseBus::Message message = LooseBus::message();
    EXPECT_NO_THROW(bus::appendDictionary(message.get(), {{"k", allowed}}));
    EXPECT_THROW(bus::appendDictionary(message.get(), {{"k", tooDeep}}), bus::Refusal);
}

TEST(BusValue, aWrittenDictionaryReadsBackButForWhatDBusCannotCarry) {
    const LooseBus::Message message = LooseBus::message();
    const Dictionary kept = {{"text", "a"}, {"data", Value::Data{0}}, {"integer", -1}, {"boolean", true}};
    Dictionary written = kept, read = kept;
    written.insert({{"bad text", std::string("a\0b\xFF", 4)},
                    {"array", Value::Array{"a", Value(), Dictionary{{"k", 1}}}},
                    {"nothing", Value()}});
    read.insert({{"bad text", "a\uFFFDb\uFFFD"}, {"array", Value::Array{"a", Dictionary{{"k", 1}}}}});
    bus::appendDictionary(message.get(), written);
    LooseBus::finish(message);
    EXPECT_EQ(Value(bus::readDictionary(message.get())), Value(read));
}

TEST(BusValue, whatABusWouldDropTheSenderOfIsNotWritten) {
    const Value::Data data(bus::maximumOctets - 5);
    const struct {
        Dictionary dictionary;
        bool isWritten;
    } rows[] = {{{{"d", data}, {"t", "abc"}}, true},
                {{{"d", data}, {"t", "abcd"}}, false},
                {{{"d", data}, {"t", "\xFF\xFF"}}, false}}; // becomes longer when it is repaired
    for (const auto& row : rows) {
        const LooseBus::Message message = LooseBus::message();
        int code = 0;
        try {
            bus::appendDictionary(message.get(), row.dictionary);
        } catch (const std::system_error& failure) {
            code = failure.code().value();
        }
        EXPECT_EQ(code, row.isWritten ? 0 : EMSGSIZE);
    }
}

} // namespace
