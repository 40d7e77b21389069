#ifndef VELTRA_TOOLS_ORLOCTL_TRUSTCONSTRAINTS_H
#define VELTRA_TOOLS_ORLOCTL_TRUSTCONSTRAINTS_H

#include <cstdint>
#include <string>
#include <vector>

#include "img4/Img4Trust.h"

// What a leaf certificate demands of one property, and whether it is so.
struct TrustConstraint {
    enum State {
        Met,
        Broken,
        NotChecked, // the dictionary that it constrains was not evaluated
    };
    std::string dictionary; // "MANP", "OBJP"
    std::string name;
    std::string demand; // a clause: "must be INTEGER 7"
    State state;
    std::string found;         // "INTEGER 8"; empty when there is nothing
    std::string reason;        // a sentence without its full stop when broken
    const std::uint8_t* place; // of the constraint
};

// The constraints in the record's certProperties, in their order, as the decoder judges them. An element that is no
// constraint is a broken one.
std::vector<TrustConstraint> readConstraints(const Img4Record& record);

#endif
