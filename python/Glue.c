#include "python/Glue.h"

#include <stdarg.h>
#include <stdio.h>
#include <stdlib.h>

// The other half is Python's.
void veltraTakeMessage(const char* text, uint64_t length);

DERReturn veltraWalkItems(const uint8_t* buffer, ItemWalk* walk, bool isDeep, uint16_t most, uint64_t* rows,
                          uint16_t* count, DERRefusal* refusal) {
    const DERTag constructed = UINT64_C(1) << 61;
    for (*count = 0; *count < most; ++*count) {
        while (walk->depth != 0 && walk->next == walk->ends[walk->depth])
            --walk->depth;
        const DERItem rest = {buffer + walk->next, walk->ends[walk->depth] - walk->next};
        if (rest.length == 0)
            return DERSuccess;
        DERDecodedInfo item;
        const DERReturn status = DERDecodeItemExplained(&rest, &item, refusal);
        if (status != DERSuccess)
            return status;
        const uint64_t content = (uint64_t)(item.content.data - buffer), end = content + item.content.length;
        const uint64_t known[ItemRows] = {walk->depth, item.tag, walk->next, content, end};
        for (int row = 0; row < ItemRows; ++row)
            rows[row * most + *count] = known[row];
        const bool isEntered = isDeep && (item.tag & constructed) != 0;
        walk->next = isEntered ? content : end;
        if (isEntered)
            walk->ends[++walk->depth] = end;
    }
    return DERSuccess;
}

static void takeMessage(int level, const char* format, ...) SYSCONFIG3_PRINTF(2, 3);
static void takeMessage(int level, const char* format, ...) {
    char text[1024]; // what is longer is cut: only a blob's own texts can be
    (void)level;     // always the same
    va_list arguments;
    va_start(arguments, format);
    const int length = vsnprintf(text, sizeof text, format, arguments);
    va_end(arguments);
    if (length >= 0)
        veltraTakeMessage(text, (uint64_t)length < sizeof text ? (uint64_t)length : sizeof text - 1);
}

void veltraTakeMessages(bool areTaken) {
    setSysConfig3LogHandler(areTaken ? takeMessage : NULL);
}
