// What the files of the Img4 decoder share: the tables of the format and the helpers that every lookup needs.
#ifndef VELTRA_IMG4_INTERNAL_H
#define VELTRA_IMG4_INTERNAL_H

#include "der/DERDecode.h"
#include "img4/Img4.h"

#include <iterator>

// Records that the tables fill and that Img4Record does not keep.
struct Img4Container {
    DERItem magic;
    DERItem payload; // the whole encoding
    DERItem manifest;
    DERItem restoreInfo;
};

struct Img4PayloadWithProperties {
    DERItem magic;
    DERItem type;
    DERItem version;
    DERItem data;
    DERItem keybag;
    DERItem compression;
    DERItem properties;
};

struct Img4Compression {
    DERItem algorithm;
    DERItem uncompressedSize;
};

struct Img4PayloadProperties {
    DERItem magic;
    DERItem properties;
};

extern const DERItemSpec DERImg4ItemSpecs[];
extern const uint16_t DERNumImg4ItemSpecs;
extern const DERItemSpec DERImg4PayloadItemSpecs[];
extern const uint16_t DERNumImg4PayloadItemSpecs;
extern const DERItemSpec DERImg4PayloadWithPropertiesItemSpecs[];
extern const uint16_t DERNumImg4PayloadWithPropertiesItemSpecs;
extern const DERItemSpec DERImg4CompressionItemSpecs[];
extern const uint16_t DERNumImg4CompressionItemSpecs;
extern const DERItemSpec DERImg4PayloadPropertiesItemSpecs[];
extern const uint16_t DERNumImg4PayloadPropertiesItemSpecs;
extern const DERItemSpec DERImg4ManifestItemSpecs[];
extern const uint16_t DERNumImg4ManifestItemSpecs;
extern const DERItemSpec DERImg4UnsignedManifestItemSpecs[];
extern const uint16_t DERNumImg4UnsignedManifestItemSpecs;
extern const DERItemSpec DERImg4RestoreInfoItemSpecs[];
extern const uint16_t DERNumImg4RestoreInfoItemSpecs;

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

// The first element with the tag `tag` in the octets of `content`.
DERReturn findFirst(const DERItem& content, DERTag tag, DERItem* found);

// The values of "MANB" and "MANP" of a record with a manifest.
DERReturn findManifestDictionaries(const Img4Record& record, DERItem* manb, DERItem* manp);

// Parsers of a value's content have the shape of DERParseInteger. This one takes the content as it is.
template <typename T>
using Parser = DERReturn (*)(const DERItem* item, T* value);

inline DERReturn parseData(const DERItem* item, DERItem* value) {
    *value = *item;
    return DERSuccess;
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
