/* The headers compile as C11, and the shared library serves a C program. */
#include <stddef.h>
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

/* The number of the first step that goes wrong, or 0. */
int main(void) {
    static const uint8_t expected[] = {0x30, 0x08, 0x16, 0x02, 'a', 'b', 0x02, 0x02, 0x00, 0xC8};
    const Pair pair = {{expected + 4, 2}, {expected + 9, 1}};
    uint8_t buffer[32];
    uint64_t length = sizeof buffer;
    if (DEREncodeSequence(DERTagSequence, &pair, 2, pairItemSpecs, buffer, &length) != DERSuccess ||
        length != sizeof expected || memcmp(buffer, expected, sizeof expected) != 0)
        return 1;

    const DERItem der = {buffer, length};
    Pair read;
    uint32_t number = 0;
    if (DERParseSequence(&der, 2, pairItemSpecs, &read, sizeof read) != DERSuccess ||
        DERParseInteger(&read.count, &number) != DERSuccess || number != 200)
        return 2;

    uint64_t sum = 0;
    if (DERDecodeSequenceWithBlock(&der, sumLengths, &sum) != DERSuccess || sum != 4)
        return 3;
    return DERTBSCertItemSpecs[DERNumTBSCertItemSpecs - 1].offset == offsetof(DERTBSCert, extensions) ? 0 : 4;
}
