// What the files of the Img4 decoder share: the tables of the format and the helpers that every lookup needs.
#ifndef VELTRA_IMG4_INTERNAL_H
#define VELTRA_IMG4_INTERNAL_H

#include "der/DERDecode.h"
#include "img4/Img4.h"

#include <span>

// Records that the tables fill and that Img4Record does not keep.
struct Img4Container {
    DERItem magic;
    DERItem payload; // the whole encoding
    DERItem manifest;
    DERItem restoreInfo;
};

struct Img4PayloadWithProperties {
    Img4PayloadRecord payload;
    DERItem properties;
};

struct Img4Compression {
    DERItem algorithm;
    DERItem uncompressedSize;
};

// The tables that are wanted beside initialisation too.
extern const DERItemSpec DERImg4PayloadWithPropertiesItemSpecs[7];
extern const DERItemSpec DERImg4CompressionItemSpecs[2];

namespace img4 {

constexpr uint32_t containerMagic = Img4FourCC('I', 'M', 'G', '4');
constexpr uint32_t payloadMagic = Img4FourCC('I', 'M', '4', 'P');
constexpr uint32_t payloadPropertiesMagic = Img4FourCC('P', 'A', 'Y', 'P');
constexpr uint32_t manifestMagic = Img4FourCC('I', 'M', '4', 'M');
constexpr uint32_t restoreInfoMagic = Img4FourCC('I', 'M', '4', 'R');
constexpr DERTag manifestBodyTag = Img4PropertyTag(Img4FourCC('M', 'A', 'N', 'B'));
constexpr DERTag manifestPropertiesTag = Img4PropertyTag(Img4FourCC('M', 'A', 'N', 'P'));
constexpr uint32_t highestManifestVersion = 2;
constexpr uint32_t highestCompressionAlgorithm = 1;

inline bool isPresent(const DERItem& item) {
    return item.data != nullptr;
}

inline bool hasContent(const DERItem& item) {
    return item.data != nullptr && item.length != 0;
}

// True when `text` is the four-character code `code`.
bool equalsFourCC(const DERItem& text, uint32_t code);

// The first element with the tag `tag` in the octets of `content`. A search that fails leaves in *end, unless that is
// null, the place where it ended.
DERReturn findFirst(const DERItem& content, DERTag tag, DERItem* found, const uint8_t** end = nullptr);

// Says what the refusals behind this call are about.
inline void enter(Img4Refusal* refusal, Img4Subject subject) {
    if (refusal != nullptr && refusal->fault == Img4FaultNone)
        refusal->subject = subject;
}

// Passes `status` on. Where a refusal is asked for and none was noted before, it becomes this one.
inline DERReturn refuse(Img4Refusal* refusal, DERReturn status, Img4Fault fault, const uint8_t* place,
                        const DERItem& found = {}) {
    if (refusal != nullptr && refusal->fault == Img4FaultNone) {
        refusal->fault = fault;
        refusal->status = status;
        refusal->place = place;
        refusal->found = found;
    }
    return status;
}

// The same for the status of a DER operation that has said in `encoding` what it refused.
inline DERReturn refuse(Img4Refusal* refusal, DERReturn status, const DERRefusal& encoding) {
    if (refusal != nullptr && refusal->fault == Img4FaultNone)
        refusal->encoding = encoding;
    return refuse(refusal, status, Img4FaultEncoding, encoding.place);
}

using ItemSpecs = std::span<const DERItemSpec>;

// DERParseSequenceExplained and DERParseSequenceContentExplained into `fields`, all of which are cleared first.
template <typename Fields>
DERReturn parseSequence(const DERItem& encoding, ItemSpecs specs, Fields* fields, Img4Refusal* refusal = nullptr,
                        decltype(DERParseSequenceExplained)* parse = DERParseSequenceExplained) {
    DERRefusal why;
    const DERReturn result = parse(&encoding, static_cast<uint16_t>(specs.size()), specs.data(), fields, sizeof *fields,
                                   sizeof *fields, refusal != nullptr ? &why : nullptr);
    return result == DERSuccess || refusal == nullptr ? result : refuse(refusal, result, why);
}

template <typename Fields>
DERReturn parseContent(const DERItem& content, ItemSpecs specs, Fields* fields, Img4Refusal* refusal = nullptr) {
    return parseSequence(content, specs, fields, refusal, DERParseSequenceContentExplained);
}

// Passes the failure of a search in `dictionary` on that ended at `end`.
DERReturn refuseSearch(DERReturn result, const DERItem& dictionary, const uint8_t* end, Img4Refusal* refusal);

// As DERImg4DecodeFindProperty, for arguments that are there.
DERReturn findProperty(const DERItem& dictionary, DERTag tag, DERTag valueType, Img4Property* property,
                       Img4Refusal* refusal = nullptr);

// The values of "MANB" and "MANP" of a record with a manifest.
DERReturn findManifestDictionaries(const Img4Record& record, DERItem* manb, DERItem* manp,
                                   Img4Refusal* refusal = nullptr);

// Parsers of a value's content have the shape of DERParseInteger. This one takes the content as it is.
template <typename T>
using Parser = DERReturn (*)(const DERItem* item, T* value);

inline DERReturn parseData(const DERItem* item, DERItem* value) {
    *value = *item;
    return DERSuccess;
}

// The value of the property that `find` finds.
template <typename T, typename Find>
DERReturn getValue(T* value, Parser<T> parse, Find find) {
    Img4Property property;
    if (value == nullptr)
        return DERParamError;
    const DERReturn result = find(&property);
    return result == DERSuccess ? parse(&property.value, value) : result;
}

// Passes `result` on, and clears *value when it is a failure.
template <typename T>
DERReturn clearOnFailure(DERReturn result, T* value) {
    if (result != DERSuccess && value != nullptr)
        *value = T{};
    return result;
}

} // namespace img4

#endif
