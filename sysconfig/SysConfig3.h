// SysConfig3, the system-configuration blob of a handset: an object with a magic and a version, payload entries keyed
// by a 32-bit number, metadata entries keyed by a text, and a manifest of three HMACs. This header decodes a blob,
// reads and changes the object, and encodes it again.
//
//     struct __SysConfig3* object = decodeSysConfig3(blob, blobLength);
//     struct __SysConfig3PayloadEntry* entry = allocSysConfig3PayloadEntryWithData(0x57436830, NULL, bytes, length);
//     SysConfigData out;
//     if (sysConfig3AddPayloadEntry(object, entry) && encodeSysConfig3(object, &out)) {
//         ... out.data, out.length ...
//         free(out.data);
//     }
//     deallocSysConfig3PayloadEntry(entry);
//     deallocSysConfig3(object);
//
// Failure. Every operation accepts a null for every pointer. A failure is a null or false result; it leaves the object
// as it was and writes no output, unless the operation says otherwise, and says what is wrong through the log hook. A
// few operations keep silent about a null argument: the copies, sysConfig3GetMetadataEntryForKey for a null key,
// sysConfig3MetadataEntryGetData, and the creation of the payload and metadata HMACs for a null object.
// Running out of memory is such a failure too: the library neither throws nor aborts.
//
// Ownership. What an alloc, copy or decode operation returns belongs to the caller, who releases it with the dealloc
// operation of the same kind. What a get operation returns belongs to the object or entry that it was asked of, and is
// valid until that is released or, for an entry of an object, removed or replaced. Byte and text arguments are copied.
// C++ callers find owning pointers in SysConfig3Ptr.h.
//
// Threads. Nothing is locked. One object and its entries must not be used by two threads at once while one of them
// changes it. Distinct objects are independent of each other.
#ifndef VELTRA_SYSCONFIG_SYSCONFIG3_H
#define VELTRA_SYSCONFIG_SYSCONFIG3_H

#include <stdbool.h>
#include <stdint.h>

#include "der/DERTypes.h"

#if defined(__GNUC__)
#define SYSCONFIG3_API __attribute__((visibility("default")))
#define SYSCONFIG3_PRINTF(text, arguments) __attribute__((format(printf, text, arguments)))
#else
#define SYSCONFIG3_API
#define SYSCONFIG3_PRINTF(text, arguments)
#endif

