#include "platform/linux/services/bus/BusValue.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <limits>
#include <new>
#include <system_error>
#include <utility>
#include <vector>

#include "platform/Utf8.h"

namespace bus {

int check(int result) {
    if (result == -ENOMEM)
        throw std::bad_alloc();
    if (result < 0)
        throw std::system_error(-result, std::generic_category());
    return result;
}

std::string reasonOf(int result) {
    return std::generic_category().message(-result);
}

namespace {

// Whether a value can be of the D-Bus type `type`, one complete type.
bool isValueType(std::string_view type, bool isInContainer = false) {
    if (type == "v")
        return isInContainer;
    if (type.starts_with("a{s"))
        return isValueType(type.substr(3, type.size() - 4), true);
    if (type.starts_with("a"))
        return isValueType(type.substr(1), true);
    return type.size() == 1 && std::string_view("sogbynqiuxt").find(type[0]) != std::string_view::npos;
}

// Reads the values of one message, and keeps the names of the keys that lead to the one in hand for a refusal.
class Reader {
public:
    explicit Reader(sd_bus_message* message) : message_(message) {}

    // The dictionary that stands next, whose entries are of the type `entry`: "s" and that of the values.
    Value::Dictionary dictionary(const std::string& entry) {
        const Level level(*this);
        Value::Dictionary result;
        check(sd_bus_message_enter_container(message_, SD_BUS_TYPE_ARRAY, ("{" + entry + "}").c_str()));
        while (check(sd_bus_message_enter_container(message_, SD_BUS_TYPE_DICT_ENTRY, entry.c_str())) > 0) {
            std::string key = string(SD_BUS_TYPE_STRING);
            path_.push_back(key);
            if (result.contains(key))
                refuse("is given twice");
            result.emplace(std::move(key), value(entry.substr(1)));
            path_.pop_back();
            check(sd_bus_message_exit_container(message_));
        }
        check(sd_bus_message_exit_container(message_));
        return result;
    }

    // About how many octets of the message have been read.
    std::size_t octets() const { return octets_ + values_ * octetsAroundValue; }

private:
    // One more array or dictionary around the value in hand.
    class Level {
    public:
        explicit Level(Reader& reader) : reader_(reader) {
            if (++reader_.nesting_ > maximumNesting)
                reader_.refuse("nests more than " + std::to_string(maximumNesting) + " arrays and dictionaries");
        }
        ~Level() { --reader_.nesting_; }
        Level(const Level&) = delete;
        Level& operator=(const Level&) = delete;

    private:
        Reader& reader_;
    };

    [[noreturn]] void refuse(const std::string& why) const {
        std::string key;
        for (const std::string& step : path_)
            key += (key.empty() ? "" : ".") + step;
        throw Refusal(key.empty() ? "The request " + why + "." : "The value of key \"" + key + "\" " + why + ".");
    }

    void count() {
        if (++values_ > maximumValues)
            refuse("brings the message to more than " + std::to_string(maximumValues) + " values");
    }

    // The value of a type that isValueType lets through.
    Value value(const std::string& type) {
        if (type == "v")
            return variant();
        count();
        if (type == "ay")
            return bytes();
        if (type.starts_with("a{"))
            return dictionary(type.substr(2, type.size() - 3));
        if (type.starts_with("a"))
            return array(type.substr(1));
        return basic(type[0]);
    }

    Value variant() {
        const char* contents = nullptr;
        check(sd_bus_message_peek_type(message_, nullptr, &contents));
        const std::string type = contents ? contents : "";
        if (!isValueType(type))
            refuse("has the D-Bus type \"" + type + "\", which a request cannot carry");
        octets_ += type.size();
        check(sd_bus_message_enter_container(message_, SD_BUS_TYPE_VARIANT, type.c_str()));
        Value content = value(type);
        check(sd_bus_message_exit_container(message_));
        return content;
    }

    Value bytes() {
        const void* data = nullptr;
        std::size_t length = 0;
        check(sd_bus_message_read_array(message_, SD_BUS_TYPE_BYTE, &data, &length));
        octets_ += length;
        const auto* first = static_cast<const std::uint8_t*>(data);
        return Value::Data(first, first + length);
    }

    Value array(const std::string& element) {
        const Level level(*this);
        Value::Array result;
        check(sd_bus_message_enter_container(message_, SD_BUS_TYPE_ARRAY, element.c_str()));
        while (check(sd_bus_message_at_end(message_, 0)) == 0)
            result.push_back(value(element));
        check(sd_bus_message_exit_container(message_));
        return result;
    }

    Value basic(char type) {
        switch (type) {
        case SD_BUS_TYPE_BOOLEAN:
            return number<int>(type) != 0;
        case SD_BUS_TYPE_BYTE:
            return number<std::uint8_t>(type);
        case SD_BUS_TYPE_INT16:
            return number<std::int16_t>(type);
        case SD_BUS_TYPE_UINT16:
            return number<std::uint16_t>(type);
        case SD_BUS_TYPE_INT32:
            return number<std::int32_t>(type);
        case SD_BUS_TYPE_UINT32:
            return number<std::uint32_t>(type);
        case SD_BUS_TYPE_INT64:
            return number<std::int64_t>(type);
        case SD_BUS_TYPE_UINT64: {
            const auto value = number<std::uint64_t>(type);
            if (value > std::uint64_t{std::numeric_limits<std::int64_t>::max()})
                refuse("does not fit a signed 64-bit integer");
            return value;
        }
        default:
            return string(type);
        }
    }

