// A hostile format reads nothing but its arguments and grows no further than they do, and in a log arguments begin no
// lines. The input is the format; its first byte chooses the arguments.
#include <algorithm>
#include <string_view>

#include "fuzz/Fuzz.h"
#include "platform/Format.h"
#include "platform/Utf8.h"

namespace {

const Value nothing, yes = true, bytes = Value::Data(100, 0xAB), words = "http://a:b@c\n\x1B\n",
                     entries = Value::Dictionary{{"a", Value::Array{1, "b\n"}}};
const Error problem{"D\n", 7, "text\n"};
const FormatArgument choices[] = {
    nullptr,
    "text",
    nothing,
    yes,
    bytes,
    words,
    entries,
    problem,
    std::int64_t{-1},
    0xFFFFFFFFU,
    static_cast<const void*>(choices),
};
constexpr std::size_t count = std::size(choices);

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    if (size == 0)
        return 0;
    const std::string_view text(reinterpret_cast<const char*>(data + 1), size - 1);
    const std::size_t chosen = data[0];
    const auto arguments = {choices[chosen % count], choices[chosen / 7 % count], choices[chosen / 31 % count]};
    const std::string out = format(text, arguments);
    // Each argument is far below 512 characters, each missing one three times as long as the shortest conversion.
    FUZZ_REQUIRE(out.size() <= 3 * (512 + text.size()));
    FUZZ_REQUIRE(text.find('%') != std::string_view::npos || out == text);
    // Nothing but the format begins lines in a log.
    const std::string logged = formatForLog(text, arguments), line = utf8::quoted(out);
    FUZZ_REQUIRE(std::ranges::count(logged, '\n') <= std::ranges::count(text, '\n') + 1);
    FUZZ_REQUIRE(line.find('\n') == std::string::npos && utf8::isValid(line) && utf8::isValid(utf8::repaired(out)));
    return 0;
}
