#ifndef VELTRA_TOOLS_ORLOCTL_IMG4PROPERTIES_H
#define VELTRA_TOOLS_ORLOCTL_IMG4PROPERTIES_H

#include "der/DERTypes.h"
#include "img4/Img4.h"
#include "tools/orloctl/Img4Findings.h"

namespace img4show {

struct PropertyFault {
    const std::uint8_t* place;
    std::string reason; // a clause whose subject is the property
};

// Why the decoder refuses the property in `content`, an element with the tag `tag`.
PropertyFault propertyFault(const DERItem& content, DERTag tag);

// Reads the properties in the dictionaries of one file.
class PropertyReader {
public:
    explicit PropertyReader(Findings& findings) : findings_(findings) {}

    // The properties in the content of a SET or SEQUENCE, which `where` names in the words of a fault. A value that
    // holds properties itself is a dictionary too, to a depth that nobody exceeds.
    nlohmann::ordered_json dictionary(const DERItem& content, const std::string& where) {
        return dictionary(content, where, 0);
    }

    // How many properties were read and left out, since there are too many to be shown.
    std::uint64_t leftOut() const { return count_ > mostProperties ? count_ - mostProperties : 0; }

private:
    static constexpr std::uint64_t mostProperties = 10000;

    nlohmann::ordered_json dictionary(const DERItem& content, const std::string& where, unsigned depth);
    nlohmann::ordered_json describe(const DERDecodedInfo& element, const DERItem& encoding, const std::string& where,
                                    unsigned depth);
    void describeValue(const Img4Property& property, const std::string& what, unsigned depth,
                       nlohmann::ordered_json& json);
    void valueFault(const Img4Property& property, const std::string& what, const std::string& reason,
                    nlohmann::ordered_json& json);

    Findings& findings_;
    std::uint64_t count_ = 0;
};

} // namespace img4show

#endif
