// The trust object of the embedded store: a file beside the database.
#ifndef VELTRA_PLATFORM_LINUX_ORLO_TRUST_OBJECT_H
#define VELTRA_PLATFORM_LINUX_ORLO_TRUST_OBJECT_H

#include <optional>
#include <string>
#include <utility>

#include "platform/linux/services/OrloStoreBackend.h"
#include "platform/linux/system/FileDescriptor.h"

// Both operations make the file from 64 random bytes when it is missing; of two services that do so at once, one has
// its way and both see the same. They raise OrloStoreFailure.
class OrloTrustObject {
public:
    // The file `name` in `directory`, which must outlive this.
    OrloTrustObject(const FileDescriptor& directory, std::string name)
        : directory_(directory), name_(std::move(name)) {}

    // The contents, read now.
    Value::Data read();

    // The SHA-256 of the contents as they were last read; they are read when they have not been.
    const OrloStoreBackend::Digest& digest();

private:
    FileDescriptor open();

    const FileDescriptor& directory_;
    std::string name_;
    std::optional<OrloStoreBackend::Digest> digest_;
};

#endif
