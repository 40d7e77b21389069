// One evaluation of a manifest under one profile, and words for what it refused.
#ifndef VELTRA_TOOLS_ORLOCTL_TRUSTEVALUATION_H
#define VELTRA_TOOLS_ORLOCTL_TRUSTEVALUATION_H

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "img4/Img4Trust.h"
#include "tools/orloctl/TrustDomain.h"

struct TrustEvaluation {
    const DomainProfile* profile;
    std::optional<std::uint32_t> object; // evaluated with the manifest
    Img4Record record;
    Img4TrustRefusal refusal;
    DERReturn status;
};

// `record` as an initialisation left it. Every property is agreed to.
TrustEvaluation evaluateTrust(const Img4Record& record, const DomainProfile& profile,
                              std::optional<std::uint32_t> object);

struct TrustRefusal {
    // "chain", "signature", "dictionaries", "object", "constraints" or "properties"; "digest" for want of memory.
    const char* step;
    std::string reason; // a sentence without its full stop
    const std::uint8_t* place;
    std::optional<std::uint32_t> certificate; // its place in the chain, when it is about one
};

// Words for what the evaluation refused.
TrustRefusal explainRefusal(const TrustEvaluation& evaluation);

// The encodings of the certificates in the content of a chain, up to the first that is no strict DER and at most
// `mostCertificates`; *count becomes the number of all.
constexpr std::size_t mostCertificates = 100;
std::vector<DERItem> certificatesOf(const DERItem& certChain, std::uint64_t* count);

#endif