    template <class Number>
    Number number(char type) {
        Number value = 0;
        check(sd_bus_message_read_basic(message_, type, &value));
        return value;
    }

    std::string string(char type) {
        const char* characters = nullptr;
        check(sd_bus_message_read_basic(message_, type, &characters));
        std::string text = characters;
        octets_ += text.size();
        return text;
    }

    // The most that lengths, types and alignment take beside a value and its key.
    static constexpr std::size_t octetsAroundValue = 32;

    sd_bus_message* message_;
    std::vector<std::string> path_;
    int nesting_ = 0;
    std::size_t values_ = 0;
    std::size_t octets_ = 0; // of texts, data and types
};

const char* signatureOf(const Value& value) {
    if (value.text())
        return "s";
    if (value.data())
        return "ay";
    if (value.array())
        return "av";
    if (value.dictionary())
        return "a{sv}";
    return value.isBoolean() ? "b" : "x";
}

// Writes values to one message.
class Writer {
public:
    explicit Writer(sd_bus_message* message) : message_(message) {}

    void dictionary(const Value::Dictionary& dictionary) {
        open(SD_BUS_TYPE_ARRAY, "{sv}");
        for (const auto& [key, value] : dictionary)
            entry(key, value);
        close();
    }

    void dictionary(Value::BorrowedEntries entries) {
        open(SD_BUS_TYPE_ARRAY, "{sv}");
        for (const auto& [key, value] : entries)
            entry(key, *value);
        close();
    }

    void text(std::string_view text) {
        count(text.size());
        const std::string repaired = utf8::repaired(text);
        std::string carried;
        for (std::size_t start = 0, end = 0; end < repaired.size(); start = end + 1) {
            end = std::min(repaired.find('\0', start), repaired.size());
            carried.append(repaired, start, end - start);
            if (end < repaired.size())
                carried += "\uFFFD";
        }
        count(carried.size() - text.size()); // what takes the place of a bad sequence is never shorter
        check(sd_bus_message_append_basic(message_, SD_BUS_TYPE_STRING, carried.c_str()));
    }

private:
    void open(char type, const char* contents) {
        if (++containers_ > maximumContainers)
            throw Refusal("The values nest deeper than a D-Bus message can.");
        check(sd_bus_message_open_container(message_, type, contents));
    }

    void close() {
        check(sd_bus_message_close_container(message_));
        --containers_;
    }

    // Raises when the message would grow beyond what a bus carries, before anything that long is copied.
    void count(std::size_t octets) {
        if (octets > maximumOctets - octets_)
            check(-EMSGSIZE);
        octets_ += octets;
    }

    void entry(std::string_view key, const Value& value) {
        if (value.isNothing())
            return;
        open(SD_BUS_TYPE_DICT_ENTRY, "sv");
        text(key);
        variant(value);
        close();
    }

    void bytes(const Value::Data& data) {
        count(data.size());
        check(sd_bus_message_append_array(message_, SD_BUS_TYPE_BYTE, data.data(), data.size()));
    }

    void array(const Value::Array& array) {
        open(SD_BUS_TYPE_ARRAY, "v");
        for (const Value& element : array)
            if (!element.isNothing())
                variant(element);
        close();
    }

    void variant(const Value& value) {
        open(SD_BUS_TYPE_VARIANT, signatureOf(value));
        if (value.text())
            text(*value.text());
        else if (const Value::Data* data = value.data())
            bytes(*data);
        else if (value.array())
            array(*value.array());
        else if (value.dictionary())
            dictionary(*value.dictionary());
        else if (value.isBoolean())
            number<int>(SD_BUS_TYPE_BOOLEAN, *value.boolean());
        else
            number<std::int64_t>(SD_BUS_TYPE_INT64, *value.integer());
        close();
    }

    template <class Number>
    void number(char type, Number number) {
        check(sd_bus_message_append_basic(message_, type, &number));
    }

    // What the reference implementation of the bus lets through; it drops a client that sends more.
    static constexpr int maximumContainers = 64;

    sd_bus_message* message_;
    int containers_ = 0;
    std::size_t octets_ = 0; // of texts and data
};

} // namespace

Value::Dictionary readDictionary(sd_bus_message* message, std::size_t* octets) {
    Reader reader(message);
    Value::Dictionary result = reader.dictionary("sv");
    if (octets)
        *octets = reader.octets();
    return result;
}

void appendText(sd_bus_message* message, std::string_view text) {
    Writer(message).text(text);
}

void appendDictionary(sd_bus_message* message, const Value::Dictionary& dictionary) {
    Writer(message).dictionary(dictionary);
}

void appendEntries(sd_bus_message* message, Value::BorrowedEntries entries) {
    Writer(message).dictionary(entries);
}

int open(std::string_view which, sd_bus** connection) {
    if (which == "system")
        return sd_bus_open_system(connection);
    if (which == "session")
        return sd_bus_open_user(connection);
    sd_bus* opened = nullptr;
    int result = sd_bus_new(&opened);
    if (result >= 0)
        result = sd_bus_set_address(opened, std::string(which).c_str());
    if (result >= 0)
        result = sd_bus_set_bus_client(opened, 1);
    if (result >= 0)
        result = sd_bus_start(opened);
    if (result < 0)
        opened = sd_bus_close_unref(opened);
    *connection = opened;
    return result;
}

} // namespace bus
