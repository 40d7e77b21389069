// The trust domains that `verify` knows: the one that is built in, and those that scripts/make-trust-domain makes.
#ifndef VELTRA_TOOLS_ORLOCTL_TRUSTDOMAIN_H
#define VELTRA_TOOLS_ORLOCTL_TRUSTDOMAIN_H

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "img4/Img4Trust.h"
#include "platform/Value.h"

// A trust profile with the root of one domain.
struct DomainProfile {
    const Img4TrustProfileEntry* entry;
    Img4DomainProfile made;
};

struct TrustDomain {
    std::string name; // "built in", or the folder
    std::vector<DomainProfile> profiles;
    std::vector<std::unique_ptr<const Value::Data>> files; // what the profiles view
};

// The built-in domain, with the one profile of that name, or with all of them without a name. Raises UsageError for a
// name that no profile has.
TrustDomain builtInTrustDomain(const std::optional<std::string>& profile);

// The same for the domain in `folder`. Without a name it has the profiles whose roots are in the folder. Raises
// UsageError when there is none, and when a file that is needed is missing, unreadable or not what its name says.
TrustDomain readTrustDomain(const std::string& folder, const std::optional<std::string>& profile);

#endif
