// Decoding and encoding of system-configuration blobs, against OpenSSL's ASN.1 templates on the same blobs.
#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <iostream>
#include <memory>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>
#include <malloc.h>
#include <openssl/asn1t.h>

#include "sysconfig/SysConfig3Ptr.h"

using namespace sysconfig;

// Memory
//
// The linker leads the codec's allocations here. They are only counted while a measurement asks for it.

namespace {

struct MemoryMeter {
    bool running = false;
    std::size_t current = 0;
    std::size_t peak = 0;

    void* add(void* block) {
        if (running && block != nullptr) {
            current += malloc_usable_size(block) + sizeof(std::size_t);
            peak = std::max(peak, current);
        }
        return block;
    }
    void subtract(void* block) {
        if (running && block != nullptr)
            current -= malloc_usable_size(block) + sizeof(std::size_t);
    }
};

MemoryMeter meter;

// The most memory that the codec held at once while `run` ran.
template <typename Run>
double peakOf(Run run) {
    meter = {true, 0, 0};
    run();
    meter.running = false;
    return static_cast<double>(meter.peak);
}

} // namespace

extern "C" {
void* __real_malloc(std::size_t size);
void* __real_calloc(std::size_t count, std::size_t size);
void __real_free(void* block);

void* __wrap_malloc(std::size_t size) {
    return meter.add(__real_malloc(size));
}

void* __wrap_calloc(std::size_t count, std::size_t size) {
    return meter.add(__real_calloc(count, size));
}

void __wrap_free(void* block) {
    meter.subtract(block);
    __real_free(block);
}
}

// The blob as OpenSSL's templates describe it.

namespace {

struct Entry {
    ASN1_INTEGER* key;
    ASN1_IA5STRING* comment;
    ASN1_OCTET_STRING* data;
    ASN1_IA5STRING* string;
    ASN1_BOOLEAN deleted;
};

struct MetadataEntry {
    ASN1_IA5STRING* key;
    ASN1_OCTET_STRING* data;
    ASN1_IA5STRING* string;
};

struct Manifest {
    ASN1_OCTET_STRING* payloadHMAC;
    ASN1_OCTET_STRING* metadataHMAC;
    ASN1_OCTET_STRING* fullHMAC;
};

struct Blob {
    ASN1_INTEGER* magic;
    ASN1_INTEGER* version;
    STACK_OF(Entry) * payload;
    STACK_OF(MetadataEntry) * metadata;
    Manifest* manifest;
};

#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wpedantic"
#pragma GCC diagnostic ignored "-Wunused-function"

ASN1_SEQUENCE(Entry) =
    {
        ASN1_SIMPLE(Entry, key, ASN1_INTEGER),    ASN1_SIMPLE(Entry, comment, ASN1_IA5STRING),
        ASN1_OPT(Entry, data, ASN1_OCTET_STRING), ASN1_OPT(Entry, string, ASN1_IA5STRING),
        ASN1_OPT(Entry, deleted, ASN1_FBOOLEAN),
} static_ASN1_SEQUENCE_END(Entry)

        ASN1_SEQUENCE(MetadataEntry) =
            {
                ASN1_SIMPLE(MetadataEntry, key, ASN1_IA5STRING),
                ASN1_OPT(MetadataEntry, data, ASN1_OCTET_STRING),
                ASN1_OPT(MetadataEntry, string, ASN1_IA5STRING),
} static_ASN1_SEQUENCE_END(MetadataEntry)

                ASN1_SEQUENCE(Manifest) =
                    {
                        ASN1_SIMPLE(Manifest, payloadHMAC, ASN1_OCTET_STRING),
                        ASN1_SIMPLE(Manifest, metadataHMAC, ASN1_OCTET_STRING),
                        ASN1_SIMPLE(Manifest, fullHMAC, ASN1_OCTET_STRING),
} static_ASN1_SEQUENCE_END(Manifest)

// As SEQUENCE OF with the tag of SET, so that OpenSSL does not sort: the blob keeps its order.
#define UNSORTED_SET (ASN1_TFLG_SEQUENCE_OF | ASN1_TFLG_IMPTAG | ASN1_TFLG_UNIVERSAL)
#define PRIVATE_TAG (ASN1_TFLG_EXPTAG | ASN1_TFLG_PRIVATE)

                        ASN1_ITEM_TEMPLATE(Entries) = ASN1_EX_TEMPLATE_TYPE(UNSORTED_SET, V_ASN1_SET, Entries, Entry)
                            static_ASN1_ITEM_TEMPLATE_END(Entries)

                                ASN1_ITEM_TEMPLATE(MetadataEntries) = ASN1_EX_TEMPLATE_TYPE(UNSORTED_SET, V_ASN1_SET,
                                                                                            MetadataEntries,
                                                                                            MetadataEntry)
                                    static_ASN1_ITEM_TEMPLATE_END(MetadataEntries)

                                        ASN1_SEQUENCE(Blob) =
                                            {
                                                ASN1_SIMPLE(Blob, magic, ASN1_INTEGER),
                                                ASN1_SIMPLE(Blob, version, ASN1_INTEGER),
                                                ASN1_EX_TYPE(PRIVATE_TAG, 0x53504159, Blob, payload, Entries),
                                                ASN1_EX_TYPE(PRIVATE_TAG, 0x4D455441, Blob, metadata, MetadataEntries),
                                                ASN1_EX_TYPE(PRIVATE_TAG, 0x4D414E49, Blob, manifest, Manifest),
} static_ASN1_SEQUENCE_END(Blob)

