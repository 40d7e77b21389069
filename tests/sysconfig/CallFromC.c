/* The header compiles as C11, and the shared library serves a C program. */
#include <stdarg.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include "sysconfig/SysConfig3.h"

static char lastMessage[256];

static void keepMessage(int level, const char* format, ...) {
    va_list arguments;
    va_start(arguments, format);
    (void)level;
    vsnprintf(lastMessage, sizeof lastMessage, format, arguments);
    va_end(arguments);
}

static int check(bool good, const char* what) {
    if (!good)
        fprintf(stderr, "failed: %s\n", what);
    return good ? 0 : 1;
}

int main(void) {
    static const uint8_t bytes[] = {1, 2};
    uint8_t keyBytes[] = "key";
    const SysConfigData key = {keyBytes, 3};
    SysConfigData blob = {NULL, 0};
    SysConfigData data = {NULL, 0};
    int failures = 0;

    struct __SysConfig3* object = allocSysConfig3WithHMACKey(0x62436667, 0x30002, key);
    struct __SysConfig3PayloadEntry* entry = allocSysConfig3PayloadEntryWithData(0x57436830, NULL, bytes, sizeof bytes);
    struct __SysConfig3MetadataEntry* metadata = allocSysConfig3MetadataEntry("name", NULL, 0, "value");
    failures += check(sysConfig3AddPayloadEntry(object, entry), "add payload");
    failures += check(sysConfig3AddMetadataEntry(object, metadata), "add metadata");
    failures += check(encodeSysConfig3(object, &blob), "encode");

    struct __SysConfig3* decoded = decodeSysConfig3(blob.data, blob.length);
    failures += check(sysConfig3ObjectsAreEqual(object, decoded), "decode");
    failures += check(sysConfig3PayloadEntryGetData(sysConfig3GetPayloadEntryForKey(decoded, 0x57436830), &data) &&
                          data.length == sizeof bytes && memcmp(data.data, bytes, sizeof bytes) == 0,
                      "data");
    setSysConfig3LogHandler(keepMessage);
    failures += check(!sysConfig3DeletePayloadEntryForKey(decoded, 0x57436830), "delete without a key");
    failures += check(strstr(lastMessage, "Failed to validate HMAC.") != NULL, "message");

    free(blob.data);
    deallocSysConfig3MetadataEntry(metadata);
    deallocSysConfig3PayloadEntry(entry);
    deallocSysConfig3(decoded);
    deallocSysConfig3(object);
    return failures == 0 ? 0 : 1;
}
