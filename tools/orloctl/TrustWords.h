// Words for what an evaluation of a manifest under one profile has found.
#ifndef VELTRA_TOOLS_ORLOCTL_TRUSTWORDS_H
#define VELTRA_TOOLS_ORLOCTL_TRUSTWORDS_H

#include <string>
#include <vector>

#include <nlohmann/json.hpp>

#include "img4/Img4Trust.h"
#include "tools/orloctl/TrustDomain.h"

struct TrustEvaluation {
    const DomainProfile* profile;
    Img4Record record;
    Img4TrustRefusal refusal;
    DERReturn status;
};

// What the leaf demands of single properties, each with its "state", and why the first that is broken is: a sentence
// without its full stop.
struct TrustConstraints {
    nlohmann::ordered_json rows = nlohmann::ordered_json::array();
    std::string broken = {};
};

// In their order, as the decoder judges them. An element that is no constraint is a broken one.
TrustConstraints readConstraints(const Img4Record& record);

struct TrustReason {
    // "chain", "signature", "dictionaries", "object", "constraints" or "properties"; "digest" for want of memory.
    const char* step;
    std::string reason; // a sentence without its full stop
};

// Words for what the evaluation refused. `certificates` are those of the chain, without the root, as far as they are
// known, of `count`.
TrustReason explainRefusal(const TrustEvaluation& evaluation, const std::vector<DERItem>& certificates,
                           std::uint64_t count, const TrustConstraints& constraints);

#endif
