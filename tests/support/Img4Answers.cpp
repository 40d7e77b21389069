#include "tests/support/Img4Answers.h"

#include "der/DERDecode.h"
#include "img4/Img4.h"
#include "tools/makers/Img4Maker.h"

#include <cstdlib>
#include <iostream>
#include <string_view>

namespace img4answers {

namespace {

// Names that the example files use, one for each kind of place and value, and one that none uses.
constexpr std::string_view names[] = {"sepi", "eksp", "dgsO", "brdI", "osvr", "nonV",
                                      "rcnt", "rbig", "rdbg", "entP", "vers", "none"};

DERReturn foldDigest(const DERItem* data, std::uint8_t* out, std::uint64_t length, const Img4TrustProfile*) {
    for (std::uint64_t i = 0; i < data->length && length != 0; ++i)
        out[i % length] = static_cast<std::uint8_t>(out[i % length] * 31 + data->data[i]);
    return DERSuccess;
}

class Inquiry {
public:
    Inquiry(const std::uint8_t* data, std::size_t length) : data_(data), length_(length) {}

    Answers run(int initialisation);

private:
    void note(std::uint64_t number) { answers_.push_back(number); }
    void note(std::uint32_t number) { answers_.push_back(number); }
    void note(bool flag) { answers_.push_back(flag ? 1 : 0); }
    void note(DERReturn status) { answers_.push_back(status); }
    void note(const DERItem& view);
    void note(const Img4Property& property);
    void noteOctets(const std::uint8_t* octets, std::size_t count);

    // Runs a query of the form (record, key..., out-value).
    template <typename Out, typename Query, typename... Keys>
    void ask(Query query, Keys... keys) {
        Out value = {};
        note(query(keys..., &value));
        note(value);
    }

    void askPayload();
    void askPayloadProperties(std::uint32_t name, const DERItem& properties);
    void askSections(std::uint32_t name);
    void askObject(std::uint32_t object, std::uint32_t name);
    void askSingle(const DERItem& single, std::uint32_t name);
    void askSingles();
    void askDigests(const DERItem& properties);

