// Bus argument mapping: a message is written as the input says, with any types at any depth, and read as a request. It
// must be refused or become a dictionary that survives being written and read once more.
#include "platform/linux/services/bus/BusValue.h"

#include <cstdint>
#include <cstdlib>

#include "tests/support/LooseBus.h"

namespace {

class Input {
public:
    Input(const std::uint8_t* data, std::size_t size) : next_(data), end_(data + size) {}
    bool empty() const { return next_ == end_; }
    std::uint8_t byte() { return empty() ? 0 : *next_++; }
    std::uint64_t word() {
        std::uint64_t value = 0;
        for (int i = 0; i < 8; ++i)
            value = value << 8 | byte();
        return value;
    }

private:
    const std::uint8_t* next_;
    const std::uint8_t* end_;
};

constexpr const char* types[] = {"s",     "b",    "y", "n",  "q",   "i",      "u",   "x",
                                 "t",     "d",    "o", "g",  "ay",  "as",     "av",  "a{sv}",
                                 "a{ss}", "(sv)", "v", "ai", "aay", "a{sas}", "aab", "a{us}"};

// Writes one complete value of the type `type`.
void writeValue(sd_bus_message* message, const std::string& type, Input& input, int depth) {
    const auto isDone = [](int result) { LooseBus::require(result); };
    const std::string inner = type.substr(1, type.size() - 2); // of an entry or a structure
    const char* texts[] = {"", "k", "Gr\xC3\xBC\xC3\x9F"};
    switch (type[0]) {
    case 's':
        return isDone(sd_bus_message_append_basic(message, 's', texts[input.word() % 3]));
    case 'o':
        return isDone(sd_bus_message_append_basic(message, 'o', "/a"));
    case 'g':
        return isDone(sd_bus_message_append_basic(message, 'g', "a{sv}"));
    case 'b': {
        const int truth = input.word() & 1;
        return isDone(sd_bus_message_append_basic(message, 'b', &truth));
    }
    case 'v': {
        const std::string content = depth > 36 ? "b" : types[input.byte() % (sizeof types / sizeof types[0])];
        isDone(sd_bus_message_open_container(message, 'v', content.c_str()));
        writeValue(message, content, input, depth + 1);
        break;
    }
    case 'a':
        isDone(sd_bus_message_open_container(message, 'a', type.c_str() + 1));
        for (int i = input.byte() % 4; i > 0 && !input.empty(); --i)
            writeValue(message, type.substr(1), input, depth + 1);
        break;
    case '(':
    case '{':
        isDone(sd_bus_message_open_container(message, type[0] == '{' ? 'e' : 'r', inner.c_str()));
        writeValue(message, inner.substr(0, 1), input, depth);
        writeValue(message, inner.substr(1), input, depth);
        break;
    default: {
        const std::uint64_t word = input.word();
        return isDone(sd_bus_message_append_basic(message, type[0], &word));
    }
    }
    isDone(sd_bus_message_close_container(message));
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    Input input(data, size);
    const LooseBus::Message message = LooseBus::message();
    writeValue(message.get(), "a{sv}", input, 0);
    LooseBus::finish(message);

    Value::Dictionary read;
    try {
        read = bus::readDictionary(message.get());
    } catch (const bus::Refusal&) {
        return 0;
    }
    const LooseBus::Message again = LooseBus::message();
    try {
        bus::appendDictionary(again.get(), read);
    } catch (const bus::Refusal&) {
        return 0; // read from a message that no bus would have carried
    }
    LooseBus::finish(again);
    if (Value(bus::readDictionary(again.get())) != Value(read))
        std::abort();
    return 0;
}
