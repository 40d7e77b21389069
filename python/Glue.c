#include "python/Glue.h"

#include <stdarg.h>
#include <stdio.h>
#include <stdlib.h>

// The other half is Python's.
void veltraTakeMessage(const char* text, uint64_t length);

DERReturn veltraDecodeItems(const uint8_t* buffer, uint64_t start, uint64_t end, uint16_t most, ItemPlace* places,
                            uint16_t* count, DERRefusal* refusal) {
    for (*count = 0; *count < most && start < end; ++*count) {
        const DERItem rest = {buffer + start, end - start};
        DERDecodedInfo item;
        const DERReturn status = DERDecodeItemExplained(&rest, &item, refusal);
        if (status != DERSuccess)
            return status;
        const uint64_t content = (uint64_t)(item.content.data - buffer);
        places[*count] = (ItemPlace){item.tag, start, content, content + item.content.length};
        start = content + item.content.length;
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
