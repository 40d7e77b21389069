// Any octets through the parser of lengths and the four initialisations, each followed by every query. No view may
// leave the input, a container must fill it, and what it holds must answer alike when it is handed over bare.
#include <string_view>
#include <tuple>
#include <type_traits>

#include "der/DERDecode.h"
#include "fuzz/Fuzz.h"
#include "img4/Img4Trust.h"

namespace {

using Initialise = DERReturn (*)(const std::uint8_t*, std::uint64_t, Img4Record*);

// Names that the example files use, one for each kind of place and value, and one that none uses.
constexpr std::string_view names[] = {"sepi", "eksp", "dgsO", "brdI", "osvr", "nonV",
                                      "rcnt", "rbig", "rdbg", "entP", "vers", "none"};

constexpr std::uint32_t codeOf(std::string_view name) {
    return Img4FourCC(name[0], name[1], name[2], name[3]);
}

// Digests the answers: statuses, numbers, and for each view its place in the input and its octets.
struct Inquiry {
    DERItem input;
    Img4Record record = {};

    void note(std::uint64_t number) { fuzz::answer = (fuzz::answer ^ number) * 1099511628211ULL; } // FNV-1a
    void note(const DERItem& view) {
        note(view.length);
        if (view.data == nullptr)
            return;
        FUZZ_REQUIRE(fuzz::isInside(view, input));
        note(static_cast<std::uint64_t>(view.data - input.data));
        for (std::uint64_t i = 0; i < view.length; ++i)
            note(view.data[i]);
    }
    void note(const Img4Property& property) {
        note(property.name);
        note(property.value);
        note(property.tag);
        note(property.valueTag);
    }

    template <typename... Keys, typename... Parameters>
    void askOne(const std::tuple<Keys...>& keys, DERReturn (*query)(Parameters...)) {
        std::remove_pointer_t<std::tuple_element_t<sizeof...(Keys), std::tuple<Parameters...>>> out = {};
        note(std::apply([&](auto... key) { return query(key..., &out); }, keys));
        note(out);
    }
    // Queries of the form (keys..., out-value).
    template <typename... Keys, typename... Queries>
    void ask(const std::tuple<Keys...>& keys, Queries... queries) {
        (askOne(keys, queries), ...);
    }

    void askWhole() {
        DERItem manifest = {}, properties = {};
        std::uint32_t length = 0, algorithm = 0, size = 0;
        std::uint8_t digest[Img4MaxDigestLength] = {};
        note(Img4DecodeGetManifest(&record, &manifest.data, &length));
        manifest.length = length;
        note(manifest);
        note(Img4DecodeGetPayloadCompressionInfo(&record, &algorithm, &size));
        note(algorithm);
        note(size);
        ask(std::tuple(&record), Img4DecodeManifestExists, Img4DecodeRestoreInfoExists, Img4DecodePayloadExists,
            Img4DecodeGetPayload, Img4DecodeGetPayloadType, Img4DecodeGetPayloadVersion, Img4DecodePayloadKeybagExists,
            Img4DecodeGetPayloadKeybag, Img4DecodePayloadCompressionInfoExists, Img4DecodePayloadPropertiesExists,
            Img4DecodeGetPayloadProperties);
        Img4DecodeGetPayloadProperties(&record, &properties);
        for (const std::string_view name : names)
            ask(std::tuple(&properties, codeOf(name)), Img4DecodePayloadPropertiesFindItemWithTag);
        const Img4TrustProfile& profile = kImg4DecodeSecureBootRsa4kSha384;
        note(Img4DecodeCopyPayloadPropertiesDigest(&properties, digest, sizeof digest, &profile));
        note(Img4DecodeCopyPayloadDigest(&record, digest, sizeof digest, &profile));
        note(Img4DecodeCopyManifestHash(&record, digest, Img4HashLength));
        for (const std::uint8_t octet : digest)
            note(octet);
    }

