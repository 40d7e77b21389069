// The data-store client library: how the plug-in reaches the Orlo store.
#ifndef VELTRA_PLATFORM_ORLO_DATA_STORE_H
#define VELTRA_PLATFORM_ORLO_DATA_STORE_H

#include "platform/Value.h"

// The store's text for a device answer, by which a component's records are found: a text as it is, an integer in
// decimal, data in lower-case hexadecimal. Nothing for an empty text, empty data and every other kind. Pure; any
// thread.
Value QDOrloCreateInstanceString(const Value& answer);

#endif
