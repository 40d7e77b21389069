/* The header compiles as C11, and the shared library serves a C program. */
#include <stdlib.h>
#include <string.h>

#include "sysconfig/SysConfig3.h"

static const char* lastFormat = "";

static void keepFormat(int level, const char* format, ...) {
    (void)level;
    lastFormat = format;
}

/* The number of the first step that goes wrong, or 0. */
int main(void) {
    static const uint8_t bytes[] = {1, 2};
    uint8_t keyBytes[] = "key";
    const SysConfigData key = {keyBytes, 3};
    SysConfigData blob = {NULL, 0};

    struct __SysConfig3* object = allocSysConfig3WithHMACKey(0x62436667, 0x30002, key);
    struct __SysConfig3PayloadEntry* entry = allocSysConfig3PayloadEntryWithData(0x57436830, NULL, bytes, sizeof bytes);
    struct __SysConfig3MetadataEntry* metadata = allocSysConfig3MetadataEntry("name", NULL, 0, "value");
    if (!sysConfig3AddPayloadEntry(object, entry) || !sysConfig3AddMetadataEntry(object, metadata) ||
        !encodeSysConfig3(object, &blob))
        return 1;

    struct __SysConfig3* decoded = decodeSysConfig3(blob.data, blob.length);
    if (!sysConfig3ObjectsAreEqual(object, decoded))
        return 2;
    setSysConfig3LogHandler(keepFormat);
    if (sysConfig3DeletePayloadEntryForKey(decoded, 0x57436830) ||
        strcmp(lastFormat, "%s Failed to validate HMAC.") != 0)
        return 3;

    free(blob.data);
    deallocSysConfig3MetadataEntry(metadata);
    deallocSysConfig3PayloadEntry(entry);
    deallocSysConfig3(decoded);
    deallocSysConfig3(object);
    return 0;
}
