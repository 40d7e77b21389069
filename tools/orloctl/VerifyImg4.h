#ifndef VELTRA_TOOLS_ORLOCTL_VERIFYIMG4_H
#define VELTRA_TOOLS_ORLOCTL_VERIFYIMG4_H

#include <cstdint>
#include <optional>
#include <string>

#include "der/DERTypes.h"
#include "tools/orloctl/Report.h"
#include "tools/orloctl/TrustDomain.h"

// Whether the manifest in `file`, an Img4 container or a bare manifest, is to be trusted under a profile of `domain`,
// and with it the object that has the four-character code `object`. The profile reported is the first that trusts it;
// when none does it is the one whose root the chain names, with the first reason for its refusal, and there is none
// when no root is named. The report is ok when the manifest is trusted. The chain is shown in any case, what the
// manifest says only once its signature was verified. `domain` has at least one profile. Safe on any octets.
Report verifyImg4(const DERItem& file, const TrustDomain& domain, std::optional<std::uint32_t> object);

// The number of the four printable ASCII characters in `text`. Raises UsageError for any other text.
std::uint32_t objectCode(const std::string& text);

#endif
