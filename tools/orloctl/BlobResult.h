// The file in which setGlobalbCfg leaves the new configuration blob. The service always answers with success, other
// users may write to the folder, and the service may have another device root than the client: so the file is judged
// before it passes for the result of a request.
#ifndef VELTRA_TOOLS_ORLOCTL_BLOBRESULT_H
#define VELTRA_TOOLS_ORLOCTL_BLOBRESULT_H

#include <optional>
#include <string>

#include <sys/stat.h>

#include "platform/Value.h"

// A path on the device.
constexpr const char* blobResultPath = "/tmp/new_bCfg";

struct JudgedBlob {
    Value::Data contents;
    std::string problem; // why there is no result to rely on, a sentence; empty when there is one
    std::string note;    // what it lacks without being wrong
};

class BlobResult {
public:
    // Notes what stands there; to be made before the request is sent.
    BlobResult();

    // Reads the file once the service, which runs as `serviceUser`, has answered. No link is followed. It must be a
    // file of that user's with one name, and another than stood there before, and hold a configuration blob with the
    // entries that the request puts into it, WCh0 when the device's model has one. `devicePath` is the blob that was to
    // be rewritten, which tells why an empty result is empty.
    JudgedBlob read(uid_t serviceUser, const std::string& devicePath) const;

private:
    std::optional<struct stat> earlier_;
};

#endif
