// Values of the device description that stand for others.
#ifndef VELTRA_PLATFORM_LINUX_DESCRIBED_VALUE_H
#define VELTRA_PLATFORM_LINUX_DESCRIBED_VALUE_H

#include "platform/Value.h"

// The value that a described value stands for:
//   {"$data": "hex"}                              the data of these pairs of hexadecimal digits
//   {"$file": "path"}, {..., "as": "data"}        the contents of the file of the device, read now
//   {"$file": "path", "as": "text"}               the same as text, without white space and NULs at its end; U+FFFD
//                                                 stands for each sequence that is no UTF-8
// Nothing when the digits are malformed, the file cannot be read, or another key stands beside these. Every other value
// stands for itself; the elements of a collection are resolved each.
Value resolveDescribed(const Value& described);

#endif