    const std::uint8_t* data_;
    std::size_t length_;
    Img4Record record_ = {};
    Answers answers_;
};

void Inquiry::noteOctets(const std::uint8_t* octets, std::size_t count) {
    std::uint64_t digest = 14695981039346656037ULL; // FNV-1a
    for (std::size_t i = 0; i < count; ++i)
        digest = (digest ^ octets[i]) * 1099511628211ULL;
    note(digest);
}

void Inquiry::note(const DERItem& view) {
    note(view.length);
    if (view.data == nullptr)
        return;
    if (view.data < data_ || view.data > data_ + length_ ||
        view.length > static_cast<std::size_t>(data_ + length_ - view.data)) {
        std::cerr << "a view leaves the buffer\n";
        std::abort();
    }
    note(static_cast<std::uint64_t>(view.data - data_));
    noteOctets(view.data, view.length);
}

void Inquiry::note(const Img4Property& property) {
    note(property.name);
    note(property.value);
    note(property.tag);
    note(property.valueTag);
}

void Inquiry::askPayload() {
    const Img4Record* record = &record_;
    std::uint32_t algorithm = 0;
    std::uint32_t size = 0;
    ask<bool>(Img4DecodePayloadExists, record);
    ask<DERItem>(Img4DecodeGetPayload, record);
    ask<std::uint32_t>(Img4DecodeGetPayloadType, record);
    ask<DERItem>(Img4DecodeGetPayloadVersion, record);
    ask<bool>(Img4DecodePayloadKeybagExists, record);
    ask<DERItem>(Img4DecodeGetPayloadKeybag, record);
    ask<bool>(Img4DecodePayloadCompressionInfoExists, record);
    note(Img4DecodeGetPayloadCompressionInfo(record, &algorithm, &size));
    note(algorithm);
    note(size);
    ask<bool>(Img4DecodePayloadPropertiesExists, record);
    ask<DERItem>(Img4DecodeGetPayloadProperties, record);
}

void Inquiry::askPayloadProperties(std::uint32_t name, const DERItem& properties) {
    const Img4Record* record = &record_;
    const DERTag tag = Img4PropertyTag(name);
    ask<Img4Property>(Img4DecodePayloadProperty, record, tag, DERTagSet);
    ask<bool>(Img4DecodeGetPayloadPropertiesBoolean, record, tag);
    ask<std::uint32_t>(Img4DecodeGetPayloadPropertiesInteger, record, tag);
    ask<std::uint64_t>(Img4DecodeGetPayloadPropertiesInteger64, record, tag);
    ask<DERItem>(Img4DecodeGetPayloadPropertiesData, record, tag);
    ask<bool>(Img4DecodePayloadPropertyExistsByTag, record, tag);
    ask<DERItem>(Img4DecodePayloadPropertiesFindItemWithTag, &properties, name);
}

void Inquiry::askSections(std::uint32_t name) {
    const Img4Record* record = &record_;
    for (std::uint32_t section = 0; section < 2; ++section) {
        ask<Img4Property>(Img4DecodeGetPropertyFromSection, record, section, Img4PropertyTag(name), DERTagIA5String);
        ask<bool>(Img4DecodeGetBooleanFromSection, record, section, name);
        ask<std::uint32_t>(Img4DecodeGetIntegerFromSection, record, section, name);
        ask<std::uint64_t>(Img4DecodeGetInteger64FromSection, record, section, name);
        ask<DERItem>(Img4DecodeGetDataFromSection, record, section, name);
    }
    ask<bool>(Img4DecodeGetRestoreInfoBoolean, record, name);
    ask<std::uint32_t>(Img4DecodeGetRestoreInfoInteger, record, name);
    ask<std::uint64_t>(Img4DecodeGetRestoreInfoInteger64, record, name);
    ask<DERItem>(Img4DecodeGetRestoreInfoData, record, name);
}

void Inquiry::askObject(std::uint32_t object, std::uint32_t name) {
    const Img4Record* record = &record_;
    ask<Img4Property>(Img4DecodeGetObjectProperty, record, object, Img4PropertyTag(name), DERTagOctetString);
    ask<bool>(Img4DecodeGetObjectPropertyBoolean, record, object, name);
    ask<std::uint32_t>(Img4DecodeGetObjectPropertyInteger, record, object, name);
    ask<std::uint64_t>(Img4DecodeGetObjectPropertyInteger64, record, object, name);
    ask<DERItem>(Img4DecodeGetObjectPropertyData, record, object, name);
    ask<DERItem>(Img4DecodeGetObjectPropertyString, record, object, name);
}

void Inquiry::askSingle(const DERItem& single, std::uint32_t name) {
    ask<Img4Property>(DERImg4DecodeProperty, &single, Img4PropertyTag(name));
    ask<bool>(Img4DecodeGetPropertyBoolean, &single, name);
    ask<std::uint32_t>(Img4DecodeGetPropertyInteger, &single, name);
    ask<std::uint64_t>(Img4DecodeGetPropertyInteger64, &single, name);
    ask<DERItem>(Img4DecodeGetPropertyData, &single, name);
    ask<DERItem>(Img4DecodeGetPayloadVersionPropertyString, &single, Img4PropertyTag(name));
}

// The elements of a dictionary are what a caller of these holds; each is asked for by its own name.
void Inquiry::askSingles() {
    DERSequence elements;
    DERDecodedInfo element;
    DERDecodeSeqContentInit(&record_.restoreInfo.properties, &elements);
    while (DERDecodeSeqNext(&elements, &element) == DERSuccess)
        askSingle(element.content, static_cast<std::uint32_t>(element.tag));
}

void Inquiry::askDigests(const DERItem& properties) {
    using Hash = DERReturn (*)(const Img4Record*, std::uint8_t*, std::uint64_t);
    using Digest = DERReturn (*)(const Img4Record*, std::uint8_t*, std::uint64_t, const Img4TrustProfile*);
    constexpr Hash hashes[] = {Img4DecodeCopyPayloadHash, Img4DecodeCopyManifestHash};
    constexpr Digest digests[] = {Img4DecodeCopyPayloadDigest, Img4DecodeCopyManifestDigest};
    Img4TrustProfile profile = {};
    profile.computeDigest = foldDigest;
    for (const Hash hash : hashes) {
        std::uint8_t out[Img4HashLength] = {};
        note(hash(&record_, out, sizeof out));
        noteOctets(out, sizeof out);
    }
    for (const Digest digest : digests) {
        std::uint8_t out[Img4MaxDigestLength] = {};
        note(digest(&record_, out, sizeof out, &profile));
        noteOctets(out, sizeof out);
    }
    std::uint8_t out[Img4MaxDigestLength] = {};
    note(Img4DecodeCopyPayloadPropertiesDigest(&properties, out, sizeof out, &profile));
    noteOctets(out, sizeof out);
}

Answers Inquiry::run(int initialisation) {
    using Initialise = DERReturn (*)(const std::uint8_t*, std::uint64_t, Img4Record*);
    constexpr Initialise initialise[initialisations] = {Img4DecodeInit, Img4DecodeInitPayload, Img4DecodeInitManifest,
                                                        Img4DecodeInitUnsignedManifest};
    const DERReturn result = initialise[initialisation](data_, length_, &record_);
    note(result);
    if (result != DERSuccess)
        return answers_;
    const std::uint8_t* start = nullptr;
    std::uint32_t length = 0;
    note(Img4DecodeGetManifest(&record_, &start, &length));
    note(DERItem{start, length});
    ask<bool>(Img4DecodeManifestExists, &record_);
    ask<bool>(Img4DecodeRestoreInfoExists, &record_);
    ask<bool>(Img4DecodeSectionExists, &record_, 0U);
    askPayload();
    DERItem properties = {};
    Img4DecodeGetPayloadProperties(&record_, &properties);
    askDigests(properties);
    for (const std::string_view text : names) {
        const std::uint32_t name = img4maker::fourCC(text);
        askPayloadProperties(name, properties);
        askSections(name);
        for (const std::string_view object : {"sepi", "o001"})
            askObject(img4maker::fourCC(object), name);
    }
    askSingles();
    return answers_;
}

} // namespace

Answers ask(int initialisation, const std::uint8_t* data, std::size_t length) {
    return Inquiry(data, length).run(initialisation);
}

Answers askAll(const std::uint8_t* data, std::size_t length) {
    Answers all;
    for (int initialisation = 0; initialisation < initialisations; ++initialisation) {
        const Answers answers = ask(initialisation, data, length);
        all.insert(all.end(), answers.begin(), answers.end());
    }
    return all;
}

} // namespace img4answers
