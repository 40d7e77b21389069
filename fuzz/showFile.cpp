// Any octets to the offline readers. A report is ok exactly when it names no problem, it can be printed, in memory in
// proportion to the file, and the Img4 reader finds the cause of every refusal of the decoder by itself.
#include <ostream>
#include <streambuf>
#include <string>

#include "fuzz/Fuzz.h"
#include "fuzz/Growth.h"
#include "img4/Img4.h"
#include "tools/orloctl/ShowFile.h"

namespace {

class Nowhere : public std::streambuf {
    int_type overflow(int_type character) override { return character; }
    std::streamsize xsputn(const char*, std::streamsize count) override { return count; }
};

void print(const Report& report) {
    Nowhere nowhere;
    std::ostream out(&nowhere);
    writeJson(out, report);
    writeText(out, report);
}

void check(const Report& report, std::size_t size) {
    FUZZ_REQUIRE(report.ok() == report.problem.empty());
    FUZZ_REQUIRE(report.ok() || report.json["problemOffset"] <= size);
    print(report);
}

bool isTaken(const std::uint8_t* data, std::size_t size) {
    Img4Record record;
    return Img4DecodeInit(data, size, &record) == DERSuccess ||
           Img4DecodeInitPayload(data, size, &record) == DERSuccess ||
           Img4DecodeInitManifest(data, size, &record) == DERSuccess ||
           Img4DecodeInitUnsignedManifest(data, size, &record) == DERSuccess;
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    constexpr std::size_t base = std::size_t{4} << 20; // what the text is bounded by
    constexpr std::size_t perOctet = 100;
    requireProportion(size, base, perOctet, [&] {
        const Report blob = showBcfg(Value::Data(data, data + size), {});
        FUZZ_REQUIRE(blob.ok() == blob.problem.empty());
        print(blob);
    });
    requireProportion(size, base, perOctet, [&] { print(showDer({data, size})); });
    requireProportion(size, base, perOctet, [&] { print(showImg4({data, size})); });
    check(showDer({data, size}), size);
    const Report report = showImg4({data, size});
    check(report, size);
    FUZZ_REQUIRE(report.problem.find("The decoder refuses") == std::string::npos);
    FUZZ_REQUIRE(!report.ok() || isTaken(data, size));
    return 0;
}
