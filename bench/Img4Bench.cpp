// Takes a manifest as it lies in memory and looks a boolean property of its last object up: what the service does to
// answer whether a part is entitled. Beside it the same search on mbedTLS's ASN.1 reader, which knows one-octet tags
// only, so that private tags are read here by hand. That search checks less: no magic, no version, no minimal lengths,
// no third elements, and not that the manifest fills the buffer.
#include <cstdint>
#include <cstring>
#include <string>

#include <benchmark/benchmark.h>
#include <mbedtls/asn1.h>

#include "img4/Img4.h"
#include "tools/makers/Img4Maker.h"

namespace {

struct Wanted {
    std::uint32_t object;
    std::uint32_t property;
};

bool lookUpVeltra(const img4maker::Bytes& manifest, const Wanted& wanted, bool* value) {
    Img4Record record;
    return Img4DecodeInitManifest(manifest.data(), manifest.size(), &record) == DERSuccess &&
           Img4DecodeGetObjectPropertyBoolean(&record, wanted.object, wanted.property, value) == DERSuccess;
}

constexpr int constructedSequence = MBEDTLS_ASN1_CONSTRUCTED | MBEDTLS_ASN1_SEQUENCE;
constexpr int constructedSet = MBEDTLS_ASN1_CONSTRUCTED | MBEDTLS_ASN1_SET;

// Steps into the item with the given tag and sets *end to its end.
bool enter(unsigned char** next, const unsigned char** end, int tag) {
    std::size_t length = 0;
    if (mbedtls_asn1_get_tag(next, *end, &length, tag) != 0)
        return false;
    *end = *next + length;
    return true;
}

bool skip(unsigned char** next, const unsigned char* end, int tag) {
    std::size_t length = 0;
    if (mbedtls_asn1_get_tag(next, end, &length, tag) != 0)
        return false;
    *next += length;
    return true;
}

// Reads the identifier octets FF and the digits behind them into *number.
bool readPrivateTag(unsigned char** next, const unsigned char* end, std::uint64_t* number) {
    if (*next == end || *(*next)++ != 0xFF)
        return false;
    *number = 0;
    unsigned char digit = 0x80;
    while ((digit & 0x80) != 0) {
        if (*next == end)
            return false;
        digit = *(*next)++;
        *number = *number << 7 | (digit & 0x7FU);
    }
    return true;
}

// Finds the property `name` between *next and *end and steps into its value.
bool findMbedTLS(unsigned char** next, const unsigned char** end, std::uint32_t name, int valueTag) {
    while (*next < *end) {
        std::uint64_t number = 0;
        std::size_t length = 0;
        if (!readPrivateTag(next, *end, &number) || mbedtls_asn1_get_len(next, *end, &length) != 0)
            return false;
        if (number != name) {
            *next += length;
            continue;
        }
        *end = *next + length;
        const unsigned char text[] = {static_cast<unsigned char>(name >> 24), static_cast<unsigned char>(name >> 16),
                                      static_cast<unsigned char>(name >> 8), static_cast<unsigned char>(name)};
        if (!enter(next, end, constructedSequence) ||
            mbedtls_asn1_get_tag(next, *end, &length, MBEDTLS_ASN1_IA5_STRING) != 0 || length != sizeof text ||
            std::memcmp(*next, text, sizeof text) != 0)
            return false;
        *next += length;
        // The caller reads a boolean with its tag; a dictionary is entered.
        return valueTag == MBEDTLS_ASN1_BOOLEAN || enter(next, end, valueTag);
    }
    return false;
}

bool lookUpMbedTLS(const img4maker::Bytes& manifest, const Wanted& wanted, bool* value) {
    constexpr std::uint32_t manb = Img4FourCC('M', 'A', 'N', 'B');
    constexpr std::uint32_t manp = Img4FourCC('M', 'A', 'N', 'P');
    auto* next = const_cast<unsigned char*>(manifest.data());
    const unsigned char* end = next + manifest.size();
    if (!enter(&next, &end, constructedSequence) || !skip(&next, end, MBEDTLS_ASN1_IA5_STRING) ||
        !skip(&next, end, MBEDTLS_ASN1_INTEGER) || !enter(&next, &end, constructedSet) ||
        !findMbedTLS(&next, &end, manb, constructedSet))
        return false;
    unsigned char* properties = next;
    const unsigned char* propertiesEnd = end;
    if (!findMbedTLS(&properties, &propertiesEnd, manp, constructedSet) ||
        !findMbedTLS(&next, &end, wanted.object, constructedSet) ||
        !findMbedTLS(&next, &end, wanted.property, MBEDTLS_ASN1_BOOLEAN))
        return false;
    int number = 0;
    if (mbedtls_asn1_get_bool(&next, end, &number) != 0)
        return false;
    *value = number != 0;
    return true;
}

using LookUp = bool (*)(const img4maker::Bytes&, const Wanted&, bool*);

// The properties that a search goes past or into: the manifest's body and own dictionary, all objects, and the
// properties of the last one.
std::int64_t propertiesPassed(unsigned objects) {
    return 2 + objects + img4maker::propertiesOfLargeObject;
}

void run(benchmark::State& state, LookUp lookUp, unsigned objects) {
    const img4maker::Bytes manifest = img4maker::largeManifest(objects);
    const std::string last = img4maker::largeObjectName(objects - 1);
    const Wanted wanted = {img4maker::fourCC(last), img4maker::fourCC("eksp")};
    while (state.KeepRunning()) {
        bool value = false;
        if (!lookUp(manifest, wanted, &value) || !value) {
            state.SkipWithError("the property was not found");
            break;
        }
        benchmark::DoNotOptimize(value);
    }
    state.counters["ns_per_item"] =
        benchmark::Counter(static_cast<double>(state.iterations() * propertiesPassed(objects)) * 1e-9,
                           benchmark::Counter::kIsRate | benchmark::Counter::kInvert);
}

} // namespace

int main(int argc, char** argv) {
    struct Contender {
        const char* name;
        LookUp lookUp;
    };
    for (const unsigned objects : {5U, 50U, 500U})
        for (const Contender& contender : {Contender{"veltra", lookUpVeltra}, Contender{"mbedtls", lookUpMbedTLS}})
            benchmark::RegisterBenchmark(
                ("lookup/" + std::string(contender.name) + "/" + std::to_string(objects)).c_str(), run,
                contender.lookUp, objects);
    benchmark::Initialize(&argc, argv);
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    return 0;
}
