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

constexpr const char* types[] = {"s", "b",  "y",  "n",  "q",     "i",     "u",    "x", "t",  "d",  "o",
                                 "g", "ay", "as", "av", "a{sv}", "a{ss}", "(sv)", "v", "ai", "aay"};

void writeEntries(sd_bus_message* message, Input& input, int depth);

void writeVariant(sd_bus_message* message, Input& input, int depth);

// Writes one complete value of the first type in `type`.
void writeValue(sd_bus_message* message, const std::string& type, Input& input, int depth) {
    using Bus = LooseBus;
    const std::uint64_t word = input.word();
    const char* text = word % 3 == 0   ? ""
                       : word % 3 == 1 ? "k"
                                       : "Gr\xC3\xBC\xC3\x9F"
                                         "e";
    if (type == "s") {
        Bus::require(sd_bus_message_append_basic(message, 's', text));
    } else if (type == "o") {
        Bus::require(sd_bus_message_append_basic(message, 'o', "/a"));
    } else if (type == "g") {
        Bus::require(sd_bus_message_append_basic(message, 'g', "a{sv}"));
    } else if (type == "b") {
        const int truth = word & 1;
        Bus::require(sd_bus_message_append_basic(message, 'b', &truth));
    } else if (type == "v") {
        writeVariant(message, input, depth + 1);
    } else if (type == "a{sv}") {
        writeEntries(message, input, depth + 1);
    } else if (type[0] == 'a') {
        Bus::require(sd_bus_message_open_container(message, 'a', type.c_str() + 1));
        for (int i = input.byte() % 4; i > 0; --i) {
            if (type == "a{ss}")
                Bus::require(sd_bus_message_append(message, "{ss}", i % 2 ? "a" : text, "b"));
            else
                writeValue(message, type.substr(1), input, depth + 1);
        }
        Bus::require(sd_bus_message_close_container(message));
    } else if (type[0] == '(') {
        Bus::require(sd_bus_message_append(message, "(sv)", text, "s", text));
    } else {
        Bus::require(sd_bus_message_append_basic(message, type[0], &word));
    }
}

void writeVariant(sd_bus_message* message, Input& input, int depth) {
    const std::size_t count = sizeof types / sizeof types[0];
    const std::string type = depth > 36 ? "b" : types[input.byte() % count];
    LooseBus::require(sd_bus_message_open_container(message, 'v', type.c_str()));
    writeValue(message, type, input, depth);
    LooseBus::require(sd_bus_message_close_container(message));
}

void writeEntries(sd_bus_message* message, Input& input, int depth) {
    LooseBus::require(sd_bus_message_open_container(message, 'a', "{sv}"));
    for (int i = input.byte() % 4; i > 0 && !input.empty(); --i) {
        LooseBus::require(sd_bus_message_open_container(message, 'e', "sv"));
        LooseBus::require(sd_bus_message_append_basic(message, 's', std::to_string(input.byte() % 8).c_str()));
        writeVariant(message, input, depth);
        LooseBus::require(sd_bus_message_close_container(message));
    }
    LooseBus::require(sd_bus_message_close_container(message));
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    static LooseBus looseBus;
    Input input(data, size);
    const LooseBus::Message message = looseBus.message();
    writeEntries(message.get(), input, 0);
    LooseBus::finish(message);

    Value::Dictionary read;
    try {
        read = bus::readDictionary(message.get());
    } catch (const bus::Refusal&) {
        return 0;
    }
    const LooseBus::Message again = looseBus.message();
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
