// The trust object of the embedded store: a file beside the database.
#ifndef VELTRA_PLATFORM_LINUX_ORLO_TRUST_OBJECT_H
#define VELTRA_PLATFORM_LINUX_ORLO_TRUST_OBJECT_H

#include <optional>
#include <string>

#include <sys/stat.h>

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

    // Their SHA-256. The file is read again only when it is another one, or changed, since the last time.
    OrloStoreBackend::Digest digest();

private:
    struct Known {
        struct stat file;
        OrloStoreBackend::Digest digest;
    };

    Value::Data read(struct stat* file);
    FileDescriptor open();

    const FileDescriptor& directory_;
    std::string name_;
    std::optional<Known> known_;
};

#endif
