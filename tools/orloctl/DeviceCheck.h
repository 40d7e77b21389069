// What is wrong with a device description, for those who write one.
#ifndef VELTRA_TOOLS_ORLOCTL_DEVICE_CHECK_H
#define VELTRA_TOOLS_ORLOCTL_DEVICE_CHECK_H

#include <string>
#include <vector>

#include "platform/Value.h"
#include "tools/orloctl/Report.h"

// The path on the device.
constexpr const char* descriptionPath = "/etc/veltra/device.json";

// Whether the description in the local file, or that of the device when the path is empty, is sound: read as the
// service reads it, with what descriptionFaults finds, and with a signature of the chip's key that is verified with the
// module's certificate. Raises UsageError when it cannot be read.
Report checkDevice(const std::string& path);

#endif
