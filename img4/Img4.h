// Img4, the DER-encoded signed container of firmware images and boot manifests: a decoder that checks the structure of
// a buffer, records where each field lies, and answers questions about it.
//
// Nothing is allocated, and no data is copied but digests: every item is a view into the buffer given to the
// initialisation, which the caller keeps alive and unchanged for as long as the record or a view is used. There is no
// shared state. One thread at a time uses a record; distinct records may be used at once.
//
// The format, with the tags of DERTypes.h:
//
//   Container    SEQUENCE { "IMG4", Payload, [0] { Manifest } OPTIONAL, [1] { RestoreInfo } OPTIONAL }
//   Payload      SEQUENCE { "IM4P", type IA5String, version IA5String, data OCTET STRING, keybag OCTET STRING OPTIONAL,
//                           SEQUENCE { algorithm INTEGER, uncompressed size INTEGER } OPTIONAL,
//                           [0] { SEQUENCE { "PAYP", SET OF Property } } OPTIONAL }
//   Manifest     SEQUENCE { "IM4M", version INTEGER, body SET { "MANB" }, signature OCTET STRING, chain SEQUENCE }
//   "MANB"       a Property; its value, a SET (a SEQUENCE when the version is 2), holds the Property "MANP", whose
//                value is the SET of the manifest's own properties, and one Property for each object, named after the
//                image it describes, whose value is the SET of the object's properties
//   RestoreInfo  SEQUENCE { "IM4R", SET OF Property }
//   Property     [PRIVATE name] { SEQUENCE { name IA5String, value } }
//
// Quoted names are IA5Strings of four characters, called four-character codes here. As a number such a code has its
// first character in the most significant byte. A string of another length equals no code.
//
// Every operation returns a status and never reads outside the buffer, whatever it holds. An argument that is missing
// (null) gives DERParamError. In this decoder
//   DEREndOfSequence     says that what was asked for is absent,
//   DERUnexpectedTag     also stands for a wrong magic, a wrong type of value, and a version above 2,
//   DERParamError        also for a compression algorithm above 1 and for payload properties that are required and
//                        absent,
//   DERBufferOverflow    also for a length that does not match and for a digest that is too long.
// After a failed initialisation the record must not be queried.
#ifndef VELTRA_IMG4_H
#define VELTRA_IMG4_H

#include "der/DERTypes.h"

#if defined(__GNUC__)
#define IMG4_API __attribute__((visibility("default")))
#else
#define IMG4_API
#endif

