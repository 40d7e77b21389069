#ifndef VELTRA_TOOLS_ORLOCTL_SETBCFG_H
#define VELTRA_TOOLS_ORLOCTL_SETBCFG_H

#include <string>

#include "tools/orloctl/BlobResult.h"
#include "tools/orloctl/Client.h"

struct BlobAnswer {
    Answer answer; // a failure, with its reason as the problem, also when the result is not to be relied on
    JudgedBlob result;
};

// Has the service rewrite the configuration blob at `devicePath`, and reads the result. Requests of several clients
// leave their results in the same file: so each takes a lock for both, and waiting for it is said on standard error and
// counts against the timeout. The lock is a file that none but the service's user can open. Raises UsageError when it
// cannot be taken.
BlobAnswer setBcfg(const ServiceAddress& address, const std::string& devicePath);

#endif
