#ifndef VELTRA_PLATFORM_BUNDLE_INFO_H
#define VELTRA_PLATFORM_BUNDLE_INFO_H

#include "platform/Value.h"

// The plug-in bundle's information list: the property list Info.plist beside the executable, read at every call.
// Nothing when it is missing or malformed.
Value bundleInformationList();

#endif