#ifdef __cplusplus
extern "C" {
#endif

// Records

// The longest digest that a record holds and that the digest operations give out.
#define Img4MaxDigestLength 48

// The four-character code that the characters spell, and the tag of the property that a code names: private,
// constructed, with the code as tag number.
#define Img4FourCC(a, b, c, d) ((uint32_t)(a) << 24 | (uint32_t)(b) << 16 | (uint32_t)(c) << 8 | (uint32_t)(d))
#define Img4PropertyTag(fourCC) DERTagPrivateConstructed((uint64_t)(uint32_t)(fourCC))

// A failure that none of the codes of DERReturn describes. Returned only where an operation says so.
#define Img4Failure ((DERReturn)UINT32_C(0xFFFFFFFF))

typedef struct Img4PayloadRecord {
    DERItem magic;
    DERItem type;
    DERItem version;
    DERItem data;
    // Optional.
    DERItem keybag;
    // Optional: the content of the SEQUENCE.
    DERItem compression;
    uint8_t digest[Img4MaxDigestLength];
} Img4PayloadRecord;

typedef struct Img4ManifestRecord {
    DERItem magic;
    DERItem version;
    // The whole encoding of the SET, which is what the signature covers.
    DERItem body;
    // Absent in an unsigned manifest, like the chain.
    DERItem signature;
    DERItem certChain;
    // The constraints that the leaf certificate carries. Filled by trust evaluation.
    DERItem certProperties;
    uint8_t digest[Img4MaxDigestLength];
    uint8_t bodyDigest[Img4MaxDigestLength];
} Img4ManifestRecord;

typedef struct Img4RestoreInfoRecord {
    DERItem magic;
    // The content of the SET.
    DERItem properties;
} Img4RestoreInfoRecord;

// What is known of one buffer. Owns nothing.
typedef struct Img4Record {
    // Not zero once payload.digest or manifest.digest holds the digest of the raw encoding. Set by trust evaluation.
    uint8_t payloadHashed;
    uint8_t manifestHashed;
    DERItem payloadRaw;
    DERItem manifestRaw;
    // The values of "MANB", of "MANP" and of the evaluated object. Filled by trust evaluation.
    DERItem manb;
    DERItem manp;
    DERItem objp;
    Img4PayloadRecord payload;
    Img4ManifestRecord manifest;
    Img4RestoreInfoRecord restoreInfo;
} Img4Record;

typedef struct Img4Property {
    DERItem name;
    DERTag tag;
    // The content of the value.
    DERItem value;
    DERTag valueTag;
} Img4Property;

// Refusals
//
// The operations that end in Explained say what they refused, where, and why, in a record of the caller's, for programs
// that tell people. Their results are those of the operations they are named after.

// What was refused, in the order in which it is looked at.
typedef enum Img4Subject {
    Img4SubjectNone,
    // The file and the parts of it that an initialisation checks.
    Img4SubjectFile,
    Img4SubjectContainer,
    Img4SubjectPayload,
    Img4SubjectCompression,
    Img4SubjectPayloadProperties,
    Img4SubjectManifest,
    Img4SubjectRestoreInfo,
    // One property that the caller holds.
    Img4SubjectProperty,
    // The steps of trust evaluation (Img4Trust.h).
    Img4SubjectArguments,
    Img4SubjectManifestDigest,
    Img4SubjectChain,
    Img4SubjectBodyDigest,
    Img4SubjectSignature,
    Img4SubjectBody, // "MANB" in the manifest's body
    Img4SubjectManb, // "MANP" in "MANB"
    Img4SubjectObject,
    Img4SubjectConstraints,
    Img4SubjectPayloadDigest,
    Img4SubjectManifestProperties,
    Img4SubjectObjectProperties
} Img4Subject;

// Why. What is "it" is the subject, and for properties the one that the refusal's tag and place tell.
typedef enum Img4Fault {
    Img4FaultNone,
    Img4FaultEncoding,  // it is no DER, or not the SEQUENCE that it should be: `encoding` says why
    Img4FaultMagic,     // its magic, `found`, is another
    Img4FaultNumber,    // its number, `found`, is negative, not in its shortest form, or exceeds 32 bits
    Img4FaultRange,     // its number, `found`, is above the last that there is
    Img4FaultLength,    // octets follow it
    Img4FaultAbsent,    // a property of that tag is not there
    Img4FaultTag,       // an element with this tag is no property, or none that may stand there
    Img4FaultName,      // the property is named `found` inside, or has no name
    Img4FaultValueType, // the property's value has another tag, `encoding.tag`, than may stand there
    Img4FaultValue,     // the property has another value than a constraint demands
    Img4FaultPresent,   // the property is there, and a constraint forbids it
    Img4FaultOther      // `status`, which a callback or a digest has given, says all there is
} Img4Fault;

typedef struct Img4Refusal {
    Img4Subject subject;
    Img4Fault fault;
    DERReturn status;     // the result of the operation
    const uint8_t* place; // the octet at fault, in the input or one past its end
    DERTag tag;           // of the property; 0 when the header of one cannot be read
    DERItem found;
    DERRefusal encoding;
} Img4Refusal;

// Initialisation
//
// Each zeroes the whole record before anything else, then checks the `length` octets at `buffer` in the order of the
// format and records the fields. The first check that fails gives the status.

// A whole container, which must fill the buffer exactly (DERBufferOverflow otherwise). payloadRaw becomes the payload's
// whole encoding, manifestRaw the content of [0].
IMG4_API DERReturn Img4DecodeInit(const uint8_t* buffer, uint64_t length, Img4Record* record);

// A bare payload. payloadRaw becomes the buffer as it is; octets after the payload are not looked at.
IMG4_API DERReturn Img4DecodeInitPayload(const uint8_t* buffer, uint64_t length, Img4Record* record);

// A bare manifest, which must fill the buffer exactly (DERBufferOverflow otherwise); the second without signature and
// chain.
IMG4_API DERReturn Img4DecodeInitManifest(const uint8_t* buffer, uint64_t length, Img4Record* record);
IMG4_API DERReturn Img4DecodeInitUnsignedManifest(const uint8_t* buffer, uint64_t length, Img4Record* record);

// What a buffer holds, by its magic. A manifest is unsigned when it can be read as nothing but that.
typedef enum Img4Kind {
    Img4KindUnknown,
    Img4KindContainer,
    Img4KindPayload,
    Img4KindManifest,
    Img4KindUnsignedManifest
} Img4Kind;

// Finds out the kind and does that kind's initialisation, which gives the result; no kind is DERUnexpectedTag, or
// DERDecodeError for no DER. *refusal, which may not be null, says what was refused first. After a failure the record
// holds what could be read all the same, the parts behind the refused one included: to be shown, not to be queried.
IMG4_API DERReturn Img4DecodeInitExplained(const uint8_t* buffer, uint64_t length, Img4Record* record, Img4Kind* kind,
                                           Img4Refusal* refusal);

// Payload
//
// A payload is present when its data is there and not empty. Without one, all but Img4DecodePayloadExists return
// DEREndOfSequence. On any failure the out-values are cleared: items absent, numbers 0, booleans false, and the two
// numbers of the compression 0xFFFFFFFF.

IMG4_API DERReturn Img4DecodePayloadExists(const Img4Record* record, bool* exists);
IMG4_API DERReturn Img4DecodeGetPayload(const Img4Record* record, DERItem* data);

// The type as the number that its characters spell.
IMG4_API DERReturn Img4DecodeGetPayloadType(const Img4Record* record, uint32_t* type);
IMG4_API DERReturn Img4DecodeGetPayloadVersion(const Img4Record* record, DERItem* version);

// An empty keybag does not exist. A payload without a keybag gives an absent item and success.
IMG4_API DERReturn Img4DecodePayloadKeybagExists(const Img4Record* record, bool* exists);
IMG4_API DERReturn Img4DecodeGetPayloadKeybag(const Img4Record* record, DERItem* keybag);

// A payload without compression information gives DEREndOfSequence.
IMG4_API DERReturn Img4DecodePayloadCompressionInfoExists(const Img4Record* record, bool* exists);
IMG4_API DERReturn Img4DecodeGetPayloadCompressionInfo(const Img4Record* record, uint32_t* algorithm,
                                                       uint32_t* uncompressedSize);

// Payload properties
//
// They are not kept in the record: every operation decodes payloadRaw again, so that a record without a payload gives
// DERDecodeError. Absent properties give DERParamError. A failure leaves the out-values as they were.

// Succeeds with false when the payload has no properties.
IMG4_API DERReturn Img4DecodePayloadPropertiesExists(const Img4Record* record, bool* exists);

// The content of [0]: the encoded SEQUENCE of magic and SET.
IMG4_API DERReturn Img4DecodeGetPayloadProperties(const Img4Record* record, DERItem* properties);

// The first property with the property tag `tag`; its value must have the tag `valueType`.
IMG4_API DERReturn Img4DecodePayloadProperty(const Img4Record* record, DERTag tag, DERTag valueType,
                                             Img4Property* property);
IMG4_API DERReturn Img4DecodeGetPayloadPropertiesBoolean(const Img4Record* record, DERTag tag, bool* value);
IMG4_API DERReturn Img4DecodeGetPayloadPropertiesInteger(const Img4Record* record, DERTag tag, uint32_t* value);
IMG4_API DERReturn Img4DecodeGetPayloadPropertiesInteger64(const Img4Record* record, DERTag tag, uint64_t* value);
IMG4_API DERReturn Img4DecodeGetPayloadPropertiesData(const Img4Record* record, DERTag tag, DERItem* value);

// Whether an element with the tag `tag` is there, whatever it holds. When none is, *exists is false and the result is
// DEREndOfSequence.
IMG4_API DERReturn Img4DecodePayloadPropertyExistsByTag(const Img4Record* record, DERTag tag, bool* exists);

// The content of the value of the first property named `name` in `properties`, an item that
// Img4DecodeGetPayloadProperties gave out. Here the name inside the property counts, not its tag, and elements that are
// no properties are passed over. Returns DERParamError when the magic is not "PAYP", DERUnexpectedTag when the value is
// empty, DEREndOfSequence when no property has that name.
IMG4_API DERReturn Img4DecodePayloadPropertiesFindItemWithTag(const DERItem* properties, uint32_t name, DERItem* value);

// The content of the value, of whatever type, of the property `tag` among those that the value of another property
// holds. `property` is the content of that other property's element: a SEQUENCE of its name and a SET or SEQUENCE of
// properties.
IMG4_API DERReturn Img4DecodeGetPayloadVersionPropertyString(const DERItem* property, DERTag tag, DERItem* value);

// Manifest and restore information

// The dictionaries that properties are looked up in by section.
enum {
    Img4SectionManifest = 0,   // the properties in "MANP"
    Img4SectionRestoreInfo = 1 // the properties of the restore information
};

IMG4_API DERReturn Img4DecodeManifestExists(const Img4Record* record, bool* exists);

// Start and length of manifestRaw. Returns Img4Failure and clears both when there is no manifest, DERBufferOverflow
// when its length does not fit 32 bits.
IMG4_API DERReturn Img4DecodeGetManifest(const Img4Record* record, const uint8_t** start, uint32_t* length);

// A section that is none of the above gives DERParamError.
IMG4_API DERReturn Img4DecodeSectionExists(const Img4Record* record, uint32_t section, bool* exists);
IMG4_API DERReturn Img4DecodeRestoreInfoExists(const Img4Record* record, bool* exists);

// Properties of a section
//
// Each finds the first property with the tag, in a section that is present (DEREndOfSequence otherwise). A manifest
// without "MANP" fails every lookup with DEREndOfSequence, those of the objects below included. The value must have the
// type asked for. A failure clears properties and data, leaves a boolean as it was, and sets a number to 0 only when
// the value was found and is no non-negative INTEGER that fits.

// `tag` is the whole property tag.
IMG4_API DERReturn Img4DecodeGetPropertyFromSection(const Img4Record* record, uint32_t section, DERTag tag,
                                                    DERTag valueType, Img4Property* property);

// `name` is the property's four-character code.
IMG4_API DERReturn Img4DecodeGetBooleanFromSection(const Img4Record* record, uint32_t section, uint32_t name,
                                                   bool* value);
IMG4_API DERReturn Img4DecodeGetIntegerFromSection(const Img4Record* record, uint32_t section, uint32_t name,
                                                   uint32_t* value);
IMG4_API DERReturn Img4DecodeGetInteger64FromSection(const Img4Record* record, uint32_t section, uint32_t name,
                                                     uint64_t* value);
IMG4_API DERReturn Img4DecodeGetDataFromSection(const Img4Record* record, uint32_t section, uint32_t name,
                                                DERItem* value);

// The same in the restore information.
IMG4_API DERReturn Img4DecodeGetRestoreInfoBoolean(const Img4Record* record, uint32_t name, bool* value);
IMG4_API DERReturn Img4DecodeGetRestoreInfoInteger(const Img4Record* record, uint32_t name, uint32_t* value);
IMG4_API DERReturn Img4DecodeGetRestoreInfoInteger64(const Img4Record* record, uint32_t name, uint64_t* value);
IMG4_API DERReturn Img4DecodeGetRestoreInfoData(const Img4Record* record, uint32_t name, DERItem* value);

// Properties of an object
//
// As for the sections, in the manifest's object with the four-character code `object`, but a failure also sets numbers
// to 0, whatever its cause. A record without a manifest gives DERDecodeError, as decoding nothing does.

// `tag` is the whole property tag.
IMG4_API DERReturn Img4DecodeGetObjectProperty(const Img4Record* record, uint32_t object, DERTag tag, DERTag valueType,
                                               Img4Property* property);

// `name` is the property's four-character code.
IMG4_API DERReturn Img4DecodeGetObjectPropertyBoolean(const Img4Record* record, uint32_t object, uint32_t name,
                                                      bool* value);
IMG4_API DERReturn Img4DecodeGetObjectPropertyInteger(const Img4Record* record, uint32_t object, uint32_t name,
                                                      uint32_t* value);
IMG4_API DERReturn Img4DecodeGetObjectPropertyInteger64(const Img4Record* record, uint32_t object, uint32_t name,
                                                        uint64_t* value);
IMG4_API DERReturn Img4DecodeGetObjectPropertyData(const Img4Record* record, uint32_t object, uint32_t name,
                                                   DERItem* value);
IMG4_API DERReturn Img4DecodeGetObjectPropertyString(const Img4Record* record, uint32_t object, uint32_t name,
                                                     DERItem* value);

// Single properties

// Finds the first element with the tag `tag` in `dictionary`, the content of a SET or SEQUENCE of properties, and
// checks that it is a property of that name with a value of the tag `valueType`. Returns DEREndOfSequence when no
// element has the tag, DERUnexpectedTag for a wrong name or type of value, DERIncompleteSequence without and
// DERDecodeError with more than a value. *property is written on success only.
IMG4_API DERReturn DERImg4DecodeFindProperty(const DERItem* dictionary, DERTag tag, DERTag valueType,
                                             Img4Property* property);

// Decodes one property that the caller holds: `item` is the content of its element, a SEQUENCE of name and value, which
// must fill it exactly (DERBufferOverflow otherwise). The name must be that of the property tag `tag`; the value may
// have any tag, which is recorded in *property. A third element gives DERUnexpectedTag, a missing value
// DERIncompleteSequence. *property is written on success only.
IMG4_API DERReturn DERImg4DecodeProperty(const DERItem* item, DERTag tag, Img4Property* property);

// The same, and unless `refusal` is null, in *refusal why it fails: with Img4FaultNone when it does not.
IMG4_API DERReturn DERImg4DecodePropertyExplained(const DERItem* item, DERTag tag, Img4Property* property,
                                                  Img4Refusal* refusal);

// The values of "MANB" and "MANP", which every lookup in a manifest stands on, and on failure why they are not found.
IMG4_API DERReturn Img4DecodeFindDictionariesExplained(const Img4Record* record, DERItem* manb, DERItem* manp,
                                                       Img4Refusal* refusal);

// The value of such a property with the four-character code `name`. A failure clears numbers and data and leaves a
// boolean as it was.
IMG4_API DERReturn Img4DecodeGetPropertyBoolean(const DERItem* item, uint32_t name, bool* value);
IMG4_API DERReturn Img4DecodeGetPropertyInteger(const DERItem* item, uint32_t name, uint32_t* value);
IMG4_API DERReturn Img4DecodeGetPropertyInteger64(const DERItem* item, uint32_t name, uint64_t* value);
IMG4_API DERReturn Img4DecodeGetPropertyData(const DERItem* item, uint32_t name, DERItem* value);

// Digests
//
// The Hash operations give the SHA-1 (FIPS 180-4) of the raw encoding, the Digest operations the digest of a trust
// profile. An absent payload or manifest gives DEREndOfSequence. When the record holds the digest already, as its flags
// tell, all of them copy the first octets of that one instead of computing.

#define Img4HashLength 20

// Digests the `length` octets at `data` into the Img4HashLength octets at `out`. `context` is the pointer given to the
// operation; the result of the operation is that of the callback.
typedef DERReturn (*Img4DigestFunction)(const uint8_t* data, uint64_t length, uint8_t* out, void* context);

typedef struct Img4TrustProfile Img4TrustProfile;
struct Img4DigestInfo;

// The operations and algorithms that a signer's domain uses.
struct Img4TrustProfile {
    // Digests `data` into the `length` octets at `out`, which must be the length of the profile's digest.
    DERReturn (*computeDigest)(const DERItem* data, uint8_t* out, uint64_t length, const Img4TrustProfile* profile);
    // Verifies the certificates in `certChain`, the content of the manifest's chain, up to the profile's root. Gives
    // out the leaf's public key and, when the leaf carries any, its constraints.
    DERReturn (*verifyChain)(const DERItem* certChain, DERItem* leafKey, DERItem* certProperties,
                             const Img4TrustProfile* profile);
    // Verifies `signature` over a digest of `length` octets with `key`.
    DERReturn (*verifySignature)(const DERItem* key, const DERItem* signature, const uint8_t* digest, uint64_t length,
                                 const Img4TrustProfile* profile);
    // Checks the manifest and the evaluated object against the leaf's constraints.
    DERReturn (*evaluateCertificateProperties)(const Img4Record* record);
    const struct Img4DigestInfo* digestInfo;
    // The signature algorithm that every certificate of the chain must name, and the algorithm or curve of the keys.
    const DERItem* signatureAlgorithmOid;
    const DERItem* keyAlgorithmOid;
};

// `length` must be Img4HashLength, or the result is DERParamError. Returns Img4Failure when the hash could not be
// computed for want of memory.
IMG4_API DERReturn Img4DecodeCopyPayloadHash(const Img4Record* record, uint8_t* out, uint64_t length);
IMG4_API DERReturn Img4DecodeCopyManifestHash(const Img4Record* record, uint8_t* out, uint64_t length);

// The same with the digest function of the caller.
IMG4_API DERReturn Img4DecodeCopyPayloadHashWithCallback(const Img4Record* record, uint8_t* out, uint64_t length,
                                                         Img4DigestFunction digest, void* context);
IMG4_API DERReturn Img4DecodeCopyManifestHashWithCallback(const Img4Record* record, uint8_t* out, uint64_t length,
                                                          Img4DigestFunction digest, void* context);

// `length` is at most Img4MaxDigestLength, or the result is DERBufferOverflow. Otherwise the result is that of the
// profile's operation.
IMG4_API DERReturn Img4DecodeCopyPayloadDigest(const Img4Record* record, uint8_t* out, uint64_t length,
                                               const Img4TrustProfile* profile);
IMG4_API DERReturn Img4DecodeCopyManifestDigest(const Img4Record* record, uint8_t* out, uint64_t length,
                                                const Img4TrustProfile* profile);

// The same over an item of the caller's, for one that Img4DecodeGetPayloadProperties gave out. An absent item gives
// DERParamError.
IMG4_API DERReturn Img4DecodeCopyPayloadPropertiesDigest(const DERItem* properties, uint8_t* out, uint64_t length,
                                                         const Img4TrustProfile* profile);

// Length

// Finds the length of a whole container from its first octets, which need to reach no further than the magic. Returns
// DERUnexpectedTag when they are no SEQUENCE or the magic is another or cut short, DERDecodeError when they are no
// strict DER or a length is 0, DERBufferOverflow when the length exceeds 64 bits, and Img4Failure when `buffer` or
// `total` is null. *total is 0 on failure.
IMG4_API DERReturn Img4DecodeParseLengthFromBuffer(const uint8_t* buffer, uint64_t length, uint64_t* total);

// The same for an item whose magic is `magic`, for instance a bare payload.
IMG4_API DERReturn Img4DecodeParseLengthFromBufferWithTag(const uint8_t* buffer, uint64_t length, uint32_t magic,
                                                          uint64_t* total);

#ifdef __cplusplus
}
#endif

#endif
