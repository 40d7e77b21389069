// Words for what the Img4 decoder refuses, of a whole file or of a property.
#ifndef VELTRA_TOOLS_ORLOCTL_IMG4WORDS_H
#define VELTRA_TOOLS_ORLOCTL_IMG4WORDS_H

#include <string>

#include "img4/Img4.h"
#include "tools/orloctl/Findings.h"

// "container", "payload", "manifest", "unsigned manifest", and "file" for what is none of them.
const char* kindName(Img4Kind kind);

// Reads the file of the findings into *record, and makes what the decoder refuses its problem. The record holds what
// could be read all the same.
Img4Kind readImg4(Findings& findings, Img4Record* record);

// Why a property is refused, in a clause whose subject it is.
std::string propertyReason(const Img4Refusal& refusal);

// Why the property that refusal.tag names is not found, in a sentence without its full stop.
std::string lookupReason(const Img4Refusal& refusal);

// Why the number in the content of an INTEGER is none of at most `bits` bits, in such a clause.
std::string numberReason(const DERItem& number, unsigned bits);

#endif
