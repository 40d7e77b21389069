// What the Python package does in C: what is called too often for Python, and what has a variable list of arguments.
#ifndef VELTRA_PYTHON_GLUE_H
#define VELTRA_PYTHON_GLUE_H

#include "der/DERDecode.h"
#include "img4/Img4DomainFolder.h"
#include "sysconfig/SysConfig3.h"

// A walk over the items of a buffer. `next` is the offset of the item to come, `ends` has an offset for each item that
// is open, the last that of `depth`: its end, and first the end of the walk.
typedef struct ItemWalk {
    uint64_t next;
    uint64_t depth;
    uint64_t* ends;
} ItemWalk;

// What is known of an item: five rows of the `most` numbers that veltraWalkItems gives out.
enum {
    ItemDepth,
    ItemTag,
    ItemStart,
    ItemContent,
    ItemEnd,
    ItemRows
};

// Decodes up to `most` items into `rows`, and their number into *count; those in a constructed one behind it, if the
// walk is deep, for which `ends` has room for `most` more. Whatever follows the last of them has not been looked at,
// unless the result is a refusal.
DERReturn veltraWalkItems(const uint8_t* buffer, ItemWalk* walk, bool isDeep, uint16_t most, uint64_t* rows,
                          uint16_t* count, DERRefusal* refusal);

// Has the library's messages, formatted, given to veltraTakeMessage, or no longer.
void veltraTakeMessages(bool areTaken);

#endif
