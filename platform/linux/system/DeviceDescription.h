// The device description: the file /etc/veltra/device.json below the device root, which stands for the hardware.
#ifndef VELTRA_PLATFORM_LINUX_DEVICE_DESCRIPTION_H
#define VELTRA_PLATFORM_LINUX_DEVICE_DESCRIPTION_H

#include "platform/Value.h"

// The description as it stands, read at every call; nothing, and one line on the console that says why, when the file
// is missing or is not one JSON object.
//
// Its values may be described instead of given; resolveDescribed makes such a value the real one. Look up the one value
// that a query is about and resolve that, so that no other file is read for it.
Value deviceDescription();

// The value that a described value stands for:
//   {"$data": "hex"}                              the data of these pairs of hexadecimal digits
//   {"$file": "path"}, {..., "as": "data"}        the contents of the file of the device, read now
//   {"$file": "path", "as": "text"}               the same as text, without white space and NULs at its end; U+FFFD
//                                                 stands for each sequence that is no UTF-8
// Nothing when the digits are malformed, the file cannot be read, or another key stands beside these. Every other value
// stands for itself; the elements of a collection are resolved each.
Value resolveDescribed(const Value& described);

#endif
