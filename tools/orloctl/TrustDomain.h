// The trust domains that `verify` knows: the one that is built in, and those that scripts/make-trust-domain makes.
#ifndef VELTRA_TOOLS_ORLOCTL_TRUSTDOMAIN_H
#define VELTRA_TOOLS_ORLOCTL_TRUSTDOMAIN_H

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "img4/Img4DomainFolder.h"
#include "platform/Value.h"

// A trust profile with the root of one domain.
using DomainProfile = Img4FolderProfile;

struct TrustDomain {
    std::string name; // "built in", or the folder
    std::vector<DomainProfile> profiles;
    std::vector<std::unique_ptr<const Value::Data>> files; // what the profiles view
};

// The domain in `folder`, or the built-in one without a folder, with the one profile of that name; without a name with
// all of them, or those whose roots are in the folder. Raises UsageError for a name that no profile has, when there is
// no root, and when a file that is needed is missing, unreadable or not what its name says.
TrustDomain trustDomain(const std::optional<std::string>& folder, const std::optional<std::string>& profile);

#endif
