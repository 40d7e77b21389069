// Values on D-Bus: how a Value travels in a message, and which bus is meant.
//
//   text  s        data  ay       integer  x       boolean  b       array  av       dictionary  a{sv}
//
// On the way in every integer type that fits 64 signed bits is an integer, `o` and `g` are texts, and arrays and
// dictionaries with text keys may be of any one of these types, as `as` and `a{sas}` are. Nothing else is a Value.
#ifndef VELTRA_PLATFORM_LINUX_BUS_VALUE_H
#define VELTRA_PLATFORM_LINUX_BUS_VALUE_H

#include <cstddef>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>

#include <systemd/sd-bus.h>

#include "platform/Value.h"

namespace bus {

// How deep arrays and dictionaries may nest in a message, its own dictionary included.
constexpr int maximumNesting = 32;

// How many values one message may hold in all. A Value takes more memory than it does in a message; this keeps the
// growth in proportion while it is far above what any command needs.
constexpr std::size_t maximumValues = 100'000;

// How many octets the texts and data of one written message may have in all. A system bus takes messages of up to 32
// MiB and drops a client that sends more; what is left is for the lengths and types around the values.
constexpr std::size_t maximumOctets = std::size_t{28} << 20;

// Raised for a message that holds what no Value can. The sentence names the key.
using Refusal = std::invalid_argument;

// Passes a result of libsystemd on, or raises what a negative one, a negative errno, stands for: std::bad_alloc for
// -ENOMEM, otherwise a std::system_error.
int check(int result);

// The words for such a result.
std::string reasonOf(int result);

// Reads the a{sv} that stands next in `message`. Raises Refusal, and as check. *octets is about what it takes in the
// message, never less than its texts and data.
Value::Dictionary readDictionary(sd_bus_message* message, std::size_t* octets = nullptr);

// Appends `text` as s, with U+FFFD in place of what is no UTF-8 and of each NUL, which D-Bus cannot carry. Raises as
// check, for -EMSGSIZE for more than a message holds.
void appendText(sd_bus_message* message, std::string_view text);

// Appends `dictionary` as a{sv}, with its texts as above; entries of nothing are left out. Raises Refusal for what
// nests deeper than a message can, and as appendText.
void appendDictionary(sd_bus_message* message, const Value::Dictionary& dictionary);

// The same with entries in their order, none of which is copied.
void appendEntries(sd_bus_message* message, Value::BorrowedEntries entries);

// Opens the bus that `which` names: "system", "session" or a D-Bus address. Returns a negative errno on failure; on
// success *connection belongs to the caller.
int open(std::string_view which, sd_bus** connection);

} // namespace bus

#endif
