// Any octets to the offline readers. A report is ok exactly when it names no problem, and it can be printed, in memory
// in proportion to the file.
#include <ostream>
#include <streambuf>
#include <string>

#include "fuzz/Fuzz.h"
#include "fuzz/Growth.h"
#include "tools/orloctl/ShowFile.h"

namespace {

class Nowhere : public std::streambuf {
    int_type overflow(int_type character) override { return character; }
    std::streamsize xsputn(const char*, std::streamsize count) override { return count; }
};

void check(const Report& report, std::size_t size) {
    FUZZ_REQUIRE(report.ok() == report.problem.empty());
    FUZZ_REQUIRE(report.ok() || report.json["problemOffset"] <= size);
    Nowhere nowhere;
    std::ostream out(&nowhere);
    writeJson(out, report);
    writeText(out, report);
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    constexpr std::size_t base = std::size_t{4} << 20; // what the text is bounded by
    constexpr std::size_t perOctet = 100;
    requireProportion(size, base, perOctet, [&] { check(showBcfg(Value::Data(data, data + size), {}), size); });
    requireProportion(size, base, perOctet, [&] { check(showDer({data, size}), size); });
    requireProportion(size, base, perOctet, [&] { check(showImg4({data, size}), size); });
    return 0;
}
