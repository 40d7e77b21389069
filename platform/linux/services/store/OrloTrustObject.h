// The trust object of the embedded store: a file beside the database.
#ifndef VELTRA_PLATFORM_LINUX_ORLO_TRUST_OBJECT_H
#define VELTRA_PLATFORM_LINUX_ORLO_TRUST_OBJECT_H

#include <string>

#include "platform/FileDescriptor.h"
#include "platform/Value.h"

// The contents of the file `name` in `directory`, read now. Makes the file from 64 random bytes when it is missing; of
// two services that do so at once, one has its way and both see the same. Raises OrloStoreFailure.
Value::Data readTrustObject(const FileDescriptor& directory, const std::string& name);

#endif
