// The device description: the file /etc/veltra/device.json below the device root, which stands for the hardware.
#ifndef VELTRA_PLATFORM_LINUX_DEVICE_DESCRIPTION_H
#define VELTRA_PLATFORM_LINUX_DEVICE_DESCRIPTION_H

#include "platform/Value.h"
#include "platform/linux/system/DescribedValue.h"

// The description as it stands, read at every call. Any thread.
//
// Its values may be described instead of given; resolveDescribed makes such a value the real one. Look up the one value
// that a query is about and resolve that, so that no other file is read for it.
//
// Nothing when the file is missing or is not one JSON object; one line on the console and in the system log under the
// framework's handle then says why. What descriptionFaults finds is said there too, but only at the first call and when
// the file has changed.
Value deviceDescription();

// The same, but what is wrong with it is said nowhere.
Value deviceDescriptionUnreported();

#endif
