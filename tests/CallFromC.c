/* The codecs' headers compile as C11, and their shared libraries serve a C program. */
#include <stddef.h>
#include <stdlib.h>
#include <string.h>

#include "der/DERDecode.h"
#include "der/DEREncode.h"
#include "der/DERItemSpecs.h"
#include "img4/Img4Trust.h"
#include "sysconfig/SysConfig3.h"

static int keepsASequence(void) {
    static const DERItemSpec itemSpecs[] = {{0, DERTagInteger, DEROptionSignedInteger}};
    uint8_t buffer[] = {0x30, 0x04, 0x02, 0x02, 0x00, 0xC8}, written[sizeof buffer];
    uint64_t length = sizeof written;
    const DERItem der = {buffer, sizeof buffer};
    DERItem number;
    return DERParseSequence(&der, 1, itemSpecs, &number, sizeof number) == DERSuccess &&
           DEREncodeSequence(DERTagSequence, &number, 1, itemSpecs, written, &length) == DERSuccess &&
           length == sizeof buffer && memcmp(buffer, written, sizeof buffer) == 0 &&
           DERTBSCertItemSpecs[DERNumTBSCertItemSpecs - 1].offset == offsetof(DERTBSCert, extensions);
}

static int refusesNoManifest(void) {
    static const uint8_t sequence[] = {0x30, 0x03, 0x16, 0x01, 'X'};
    Img4Record record;
    Img4Kind kind;
    Img4Refusal refusal;
    return Img4DecodeInitExplained(sequence, sizeof sequence, &record, &kind, &refusal) != DERSuccess &&
           refusal.place >= sequence && refusal.place < sequence + sizeof sequence && Img4TrustProfiles[0].root != NULL;
}

static const char* lastFormat;

static void keepFormat(int level, const char* format, ...) {
    (void)level;
    lastFormat = format;
}

static int writesAndRefusesABlob(void) {
    static const uint8_t bytes[] = {0x30, 0x01};
    uint8_t keyBytes[] = "key";
    const SysConfigData key = {keyBytes, 3};
    SysConfigData blob = {NULL, 0};
    struct __SysConfig3* object = allocSysConfig3WithHMACKey(0x62436667, 0x30002, key);
    struct __SysConfig3PayloadEntry* entry = allocSysConfig3PayloadEntryWithData(0x57436830, NULL, bytes, sizeof bytes);
    struct __SysConfig3MetadataEntry* metadata = allocSysConfig3MetadataEntry("name", NULL, 0, "value");
    SysConfig3Refusal refusal;
    setSysConfig3LogHandler(keepFormat);
    sysConfig3AddPayloadEntry(object, NULL);
    const int isWritten = sysConfig3AddPayloadEntry(object, entry) && sysConfig3AddMetadataEntry(object, metadata) &&
                          encodeSysConfig3(object, &blob);
    free(blob.data);
    deallocSysConfig3MetadataEntry(metadata);
    deallocSysConfig3PayloadEntry(entry);
    deallocSysConfig3(object);
    return isWritten && decodeSysConfig3Explained(bytes, sizeof bytes, &refusal) == NULL && lastFormat != NULL &&
           refusal.place >= bytes && refusal.place <= bytes + sizeof bytes;
}

int main(void) {
    return keepsASequence() && refusesNoManifest() && writesAndRefusesABlob() ? 0 : 1;
}
