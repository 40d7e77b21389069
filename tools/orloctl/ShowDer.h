#ifndef VELTRA_TOOLS_ORLOCTL_SHOWDER_H
#define VELTRA_TOOLS_ORLOCTL_SHOWDER_H

#include "tools/orloctl/Report.h"

#include <cstddef>
#include <cstdint>

// The items in the `length` octets at `data` as a tree, each with its place, lengths, tag and value, and where and why
// the encoding is no strict DER. The items may follow one another at the top. A header that cannot be read ends the
// tree; a content that breaks a rule of its type does not, and the first fault is the problem reported. Safe on any
// octets: items deeper than 64 levels are refused.
Report showDer(const std::uint8_t* data, std::size_t length);

#endif
