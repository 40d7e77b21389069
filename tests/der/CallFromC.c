/* The headers compile as C11, and the shared library serves a C program. */
#include <stddef.h>
#include <stdio.h>
#include <string.h>

#include "der/DERDecode.h"
#include "der/DEREncode.h"
#include "der/DERItemSpecs.h"

typedef struct Pair {
    DERItem name;
    DERItem count;
} Pair;

static const DERItemSpec pairItemSpecs[] = {
    {offsetof(Pair, name), DERTagIA5String, 0},
    {offsetof(Pair, count), DERTagInteger, DEROptionSignedInteger},
};

static DERReturn sumLengths(const DERDecodedInfo* decoded, bool* stop, void* context) {
    *(uint64_t*)context += decoded->content.length;
    *stop = decoded->tag == DERTagInteger;
    return DERSuccess;
}

static int check(bool good, const char* what) {
    if (!good)
        (void)fprintf(stderr, "failed: %s\n", what);
    return good ? 0 : 1;
}

int main(void) {
    static const uint8_t expected[] = {0x30, 0x08, 0x16, 0x02, 'a', 'b', 0x02, 0x02, 0x00, 0xC8};
    static const uint8_t name[] = {'a', 'b'};
    static const uint8_t count[] = {0xC8};
    const Pair pair = {{name, sizeof name}, {count, sizeof count}};
    uint8_t buffer[32];
    uint64_t length = sizeof buffer;
    int failures = 0;
    failures +=
        check(DEREncodeSequence(DERTagSequence, &pair, 2, pairItemSpecs, buffer, &length) == DERSuccess, "encode");
    failures += check(length == sizeof expected && memcmp(buffer, expected, sizeof expected) == 0, "encoding");

    const DERItem der = {buffer, length};
    Pair read;
    uint32_t number = 0;
    failures += check(DERParseSequence(&der, 2, pairItemSpecs, &read, sizeof read) == DERSuccess, "parse");
    failures += check(DERParseInteger(&read.count, &number) == DERSuccess && number == 200, "count");
    failures += check(DEROidCompare(&read.name, &pair.name), "name");

    uint64_t sum = 0;
    failures += check(DERDecodeSequenceWithBlock(&der, sumLengths, &sum) == DERSuccess && sum == 4, "walk");
    failures += check(DERNumTBSCertItemSpecs == 10 && DERTBSCertItemSpecs[9].offset == offsetof(DERTBSCert, extensions),
                      "tables");
    return failures == 0 ? 0 : 1;
}
