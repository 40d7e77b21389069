#ifndef VELTRA_PLATFORM_PROPERTY_LIST_H
#define VELTRA_PLATFORM_PROPERTY_LIST_H

#include <optional>

#include "platform/Value.h"

// The root object of an XML property list: dict, array, string, data, integer, true and false. The kinds that a Value
// does not hold (real, date) stand as values of nothing. None for anything else, for a key that stands twice in one
// dict and for a nesting of more than 32. Entities beyond those of XML itself are not expanded, and nothing that the
// document names is fetched.
std::optional<Value> propertyListToValue(const Value::Data& xml);

// The plug-in bundle's information list: the property list Info.plist beside the executable, read at every call.
// Nothing when it is missing or malformed.
Value bundleInformationList();

#endif