#ifdef __cplusplus
extern "C" {
#endif

// Types

// A byte string. `data` is null when `length` is 0. Whether it owns its bytes or views them is said where it is used;
// bytes of a view must be neither changed nor released.
typedef struct SysConfigData {
    uint8_t* data;
    uint32_t length;
} SysConfigData;

// A four-character code with the first character in the most significant byte: "bCfg" is 0x62436667.
typedef uint32_t SysConfig3Magic;

// 0x30001, 0x30002 or 0x30003. Only 0x30002 carries HMACs, and only 0x30003 takes new entries with the deleted flag.
typedef uint32_t SysConfig3Version;

// The records of the library. Callers hold pointers to them.
struct __SysConfig3;
struct __SysConfig3PayloadEntry;
struct __SysConfig3MetadataEntry;
struct __SysConfig3ManifestEntry;

// Reporting hooks
//
// Two functions of the process, initially none. Set them before the library is used; a null removes a hook. They are
// called on the thread of the operation that reports and must not call back into the library with the objects at hand.

// Receives every message: its level, which is always 2, a printf format and the arguments. In most messages the format
// begins with "%s " and the first argument is the prototype of the operation that reports.
typedef void (*SysConfig3LogHandler)(int level, const char* format, ...) SYSCONFIG3_PRINTF(2, 3);

// Receives reports about records that the operations of this header never make: a printf format and the arguments.
typedef void (*SysConfig3ExceptionHandler)(const char* format, ...) SYSCONFIG3_PRINTF(1, 2);

SYSCONFIG3_API void setSysConfig3LogHandler(SysConfig3LogHandler handler);
SYSCONFIG3_API SysConfig3LogHandler getSysConfig3LogHandler(void);
SYSCONFIG3_API void setSysConfig3ExceptionHandler(SysConfig3ExceptionHandler handler);
SYSCONFIG3_API SysConfig3ExceptionHandler getSysConfig3ExceptionHandler(void);

// Blobs
//
// A blob is a DER SEQUENCE of magic, version, payload, metadata and manifest. Its integers hold 32-bit values with the
// least significant octet first. Entries stand in the order of the object's lists.

// Decodes the `length` octets at `data`, which are only read, into a new object. Octets after the blob are ignored.
// Returns null for octets that are not such a blob, for an unsupported magic or version, and for an entry that is not
// well formed; nothing is reported when the outer SEQUENCE is at fault. These do not make it fail:
// - an entry with key 0, with no or several kinds of value, or with empty data: it is reported and left out;
// - a key that occurred before: the later entry replaces the earlier one and stands at its own place;
// - a manifest without exactly three HMACs: it is reported, and the object keeps the manifest of a new one;
// - HMACs that do not match: they are examined when the object is changed or encoded;
// - an entry with the deleted flag in any version.
SYSCONFIG3_API struct __SysConfig3* decodeSysConfig3(const uint8_t* data, uint32_t length);

// What was refused in a blob, in the order in which it is looked at.
typedef enum SysConfig3Subject {
    SysConfig3SubjectNone,
    SysConfig3SubjectBlob,
    SysConfig3SubjectMagic,
    SysConfig3SubjectVersion,
    SysConfig3SubjectPayload,
    SysConfig3SubjectPayloadEntry,
    SysConfig3SubjectMetadata,
    SysConfig3SubjectMetadataEntry,
    SysConfig3SubjectManifest
} SysConfig3Subject;

typedef struct SysConfig3Refusal {
    SysConfig3Subject subject;
    DERReturn status; // DERSuccess for a value that is not supported, DERBufferOverflow when memory is lacking
    const uint8_t*
        place;           // where the item at fault begins, or where a missing one would; without a fault the blob's end
    DERRefusal encoding; // why an item was refused, unless its fault is DERFaultNone: then `status` says all there is
} SysConfig3Refusal;

// The same, and says in *refusal, which may be null, why there is no object.
SYSCONFIG3_API struct __SysConfig3* decodeSysConfig3Explained(const uint8_t* data, uint32_t length,
                                                              SysConfig3Refusal* refusal);

// Encodes the object into a new buffer: out->data, which the caller releases with free(), and out->length. The object
// is only read, and its manifest is written as it stands, so an object of version 0x30002 must hold valid HMACs. Fails
// when it does not, and when the blob would exceed 32 bits of length. On failure *out is left as it was.
SYSCONFIG3_API bool encodeSysConfig3(const struct __SysConfig3* object, SysConfigData* out);

// Objects

// True for the codes "0Cfg", "appv", "bCfg", "dCfg", "eCfg", "fCfg", "mCfg", "seal" and "tCfg".
SYSCONFIG3_API bool isSupportedSysConfig3Magic(SysConfig3Magic magic);

// True for 0x30001, 0x30002 and 0x30003.
SYSCONFIG3_API bool isSupportedSysConfig3Version(SysConfig3Version version);

// A new object without entries and without a key. Each HMAC of its manifest is the single octet 0x00, which stands for
// one that was never computed. Null when magic or version is not supported.
SYSCONFIG3_API struct __SysConfig3* allocSysConfig3(SysConfig3Magic magic, SysConfig3Version version);

// The same with a copy of `key` registered and the HMACs of the empty lists computed. Null as well when the version has
// no HMACs or the key is empty.
SYSCONFIG3_API struct __SysConfig3* allocSysConfig3WithHMACKey(SysConfig3Magic magic, SysConfig3Version version,
                                                               SysConfigData key);

// Releases the object with all that it owns. Does nothing for null or for an object whose magic is not supported.
SYSCONFIG3_API void deallocSysConfig3(struct __SysConfig3* object);

// True when magic, version, both lists in their order, and the manifests are equal. The keys are not compared. False
// when either object is null.
SYSCONFIG3_API bool sysConfig3ObjectsAreEqual(const struct __SysConfig3* a, const struct __SysConfig3* b);

// 0 or null for a null object.
SYSCONFIG3_API SysConfig3Magic sysConfig3GetMagic(const struct __SysConfig3* object);
SYSCONFIG3_API SysConfig3Version sysConfig3GetVersion(const struct __SysConfig3* object);
SYSCONFIG3_API const struct __SysConfig3PayloadEntry* sysConfig3GetHeadPayloadEntry(const struct __SysConfig3* object);
SYSCONFIG3_API const struct __SysConfig3MetadataEntry*
sysConfig3GetHeadMetadataEntry(const struct __SysConfig3* object);
SYSCONFIG3_API const struct __SysConfig3ManifestEntry* sysConfig3GetManifest(const struct __SysConfig3* object);
SYSCONFIG3_API uint32_t sysConfig3GetPayloadEntryCount(const struct __SysConfig3* object);
SYSCONFIG3_API uint32_t sysConfig3GetMetadataEntryCount(const struct __SysConfig3* object);

// The entry with the key, or null when there is none. Metadata keys are the same when their first 256 characters are.
SYSCONFIG3_API const struct __SysConfig3PayloadEntry* sysConfig3GetPayloadEntryForKey(const struct __SysConfig3* object,
                                                                                      uint32_t key);
SYSCONFIG3_API const struct __SysConfig3MetadataEntry*
sysConfig3GetMetadataEntryForKey(const struct __SysConfig3* object, const char* key);

// Changing the lists
//
// An add removes the entry with the same key, if there is one, and appends a copy of `entry`; the caller keeps its own.
// An entry of the object itself may be passed. A delete succeeds whether or not the key occurs. Each takes about the
// same time however long the list is, with one exception: an object of version 0x30002 has its HMACs validated before
// the change, which fails when they are not valid, and those that cover the list recomputed after it. Should that
// recomputation run out of memory, the change stands and the object needs sysConfig3UpdateHMAC.

// Fails as well for an entry with the deleted flag when the object's version is below 0x30003.
SYSCONFIG3_API bool sysConfig3AddPayloadEntry(struct __SysConfig3* object,
                                              const struct __SysConfig3PayloadEntry* entry);
SYSCONFIG3_API bool sysConfig3AddMetadataEntry(struct __SysConfig3* object,
                                               const struct __SysConfig3MetadataEntry* entry);
SYSCONFIG3_API bool sysConfig3DeletePayloadEntryForKey(struct __SysConfig3* object, uint32_t key);
SYSCONFIG3_API bool sysConfig3DeleteMetadataEntryForKey(struct __SysConfig3* object, const char* key);

// Payload entries
//
// A key other than 0, a comment, and exactly one of a string, data of at least one byte, and the deleted flag. A null
// or empty comment becomes ".". Strings are NUL-terminated and cut to 0x1000000 characters.

SYSCONFIG3_API struct __SysConfig3PayloadEntry* allocSysConfig3PayloadEntryWithString(uint32_t key, const char* comment,
                                                                                      const char* string);
SYSCONFIG3_API struct __SysConfig3PayloadEntry*
allocSysConfig3PayloadEntryWithData(uint32_t key, const char* comment, const uint8_t* data, uint32_t dataLength);
SYSCONFIG3_API struct __SysConfig3PayloadEntry* allocSysConfig3PayloadEntryDeleted(uint32_t key, const char* comment);

// A copy that belongs to no list.
SYSCONFIG3_API struct __SysConfig3PayloadEntry*
copySysConfig3PayloadEntry(const struct __SysConfig3PayloadEntry* entry);

// Releases an entry that the caller owns. Does nothing for null.
SYSCONFIG3_API void deallocSysConfig3PayloadEntry(struct __SysConfig3PayloadEntry* entry);

// True when both are null, or key, comment and value are equal.
SYSCONFIG3_API bool sysConfig3PayloadEntriesAreEqual(const struct __SysConfig3PayloadEntry* a,
                                                     const struct __SysConfig3PayloadEntry* b);

// 0, null or false for a null entry. The string is null when the entry's value is not one.
SYSCONFIG3_API uint32_t sysConfig3PayloadEntryGetKey(const struct __SysConfig3PayloadEntry* entry);
SYSCONFIG3_API const char* sysConfig3PayloadEntryGetComment(const struct __SysConfig3PayloadEntry* entry);
SYSCONFIG3_API bool sysConfig3PayloadEntryGetDeleted(const struct __SysConfig3PayloadEntry* entry);
SYSCONFIG3_API const char* sysConfig3PayloadEntryGetString(const struct __SysConfig3PayloadEntry* entry);
SYSCONFIG3_API const struct __SysConfig3PayloadEntry*
sysConfig3PayloadEntryGetNextEntry(const struct __SysConfig3PayloadEntry* entry);

// Sets *out to a view of the entry's data and returns true, or returns false when it has none.
SYSCONFIG3_API bool sysConfig3PayloadEntryGetData(const struct __SysConfig3PayloadEntry* entry, SysConfigData* out);

// Metadata entries
//
// A key of at most 256 characters, longer ones are cut, and exactly one of data of at least one byte and a string.

SYSCONFIG3_API struct __SysConfig3MetadataEntry* allocSysConfig3MetadataEntry(const char* key, const uint8_t* data,
                                                                              uint32_t dataLength, const char* string);

SYSCONFIG3_API struct __SysConfig3MetadataEntry*
copySysConfig3MetadataEntry(const struct __SysConfig3MetadataEntry* entry);
SYSCONFIG3_API void deallocSysConfig3MetadataEntry(struct __SysConfig3MetadataEntry* entry);
SYSCONFIG3_API bool sysConfig3MetadataEntriesAreEqual(const struct __SysConfig3MetadataEntry* a,
                                                      const struct __SysConfig3MetadataEntry* b);

SYSCONFIG3_API const char* sysConfig3MetadataEntryGetKey(const struct __SysConfig3MetadataEntry* entry);
SYSCONFIG3_API const char* sysConfig3MetadataEntryGetString(const struct __SysConfig3MetadataEntry* entry);
SYSCONFIG3_API bool sysConfig3MetadataEntryGetData(const struct __SysConfig3MetadataEntry* entry, SysConfigData* out);
SYSCONFIG3_API const struct __SysConfig3MetadataEntry*
sysConfig3MetadataEntryGetNextEntry(const struct __SysConfig3MetadataEntry* entry);

// Manifests

// A manifest with copies of the three HMACs, none of which may be null; an empty one is absent from the manifest. The
// version is not examined.
SYSCONFIG3_API struct __SysConfig3ManifestEntry* allocSysConfig3Manifest(SysConfig3Version version,
                                                                         const SysConfigData* payloadHMAC,
                                                                         const SysConfigData* metadataHMAC,
                                                                         const SysConfigData* fullHMAC);
SYSCONFIG3_API struct __SysConfig3ManifestEntry*
copySysConfig3Manifest(const struct __SysConfig3ManifestEntry* manifest);
SYSCONFIG3_API void deallocSysConfig3Manifest(struct __SysConfig3ManifestEntry* manifest);

// True when versions and HMACs are equal. Two absent HMACs are equal in version 0x30001 only. Two null manifests are
// not equal.
SYSCONFIG3_API bool sysConfig3ManifestsAreEqual(const struct __SysConfig3ManifestEntry* a,
                                                const struct __SysConfig3ManifestEntry* b);

SYSCONFIG3_API SysConfig3Version sysConfig3ManifestGetVersion(const struct __SysConfig3ManifestEntry* manifest);

// Set *out to a view of the HMAC, with null data when it is absent. True when neither argument is null.
SYSCONFIG3_API bool sysConfig3ManifestGetPayloadHMAC(const struct __SysConfig3ManifestEntry* manifest,
                                                     SysConfigData* out);
SYSCONFIG3_API bool sysConfig3ManifestGetMetadataHMAC(const struct __SysConfig3ManifestEntry* manifest,
                                                      SysConfigData* out);
SYSCONFIG3_API bool sysConfig3ManifestGetFullHMAC(const struct __SysConfig3ManifestEntry* manifest, SysConfigData* out);

// HMACs
//
// HMAC-SHA-256 (RFC 2104, FIPS 180-4) over the entries, in version 0x30002 only. The payload HMAC covers, for each
// payload entry in order, the four octets of the key, least significant first, the comment, and the string or data. The
// metadata HMAC covers key and value of each metadata entry; the full HMAC covers both streams, the payload first.
// Nothing separates the pieces. Magic, version and deleted flags are not covered.
//
// A decoded or newly made object has no key, and is neither changed nor encoded without one. Register the key under
// which its HMACs were made, or register a new key and call sysConfig3UpdateHMAC.

// True for version 0x30002.
SYSCONFIG3_API bool sysConfig3HMACIsSupported(SysConfig3Version version);

// Registers a copy of `key` in place of the present key. An empty key only removes the present one. The stored HMACs
// stay as they are. When the copy cannot be made the object is left without a key.
SYSCONFIG3_API bool sysConfig3SetHMACKey(struct __SysConfig3* object, SysConfigData key);

// Compute an HMAC of the entries with the registered key into a new buffer: out->data, which the caller releases with
// free(), and out->length, which is 32. When no memory is left, out->data is null and out->length 32; other failures
// leave *out as it was.
SYSCONFIG3_API bool sysConfig3CreatePayloadHMAC(const struct __SysConfig3* object, SysConfigData* out);
SYSCONFIG3_API bool sysConfig3CreateMetadataHMAC(const struct __SysConfig3* object, SysConfigData* out);
SYSCONFIG3_API bool sysConfig3CreateFullHMAC(const struct __SysConfig3* object, SysConfigData* out);

// Recomputes all three HMACs into the manifest. When one cannot be computed it stays as it was, the others are replaced
// nevertheless, and the result is false.
SYSCONFIG3_API bool sysConfig3UpdateHMAC(struct __SysConfig3* object);

// True when all three stored HMACs match the entries under the registered key. Each one that does not is reported. The
// comparison takes the same time wherever they differ.
SYSCONFIG3_API bool sysConfig3IsValidHMAC(const struct __SysConfig3* object);

#ifdef __cplusplus
}
#endif

#endif
