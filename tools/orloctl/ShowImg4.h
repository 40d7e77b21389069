#ifndef VELTRA_TOOLS_ORLOCTL_SHOWIMG4_H
#define VELTRA_TOOLS_ORLOCTL_SHOWIMG4_H

#include "tools/orloctl/Report.h"

#include <cstddef>
#include <cstdint>

// What the Img4 container, bare payload or bare manifest in the `length` octets at `data` holds: every section, object
// and property with its type and value, the digests of payload and manifest, and what is wrong where. What can be read
// is shown even when something is wrong. The report is ok when the Img4 decoder takes the file and every property in it
// is sound; it says nothing of the signature. Safe on any octets.
Report showImg4(const std::uint8_t* data, std::size_t length);

#endif
