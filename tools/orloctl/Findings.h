// What the offline readers share: where they put what is wrong with a file, and how they show octets.
#ifndef VELTRA_TOOLS_ORLOCTL_FINDINGS_H
#define VELTRA_TOOLS_ORLOCTL_FINDINGS_H

#include <cstddef>
#include <cstdint>
#include <string>

#include "der/DERTypes.h"
#include "tools/orloctl/Report.h"

// What is wrong with a file, and what is worth a remark. `report` outlives it.
class Findings {
public:
    Findings(const DERItem& file, Report& report) : file_(file), report_(report) {}

    // Makes "<reason>, at offset <place>." the problem of the report, unless it has one already.
    void fault(const std::uint8_t* place, const std::string& reason);

    void note(const std::string& text) { notes_.push_back(text); }
    const nlohmann::ordered_json& notes() const { return notes_; }

    const DERItem& file() const { return file_; }
    std::ptrdiff_t offsetOf(const std::uint8_t* place) const { return place - file_.data; }

private:
    DERItem file_;
    Report& report_;
    nlohmann::ordered_json notes_ = nlohmann::ordered_json::array();
};

// The SHA-1, SHA-256 or SHA-384 of the octets, by its size; empty for want of memory.
std::string digestText(const DERItem& data, std::size_t size);

// Octets as digits. Those that are too many to be shown to people can be told apart by their digest.
nlohmann::ordered_json dataJson(const DERItem& data);

#endif
