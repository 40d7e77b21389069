// What the readers of the parts of an Img4 file share: where they put what is wrong, and how they show octets.
#ifndef VELTRA_TOOLS_ORLOCTL_IMG4FINDINGS_H
#define VELTRA_TOOLS_ORLOCTL_IMG4FINDINGS_H

#include <cstddef>
#include <cstdint>
#include <string>

#include "der/DERTypes.h"
#include "tools/orloctl/Report.h"

namespace img4show {

// What is wrong with a file, and what is worth a remark. `report` outlives it.
class Findings {
public:
    Findings(const DERItem& file, Report& report) : file_(file), report_(report) {}

    // Makes "<reason>, at offset <place>." the problem of the report, unless it has one already.
    void fault(const std::uint8_t* place, const std::string& reason);

    // The same for an item that cannot be decoded, which `what` names and which begins at `rest`.
    void headerFault(const DERItem& rest, const std::string& what);

    void note(const std::string& text) { notes_.push_back(text); }
    const nlohmann::ordered_json& notes() const { return notes_; }

    const DERItem& file() const { return file_; }
    std::ptrdiff_t offsetOf(const std::uint8_t* place) const { return place - file_.data; }
    std::string at(const std::uint8_t* place) const { return "at offset " + std::to_string(offsetOf(place)); }

private:
    DERItem file_;
    Report& report_;
    nlohmann::ordered_json notes_ = nlohmann::ordered_json::array();
};

std::string sha1Text(const DERItem& data);
std::string sha256Text(const DERItem& data);
std::string sha384Text(const DERItem& data);

// Octets as digits. Those that are too many to be shown to people can be told apart by their digest.
nlohmann::ordered_json dataJson(const DERItem& data);

} // namespace img4show

#endif
