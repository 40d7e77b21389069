// What the device description's "store" says about a store on servers.
#ifndef VELTRA_PLATFORM_LINUX_ORLO_REMOTE_SETTINGS_H
#define VELTRA_PLATFORM_LINUX_ORLO_REMOTE_SETTINGS_H

#include <optional>
#include <string>

#include "platform/Value.h"
#include "platform/linux/services/http/Http.h"

struct OrloRemoteSettings {
    // Where the records lie on an S3-compatible object store, and how its requests are signed.
    struct ObjectStore {
        std::string bucket;
        http::Signature signature;
        bool isConditional; // a record is put on condition that it is still what was found before
    };

    http::Way way;
    std::optional<ObjectStore> objectStore;
};

// Reads these entries of `store`, each of which may be missing:
//   "caFile"     a file of PEM certificates on the device, whose authorities are trusted beside the system's
//   "connectTo"  an object: connections to the "host:port" of a name are made to the "host:port" of its value
//   "s3"         an object of texts: "region" (letters, digits, "-", "_"), "bucket" (letters, digits, ".", "-", "_"),
//                and "accessKeyFile", a file on the device that only its owner may read or write, of two lines: the
//                access key and its secret. A boolean "conditional" may stand beside them, true unless given: false is
//                for a store that knows no conditions
// An IPv6 address stands in brackets. Raises OrloStoreFailure (QDOrloErrorStorage), which says what is wrong, for
// anything else.
OrloRemoteSettings readRemoteSettings(const Value& store);

#endif
