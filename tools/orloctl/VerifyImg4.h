#ifndef VELTRA_TOOLS_ORLOCTL_VERIFYIMG4_H
#define VELTRA_TOOLS_ORLOCTL_VERIFYIMG4_H

#include <cstdint>
#include <optional>
#include <string>

#include "der/DERTypes.h"
#include "tools/orloctl/Report.h"
#include "tools/orloctl/TrustDomain.h"

struct VerifyRequest {
    std::optional<std::uint32_t> object = {}; // evaluated with the manifest
    // The object's property that holds the digest of its payload. The format names none, so that without it the payload
    // is not judged.
    std::optional<std::uint32_t> payloadDigest = {};
};

// Whether the manifest in `file`, an Img4 container or a bare manifest, is to be trusted under a profile of `domain`,
// and with it what `request` names by four-character codes. The profile reported is the first that trusts it; when none
// does it is the one whose root the chain names, with the first reason for its refusal, and there is none when no root
// is named. The report is ok when the manifest is trusted, and the payload as far as it was judged. The chain is shown
// in any case, what the manifest says only once its signature was verified. `domain` has at least one profile. Safe on
// any octets.
Report verifyImg4(const DERItem& file, const TrustDomain& domain, const VerifyRequest& request = {});

// The number of the four printable ASCII characters in `text`, the value of `option`. Raises UsageError for any other
// text.
std::uint32_t fourCharacterCode(const std::string& option, const std::string& text);

#endif
