/* The codecs' headers compile as C11, their shared libraries serve a C program, and the records of what was refused are
   laid out alike on both sides. */
#include <stddef.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include "der/DERDecode.h"
#include "der/DEREncode.h"
#include "der/DERItemSpecs.h"
#include "img4/Img4Trust.h"
#include "sysconfig/SysConfig3.h"

static int failures;

static void check(bool good, const char* what) {
    if (!good)
        (void)fprintf(stderr, "failed: %s\n", what);
    failures += !good;
}

/* DER */

typedef struct Pair {
    DERItem name;
    DERItem count;
} Pair;

static void checkDER(void) {
    static const DERItemSpec pairItemSpecs[] = {
        {offsetof(Pair, name), DERTagIA5String, 0},
        {offsetof(Pair, count), DERTagInteger, DEROptionSignedInteger},
    };
    uint8_t buffer[] = {0x30, 0x08, 0x16, 0x02, 'a', 'b', 0x02, 0x02, 0x00, 0xC8}, written[sizeof buffer];
    uint64_t length = sizeof written;
    const DERItem der = {buffer, sizeof buffer};
    Pair read;
    DERRefusal why;
    check(DERParseSequence(&der, 2, pairItemSpecs, &read, sizeof read) == DERSuccess &&
              DEREncodeSequence(DERTagSequence, &read, 2, pairItemSpecs, written, &length) == DERSuccess &&
              length == sizeof buffer && memcmp(buffer, written, sizeof buffer) == 0,
          "parsing and encoding");
    check(DERTBSCertItemSpecs[DERNumTBSCertItemSpecs - 1].offset == offsetof(DERTBSCert, extensions), "tables");
    buffer[6] = 0x04; /* the tag of the second item */
    check(DERParseSequenceExplained(&der, 2, pairItemSpecs, &read, sizeof read, 0, &why) == DERUnexpectedTag &&
              why.fault == DERFaultTag && why.row == 1 && why.place == buffer + 6 && why.item == buffer + 6 &&
              why.tag == DERTagOctetString && why.expected == DERTagInteger,
          "DERRefusal");
}

/* Img4 */

/* A manifest with the object "sepi", which carries "eksp" with the value true. */
static uint8_t manifest[] = {0x30, 0x55, 0x16, 0x04, 0x49, 0x4D, 0x34, 0x4D, 0x02, 0x01, 0x00, 0x31, 0x45, 0xFF, 0x84,
                             0xEA, 0x85, 0x9C, 0x42, 0x3E, 0x30, 0x3C, 0x16, 0x04, 0x4D, 0x41, 0x4E, 0x42, 0x31, 0x34,
                             0xFF, 0x84, 0xEA, 0x85, 0x9C, 0x50, 0x0A, 0x30, 0x08, 0x16, 0x04, 0x4D, 0x41, 0x4E, 0x50,
                             0x31, 0x00, 0xFF, 0x87, 0x9B, 0x95, 0xE0, 0x69, 0x1C, 0x30, 0x1A, 0x16, 0x04, 0x73, 0x65,
                             0x70, 0x69, 0x31, 0x12, 0xFF, 0x86, 0xAB, 0xAD, 0xE6, 0x70, 0x0B, 0x30, 0x09, 0x16, 0x04,
                             0x65, 0x6B, 0x73, 0x70, 0x01, 0x01, 0xFF, 0x04, 0x01, 0x01, 0x30, 0x00};

static DERReturn countProperties(DERTag tag, const Img4PropertyValue* value, uint32_t selector, void* context) {
    unsigned* count = context;
    *count += tag != 0 && value->tag == DERTagBoolean && selector == Img4SelectorObject;
    return DERSuccess;
}

static void checkImg4(void) {
    const uint32_t sepi = Img4FourCC('s', 'e', 'p', 'i');
    const Img4TrustCallbacks callbacks = {countProperties, NULL, NULL};
    const Img4TrustProfileEntry* entry = &Img4TrustProfiles[0];
    Img4Record record;
    Img4Kind kind;
    Img4Refusal refusal;
    Img4DomainProfile made;
    Img4TrustRefusal trust;
    unsigned count = 0;
    check(Img4DecodeInitExplained(manifest, sizeof manifest, &record, &kind, &refusal) == DERSuccess &&
              kind == Img4KindManifest,
          "initialisation");
    check(Img4DecodeMakeDomainProfile(entry, entry->root, &Img4BuiltInTrustDomain, &made) == DERSuccess &&
              Img4DecodePerformTrustEvaluationExplained(&sepi, &record, &callbacks, &made.profile, &count, &trust) ==
                  Img4Failure &&
              trust.refusal.status == Img4Failure && trust.chain.fault == Img4ChainLength &&
              trust.signature.fault == Img4SignatureSound && count == 0,
          "Img4TrustRefusal");
    manifest[4] = 'X'; /* in the magic */
    check(Img4DecodeInitExplained(manifest, sizeof manifest, &record, &kind, &refusal) == DERUnexpectedTag &&
              refusal.fault == Img4FaultMagic && refusal.place > manifest && refusal.place < manifest + 8,
          "Img4Refusal");
}

/* SysConfig3 */

static const char* lastFormat;

static void keepFormat(int level, const char* format, ...) {
    (void)level;
    lastFormat = format;
}

static void checkSysConfig3(void) {
    static const uint8_t bytes[] = {1, 2};
    uint8_t keyBytes[] = "key";
    const SysConfigData key = {keyBytes, 3};
    SysConfigData blob = {NULL, 0};
    struct __SysConfig3* object = allocSysConfig3WithHMACKey(0x62436667, 0x30002, key);
    struct __SysConfig3PayloadEntry* entry = allocSysConfig3PayloadEntryWithData(0x57436830, NULL, bytes, sizeof bytes);
    struct __SysConfig3MetadataEntry* metadata = allocSysConfig3MetadataEntry("name", NULL, 0, "value");
    check(sysConfig3AddPayloadEntry(object, entry) && sysConfig3AddMetadataEntry(object, metadata) &&
              encodeSysConfig3(object, &blob),
          "additions");
    setSysConfig3LogHandler(keepFormat);
    blob.data[blob.length - 1 - 32 - 2 - 32 - 2 - 32 - 2 - 1] = 0x31; /* the manifest's SEQUENCE */
    SysConfig3Refusal refusal;
    check(decodeSysConfig3Explained(blob.data, blob.length, &refusal) == NULL &&
              refusal.subject == SysConfig3SubjectManifest && refusal.status == DERUnexpectedTag &&
              refusal.place == blob.data + blob.length - 104 && refusal.encoding.fault == DERFaultTag &&
              refusal.encoding.tag == DERTagSet && lastFormat != NULL,
          "SysConfig3Refusal");
    free(blob.data);
    deallocSysConfig3MetadataEntry(metadata);
    deallocSysConfig3PayloadEntry(entry);
    deallocSysConfig3(object);
}

int main(void) {
    checkDER();
    checkImg4();
    checkSysConfig3();
    return failures;
}
