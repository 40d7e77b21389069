// Bus argument mapping: a message is written as the input says, with any types at any depth, and read as a request. It
// must be refused or become a dictionary that survives being written and read once more.
#include "platform/linux/services/bus/BusValue.h"

#include "fuzz/Fuzz.h"
#include "tests/support/LooseBus.h"

namespace {

using fuzz::Input;

constexpr const char* types[] = {"s",     "b",    "y", "n",  "q",   "i",      "u",   "x",
                                 "t",     "d",    "o", "g",  "ay",  "as",     "av",  "a{sv}",
                                 "a{ss}", "(sv)", "v", "ai", "aay", "a{sas}", "aab", "a{us}"};

// Writes one complete value of the type `type`.
void writeValue(sd_bus_message* message, const std::string& type, Input& input, int depth) {
    constexpr const char* texts[] = {"", "k", "Gr\xC3\xBC\xC3\x9F"};
    const auto isDone = [](int result) { LooseBus::require(result); };
    const std::string inner = type.substr(1, type.size() - 2); // of an entry or a structure
    switch (type[0]) {
    case 's':
    case 'o':
    case 'g': {
        const char* text = type == "o" ? "/a" : type == "g" ? "a{sv}" : texts[input.word() % 3];
        return isDone(sd_bus_message_append_basic(message, type[0], text));
    }
    case 'v': {
        const std::string content = depth > 36 ? "b" : types[input.octet() % std::size(types)];
        isDone(sd_bus_message_open_container(message, 'v', content.c_str()));
        writeValue(message, content, input, depth + 1);
        break;
    }
    case 'a':
        isDone(sd_bus_message_open_container(message, 'a', type.c_str() + 1));
        for (int i = input.octet() % 4; i > 0 && !input.left.empty(); --i)
            writeValue(message, type.substr(1), input, depth + 1);
        break;
    case '(':
    case '{':
        isDone(sd_bus_message_open_container(message, type[0] == '{' ? 'e' : 'r', inner.c_str()));
        writeValue(message, inner.substr(0, 1), input, depth);
        writeValue(message, inner.substr(1), input, depth);
        break;
    default: {
        const std::uint64_t word = input.word() & (type == "b" ? 1 : UINT64_MAX);
        return isDone(sd_bus_message_append_basic(message, type[0], &word));
    }
    }
    isDone(sd_bus_message_close_container(message));
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    Input input{{data, size}};
    const LooseBus::Message message = LooseBus::message(), again = LooseBus::message();
    writeValue(message.get(), "a{sv}", input, 0);
    LooseBus::finish(message);

    Value::Dictionary read;
    try {
        read = bus::readDictionary(message.get());
        bus::appendDictionary(again.get(), read);
    } catch (const bus::Refusal&) {
        return 0; // also of a dictionary that was read from a message that no bus would have carried
    }
    LooseBus::finish(again);
    FUZZ_REQUIRE(Value(bus::readDictionary(again.get())) == Value(read));
    return 0;
}
