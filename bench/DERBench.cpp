// Walks every item of a large SEQUENCE of small records, with this codec and with three others. All walk the same
// octets in the same way: take the header of an item, then step into the content if it is constructed, else over it; a
// length that runs past the enclosing content or is indefinite fails the walk.
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>
#include <mbedtls/asn1.h>
#include <openssl/asn1.h>

// Last of the foreign headers: it defines macros by names that OpenSSL uses for types.
#include <libtasn1.h>

#include "der/DERDecode.h"
#include "der/DEREncode.h"

namespace {

using Bytes = std::vector<std::uint8_t>;

// Each walk adds one and the content length of every item to *seen, so that equal sums show equal work.

// A record of 32 octets when encoded: SEQUENCE { INTEGER of 4, IA5String of 6, OCTET STRING of 14 }.
struct Entry {
    DERItem number;
    DERItem key;
    DERItem value;
};
constexpr DERItemSpec entryItemSpecs[] = {
    {offsetof(Entry, number), DERTagInteger, 0},
    {offsetof(Entry, key), DERTagIA5String, 0},
    {offsetof(Entry, value), DERTagOctetString, 0},
};
constexpr std::uint64_t entrySize = 32;
constexpr std::uint64_t itemsOfEntry = 4;

Bytes sequenceOf(std::uint64_t entries) {
    Bytes content(entries * entrySize);
    for (std::uint64_t i = 0; i < entries; ++i) {
        const auto octet = [i](unsigned shift) { return static_cast<std::uint8_t>(i >> shift); };
        const std::uint8_t number[4] = {0x40, octet(16), octet(8), octet(0)};
        const std::uint8_t key[6] = {'k', 'e', 'y', '0', '0', static_cast<std::uint8_t>('0' + i % 10)};
        const std::uint8_t value[14] = {octet(0), octet(8)};
        const Entry entry = {{number, sizeof number}, {key, sizeof key}, {value, sizeof value}};
        std::uint64_t size = entrySize;
        DEREncodeSequence(DERTagSequence, &entry, 3, entryItemSpecs, content.data() + i * entrySize, &size);
    }
    Bytes der(DERLengthOfItem(DERTagSequence, content.size()));
    std::uint64_t size = der.size();
    DEREncodeItem(DERTagSequence, content.size(), content.data(), der.data(), &size);
    return der;
}

DERReturn takeItem(const DERDecodedInfo* item, bool*, void* seen) {
    constexpr DERTag constructed = UINT64_C(1) << 61;
    *static_cast<std::uint64_t*>(seen) += 1 + item->content.length;
    return (item->tag & constructed) != 0 ? DERDecodeSequenceContentWithBlock(&item->content, takeItem, seen)
                                          : DERSuccess;
}

bool walkOpenSSL(const unsigned char* next, const unsigned char* end, std::uint64_t* seen) {
    constexpr int refused = 0x80 | 0x01; // an error, or an indefinite length
    while (next < end) {
        long length = 0;
        int tag = 0;
        int tagClass = 0;
        const int form = ASN1_get_object(&next, &length, &tag, &tagClass, end - next);
        if ((form & refused) != 0)
            return false;
        *seen += 1 + static_cast<std::uint64_t>(length);
        if ((form & V_ASN1_CONSTRUCTED) != 0 && !walkOpenSSL(next, next + length, seen))
            return false;
        next += length;
    }
    return true;
}

bool walkMbedTLS(unsigned char* next, const unsigned char* end, std::uint64_t* seen) {
    while (next < end) {
        const unsigned char identifier = *next;
        std::size_t length = 0;
        if (mbedtls_asn1_get_tag(&next, end, &length, identifier) != 0)
            return false;
        *seen += 1 + length;
        if ((identifier & MBEDTLS_ASN1_CONSTRUCTED) != 0 && !walkMbedTLS(next, next + length, seen))
            return false;
        next += length;
    }
    return true;
}

bool walkLibtasn1(const unsigned char* next, const unsigned char* end, std::uint64_t* seen) {
    while (next < end) {
        unsigned char tagClass = 0;
        unsigned long tag = 0;
        int tagSize = 0;
        if (asn1_get_tag_der(next, static_cast<int>(end - next), &tagClass, &tagSize, &tag) != ASN1_SUCCESS)
            return false;
        next += tagSize;
        int lengthSize = 0;
        const long length = asn1_get_length_der(next, static_cast<int>(end - next), &lengthSize);
        if (length < 0)
            return false;
        next += lengthSize;
        *seen += 1 + static_cast<std::uint64_t>(length);
        if ((tagClass & ASN1_CLASS_STRUCTURED) != 0 && !walkLibtasn1(next, next + length, seen))
            return false;
        next += length;
    }
    return true;
}

struct Contender {
    const char* name;
    bool (*walk)(Bytes& der, std::uint64_t* seen);
};
constexpr Contender contenders[] = {
    {"veltra",
     [](Bytes& der, std::uint64_t* seen) {
         const DERItem content = {der.data(), der.size()};
         return DERDecodeSequenceContentWithBlock(&content, takeItem, seen) == DERSuccess;
     }},
    {"openssl", [](Bytes& der, std::uint64_t* seen) { return walkOpenSSL(der.data(), der.data() + der.size(), seen); }},
    {"mbedtls", [](Bytes& der, std::uint64_t* seen) { return walkMbedTLS(der.data(), der.data() + der.size(), seen); }},
    {"libtasn1",
     [](Bytes& der, std::uint64_t* seen) { return walkLibtasn1(der.data(), der.data() + der.size(), seen); }},
};

void walk(benchmark::State& state, const Contender& contender, std::uint64_t entries) {
    Bytes der = sequenceOf(entries);
    const std::uint64_t items = 1 + itemsOfEntry * entries;
    const std::uint64_t expected = items + (entrySize + (entrySize - 2) + 4 + 6 + 14) * entries;
    while (state.KeepRunning()) {
        std::uint64_t seen = 0;
        if (!contender.walk(der, &seen) || seen != expected) {
            state.SkipWithError("the walk went wrong");
            return;
        }
    }
    state.counters["ns_per_item"] = benchmark::Counter(
        static_cast<double>(items) * 1e-9, benchmark::Counter::kIsIterationInvariantRate | benchmark::Counter::kInvert);
}

} // namespace

int main(int argc, char** argv) {
    for (const std::uint64_t entries : {10'000U, 100'000U, 1'000'000U})
        for (const Contender& contender : contenders) {
            const std::string name = std::string(BENCH_FAMILY "/") + contender.name + "/" + std::to_string(entries);
            benchmark::RegisterBenchmark(name.c_str(), walk, contender, entries)->Unit(benchmark::kMillisecond);
        }
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv))
        return 1;
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    return 0;
}
