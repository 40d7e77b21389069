// What the Python package does in C: what is called too often for Python, and what has a variable list of arguments.
#ifndef VELTRA_PYTHON_GLUE_H
#define VELTRA_PYTHON_GLUE_H

#include "der/DERDecode.h"
#include "img4/Img4DomainFolder.h"
#include "sysconfig/SysConfig3.h"

// Where an item lies in a buffer: its first octet, its content's first octet, and one past its end.
typedef struct ItemPlace {
    DERTag tag;
    uint64_t start;
    uint64_t content;
    uint64_t end;
} ItemPlace;

// Decodes up to `most` items from offset `start` to offset `end` of `buffer` into `places`, and their number into
// *count. Whatever follows the last of them has not been looked at, unless the result is a refusal.
DERReturn veltraDecodeItems(const uint8_t* buffer, uint64_t start, uint64_t end, uint16_t most, ItemPlace* places,
                            uint16_t* count, DERRefusal* refusal);

// Has the library's messages, formatted, given to veltraTakeMessage, or no longer.
void veltraTakeMessages(bool areTaken);

#endif
