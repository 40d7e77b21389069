// Words for what the Img4 decoder refuses.
#ifndef VELTRA_TOOLS_ORLOCTL_IMG4WORDS_H
#define VELTRA_TOOLS_ORLOCTL_IMG4WORDS_H

#include <cstdint>
#include <string>

#include "img4/Img4.h"

constexpr std::uint64_t mostCharactersShown = 256;

// "container", "payload", "manifest", "unsigned manifest", and "file" for what is none of them.
const char* kindName(Img4Kind kind);

// Why an initialisation refuses `file`, in a sentence without its full stop.
std::string fileReason(const DERItem& file, const Img4Refusal& refusal);

// Why a property is refused, in a clause whose subject it is.
std::string propertyReason(const Img4Refusal& refusal);

// Why the property that refusal.tag names is not found, in a sentence without its full stop.
std::string lookupReason(const Img4Refusal& refusal);

// Why the number in the content of an INTEGER is none of at most `bits` bits, in such a clause.
std::string numberReason(const DERItem& number, unsigned bits);

#endif