    void askAbout(std::uint32_t name) {
        const DERTag tag = Img4PropertyTag(name);
        ask(std::tuple(&record, tag, DERTagSet), Img4DecodePayloadProperty);
        ask(std::tuple(&record, tag), Img4DecodeGetPayloadPropertiesBoolean, Img4DecodeGetPayloadPropertiesInteger,
            Img4DecodeGetPayloadPropertiesInteger64, Img4DecodeGetPayloadPropertiesData,
            Img4DecodePayloadPropertyExistsByTag);
        for (const std::uint32_t section : {0U, 1U}) {
            ask(std::tuple(&record, section, tag, DERTagIA5String), Img4DecodeGetPropertyFromSection);
            ask(std::tuple(&record, section, name), Img4DecodeGetBooleanFromSection, Img4DecodeGetIntegerFromSection,
                Img4DecodeGetInteger64FromSection, Img4DecodeGetDataFromSection);
        }
        for (const std::uint32_t object : {codeOf("sepi"), codeOf("o001")}) {
            ask(std::tuple(&record, object, tag, DERTagOctetString), Img4DecodeGetObjectProperty);
            ask(std::tuple(&record, object, name), Img4DecodeGetObjectPropertyBoolean,
                Img4DecodeGetObjectPropertyInteger, Img4DecodeGetObjectPropertyInteger64,
                Img4DecodeGetObjectPropertyData, Img4DecodeGetObjectPropertyString);
        }
    }

    // The elements of a dictionary are what a caller of these holds; each is asked for by its own name.
    void askSingles() {
        DERSequence elements;
        DERDecodedInfo element;
        DERDecodeSeqContentInit(&record.restoreInfo.properties, &elements);
        while (DERDecodeSeqNext(&elements, &element) == DERSuccess) {
            const auto name = static_cast<std::uint32_t>(element.tag);
            ask(std::tuple(&element.content, Img4PropertyTag(name)), DERImg4DecodeProperty,
                Img4DecodeGetPayloadVersionPropertyString);
            ask(std::tuple(&element.content, name), Img4DecodeGetPropertyBoolean, Img4DecodeGetPropertyInteger,
                Img4DecodeGetPropertyInteger64, Img4DecodeGetPropertyData);
        }
    }

    bool run(Initialise initialise) {
        const DERReturn result = initialise(input.data, input.length, &record);
        note(result);
        if (result != DERSuccess)
            return false;
        FUZZ_REQUIRE(record.manifestRaw.data != input.data || record.manifestRaw.length == input.length);
        askWhole();
        for (const std::string_view name : names)
            askAbout(codeOf(name));
        askSingles();
        return true;
    }
};

// What a container holds answers alike when it is handed over bare.
void checkContainer(const Img4Record& record) {
    Img4Record bare;
    FUZZ_REQUIRE(Img4DecodeInitPayload(record.payloadRaw.data, record.payloadRaw.length, &bare) == DERSuccess);
    FUZZ_REQUIRE(bare.payload.data.data == record.payload.data.data);
    if (record.manifestRaw.data == nullptr)
        return;
    const DERReturn result = Img4DecodeInitManifest(record.manifestRaw.data, record.manifestRaw.length, &bare);
    // The container does not look behind the manifest in its [0], which a bare manifest must fill.
    FUZZ_REQUIRE(result == DERSuccess || result == DERBufferOverflow);
    FUZZ_REQUIRE(bare.manifest.body.data == record.manifest.body.data);
}

// What the parser of lengths says of the input it says of every prefix, or nothing.
std::uint64_t checkLength(const DERItem& input) {
    std::uint64_t total = 1, other = 1;
    const DERReturn result = Img4DecodeParseLengthFromBuffer(input.data, input.length, &total);
    const DERReturn payload = Img4DecodeParseLengthFromBufferWithTag(input.data, input.length, codeOf("IM4P"), &other);
    FUZZ_REQUIRE((result == DERSuccess) == (total != 0) && (payload == DERSuccess) == (other != 0));
    FUZZ_REQUIRE(result != DERSuccess || payload == DERUnexpectedTag);
    for (std::uint64_t length = 0; length < input.length && length < 64 && total != 0; ++length)
        FUZZ_REQUIRE(Img4DecodeParseLengthFromBuffer(input.data, length, &other) == DERSuccess ? other == total
                                                                                               : other == 0);
    return total;
}

} // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const DERItem input = fuzz::viewOf(data, size);
    bool isAccepted = false;
    fuzz::answer = 14695981039346656037ULL;
    for (const Initialise initialise :
         {Img4DecodeInit, Img4DecodeInitPayload, Img4DecodeInitManifest, Img4DecodeInitUnsignedManifest})
        isAccepted = Inquiry{input}.run(initialise) || isAccepted;
    if (!isAccepted)
        fuzz::answer = 0;
    const std::uint64_t total = checkLength(input);
    Img4Record record;
    fuzz::taken = Img4DecodeInit(input.data, size, &record) == DERSuccess;
    if (fuzz::taken) {
        FUZZ_REQUIRE(total == size);
        checkContainer(record);
    }
    return 0;
}
