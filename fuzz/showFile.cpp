// Any octets to the offline readers of DER and Img4 files. A report is ok exactly when it names no problem, it can be
// printed, and the Img4 reader finds the cause of every refusal of the decoder by itself.
#include <string>

#include "fuzz/Fuzz.h"
#include "img4/Img4.h"
#include "tools/orloctl/ShowDer.h"
#include "tools/orloctl/ShowImg4.h"

namespace {

void check(const Report& report, std::size_t size) {
    FUZZ_REQUIRE(report.ok == report.problem.empty());
    FUZZ_REQUIRE(report.ok || report.json["problemOffset"] <= size);
    FUZZ_REQUIRE(!report.json.dump().empty());
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
    check(showDer(data, size), size);
    const Report report = showImg4(data, size);
    check(report, size);
    FUZZ_REQUIRE(report.problem.find("The decoder refuses") == std::string::npos);
    FUZZ_REQUIRE(!report.ok || isTaken(data, size));
    return 0;
}