                                                IMPLEMENT_STATIC_ASN1_ENCODE_FUNCTIONS(Blob)
                                                    IMPLEMENT_STATIC_ASN1_ALLOC_FUNCTIONS(Blob)

#pragma GCC diagnostic pop

    // Input

    // Distinct keys of four letters or digits, which are valid DER integers in either octet order.
    std::uint32_t keyOf(std::uint32_t index) {
    static constexpr char alphabet[] = "0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz";
    std::uint32_t key = 0;
    for (int i = 0; i < 4; ++i) {
        key = key << 8 | static_cast<unsigned char>(alphabet[index % 62]);
        index /= 62;
    }
    return key;
}

[[noreturn]] void fail(const char* what) {
    std::cerr << "bench-sysconfig: " << what << " failed\n";
    std::exit(1);
}

std::vector<std::uint8_t> encode(const __SysConfig3* object) {
    SysConfigData out = {};
    if (!encodeSysConfig3(object, &out))
        fail("encode");
    const BytesPtr owner(out.data);
    return {out.data, out.data + out.length};
}

// A blob of `count` payload entries of 32 bytes.
std::vector<std::uint8_t> makeBlob(std::uint32_t count) {
    const SysConfig3Ptr object(allocSysConfig3(0x62436667, 0x30003));
    std::uint8_t data[32] = {};
    for (std::uint32_t i = 0; i < count; ++i) {
        std::fill(std::begin(data), std::end(data), static_cast<std::uint8_t>(i * 37 + 1));
        const PayloadEntryPtr entry(allocSysConfig3PayloadEntryWithData(keyOf(i), nullptr, data, sizeof data));
        if (!sysConfig3AddPayloadEntry(object.get(), entry.get()))
            fail("add");
    }
    return encode(object.get());
}

SysConfig3Ptr decode(const std::vector<std::uint8_t>& blob) {
    SysConfig3Ptr object(decodeSysConfig3(blob.data(), static_cast<std::uint32_t>(blob.size())));
    if (object == nullptr)
        fail("decode");
    return object;
}

struct ReleaseBlob {
    void operator()(Blob* blob) const { Blob_free(blob); }
};
using BlobPtr = std::unique_ptr<Blob, ReleaseBlob>;

BlobPtr decodeByOpenSSL(const std::vector<std::uint8_t>& blob) {
    const unsigned char* next = blob.data();
    BlobPtr decoded(d2i_Blob(nullptr, &next, static_cast<long>(blob.size())));
    if (decoded == nullptr)
        fail("OpenSSL's decode");
    return decoded;
}

// Benchmarks

void countItems(benchmark::State& state) {
    using benchmark::Counter;
    const auto items = static_cast<double>(state.range(0));
    state.counters["ns_per_item"] = Counter(items * 1e-9, Counter::kIsIterationInvariantRate | Counter::kInvert);
}

void decodeByVeltra(benchmark::State& state) {
    const std::vector<std::uint8_t> blob = makeBlob(static_cast<std::uint32_t>(state.range(0)));
    while (state.KeepRunning()) {
        SysConfig3Ptr object = decode(blob);
        state.PauseTiming();
        object.reset();
        malloc_trim(0); // So that the order of the benchmarks does not matter; the README says how.
        state.ResumeTiming();
    }
    countItems(state);
    const double peak = peakOf([&] { decode(blob); });
    const auto size = static_cast<double>(blob.size());
    state.counters["peak_per_blob"] = (size + peak) / size;
}

void decodeByTemplates(benchmark::State& state) {
    const std::vector<std::uint8_t> blob = makeBlob(static_cast<std::uint32_t>(state.range(0)));
    while (state.KeepRunning()) {
        BlobPtr decoded = decodeByOpenSSL(blob);
        state.PauseTiming();
        decoded.reset();
        malloc_trim(0); // So that the order of the benchmarks does not matter; the README says how.
        state.ResumeTiming();
    }
    countItems(state);
}

void encodeByVeltra(benchmark::State& state) {
    const std::vector<std::uint8_t> blob = makeBlob(static_cast<std::uint32_t>(state.range(0)));
    const SysConfig3Ptr object = decode(blob);
    const auto run = [&] {
        SysConfigData out = {};
        if (!encodeSysConfig3(object.get(), &out))
            fail("encode");
        const BytesPtr owner(out.data);
        benchmark::DoNotOptimize(out.data);
    };
    while (state.KeepRunning())
        run();
    countItems(state);
    state.counters["peak_per_blob"] = peakOf(run) / static_cast<double>(blob.size());
}

void encodeByTemplates(benchmark::State& state) {
    const std::vector<std::uint8_t> blob = makeBlob(static_cast<std::uint32_t>(state.range(0)));
    const BlobPtr decoded = decodeByOpenSSL(blob);
    int length = 0;
    while (state.KeepRunning()) {
        unsigned char* out = nullptr;
        length = i2d_Blob(decoded.get(), &out);
        benchmark::DoNotOptimize(out);
        OPENSSL_free(out);
    }
    if (length != static_cast<int>(blob.size()))
        fail("OpenSSL's encode");
    countItems(state);
}

} // namespace

BENCHMARK(decodeByVeltra)->Name("decode/veltra")->Arg(10'000)->Arg(100'000)->Arg(1'000'000);
BENCHMARK(decodeByTemplates)->Name("decode/openssl")->Arg(10'000)->Arg(100'000)->Arg(1'000'000);
BENCHMARK(encodeByVeltra)->Name("encode/veltra")->Arg(10'000)->Arg(100'000)->Arg(1'000'000);
BENCHMARK(encodeByTemplates)->Name("encode/openssl")->Arg(10'000)->Arg(100'000)->Arg(1'000'000);

BENCHMARK_MAIN();
