// Any octets to `verify img4`, under profiles that accept every signature, so that the words behind it are reached. The
// verdict is the decoder's, the cause of every refusal is found, and what is printed stays within its lines.
#include <algorithm>
#include <sstream>
#include <string>

#include "fuzz/Fuzz.h"
#include "tools/orloctl/VerifyImg4.h"

namespace {

DERReturn acceptSignature(const DERItem*, const DERItem*, const std::uint8_t*, std::uint64_t, const Img4TrustProfile*) {
    return DERSuccess;
}

DERReturn agree(DERTag, const Img4PropertyValue*, std::uint32_t, void*) {
    return DERSuccess;
}

TrustDomain credulousDomain() {
    TrustDomain domain = builtInTrustDomain(std::nullopt);
    for (DomainProfile& profile : domain.profiles)
        profile.made.profile.verifySignature = acceptSignature;
    return domain;
}

bool isTrusted(const DERItem& file, const TrustDomain& domain, std::optional<std::uint32_t> object) {
    Img4Record record;
    if (Img4DecodeInit(file.data, file.length, &record) != DERSuccess &&
        Img4DecodeInitManifest(file.data, file.length, &record) != DERSuccess)
        return false;
    const Img4TrustCallbacks callbacks = {agree, nullptr, nullptr};
    return std::any_of(domain.profiles.begin(), domain.profiles.end(), [&](const DomainProfile& profile) {
        Img4Record evaluated = record;
        Img4TrustRefusal refusal;
        return Img4DecodePerformTrustEvaluationExplained(object ? &*object : nullptr, &evaluated, &callbacks,
                                                         &profile.made.profile, nullptr, &refusal) == DERSuccess;
    });
}

bool isPrintable(char character) {
    return character == '\n' || (character >= 0x20 && character <= 0x7E);
}

bool hasConstraint(const Report& report, const char* state) {
    for (const auto& constraint : report.json.value("constraints", nlohmann::ordered_json::array()))
        if (constraint["state"] == state)
            return true;
    return false;
}

// Names in a chain can say anything.
bool isExplained(const std::string& problem, const std::string& step) {
    if (step == "chain")
        return !problem.starts_with("The chain cannot be verified");
    for (const char* words : {"cannot be decoded", "cannot be judged", "cannot be computed"})
        if (problem.find(words) != std::string::npos)
            return false;
    return true;
}

void check(const DERItem& file, const TrustDomain& domain, std::optional<std::uint32_t> object) {
    const Report report = verifyImg4(file, domain, {object, std::nullopt});
    FUZZ_REQUIRE(report.ok() == isTrusted(file, domain, object));
    FUZZ_REQUIRE(report.ok() == report.problem.empty());
    FUZZ_REQUIRE(report.ok() || report.json["problemOffset"] <= file.length);
    std::ostringstream printed;
    std::ostringstream lines;
    writeJson(printed, report);
    writeText(lines, report);
    for (const std::string& text : {lines.str(), report.problem})
        FUZZ_REQUIRE(std::all_of(text.begin(), text.end(), isPrintable));
    const std::string step = report.json.value("failedStep", "");
    FUZZ_REQUIRE(isExplained(report.problem, step));
    FUZZ_REQUIRE(!report.ok() || !hasConstraint(report, "broken"));
    FUZZ_REQUIRE(step != "constraints" || !report.json.contains("constraints") || hasConstraint(report, "broken"));
    FUZZ_REQUIRE(step != "signature");
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    static const TrustDomain domain = credulousDomain();
    const DERItem file = {data, size};
    check(file, domain, std::nullopt);
    check(file, domain, Img4FourCC('s', 'e', 'p', 'i'));
    return 0;
}
