#include "tools/orloctl/Img4Properties.h"

#include <set>

#include "platform/Crypto.h"
#include "tools/orloctl/DerItems.h"
#include "tools/orloctl/DerText.h"
#include "tools/orloctl/Img4Words.h"

namespace {

using nlohmann::ordered_json;

constexpr unsigned deepestDictionary = 8;
constexpr std::uint64_t longestWithoutDigest = 256;

bool looksLikeDictionary(const DERItem& content) {
    DERDecodedInfo first;
    return content.length == 0 ||
           (DERDecodeItem(&content, &first) == DERSuccess && first.tag == Img4PropertyTag(first.tag));
}

void setFault(ordered_json& json, const std::string& reason, std::ptrdiff_t offset) {
    json["fault"] = reason;
    json["faultOffset"] = offset;
}

// Why the value is none of its type that can be asked for, in a clause whose subject is the property.
std::string valueReason(const Img4Property& property) {
    std::uint64_t number = 0;
    if (property.valueTag == DERTagInteger)
        return DERParseInteger64(&property.value, &number) == DERSuccess ? "" : numberReason(property.value, 64);
    const auto fault = derContentFault(property.valueTag, property.value);
    return fault ? "has a value that is not DER: " + fault->reason : "";
}

Elements propertiesIn(const DERItem& content, const std::uint8_t* file, unsigned depth);

// One element of a dictionary, which should be a property.
Element describe(const DERDecodedInfo& element, const DERItem& encoding, const std::uint8_t* file, unsigned depth) {
    Img4Property property;
    Img4Refusal refusal;
    const DERReturn result = DERImg4DecodePropertyExplained(&element.content, element.tag, &property, &refusal);
    const bool isProperty = refusal.fault != Img4FaultTag;
    const std::string name = isProperty ? codeText(element.tag & DERTagNumberMask) : derTagName(element.tag);
    Element shown{{{"name", name}, {"offset", encoding.data - file}}, {}};
    ordered_json& json = shown.json;
    if (result != DERSuccess) {
        setFault(json, propertyReason(refusal), (isProperty ? refusal.place : encoding.data) - file);
        return shown;
    }
    const DERItem& value = property.value;
    const bool isDictionary = property.valueTag == DERTagSet || property.valueTag == DERTagSequence;
    json["type"] = derTagName(property.valueTag);
    if (const std::string reason = valueReason(property); !reason.empty()) {
        setFault(json, reason, value.data - file);
        json["hex"] = hexText(value);
    } else if (isDictionary && depth < deepestDictionary && looksLikeDictionary(value)) {
        json["properties"] = shown.lists.add(propertiesIn(value, file, depth + 1));
    } else if (property.valueTag == DERTagBoolean || property.valueTag == DERTagInteger ||
               property.valueTag == DERTagIA5String) {
        json["value"] = derValue(property.valueTag, value);
        if (value.length > longestWithoutDigest)
            json["sha256"] = digestText(value, crypto::sha256Size);
    } else {
        json.update(dataJson(value));
    }
    return shown;
}

Elements propertiesIn(const DERItem& content, const std::uint8_t* file, unsigned depth) {
    return [=](const auto& take) {
        std::set<DERTag> seen;
        DerItems elements(content);
        while (elements.next()) {
            Element property = describe(elements.item(), elements.encoding(), file, depth);
            if (!seen.insert(elements.item().tag).second)
                property.json["hidden"] = "behind an earlier one of that tag, which a lookup takes";
            if (!take(property))
                return;
        }
        if (const DERRefusal* why = elements.refusal()) {
            Element broken{{{"name", "the rest"}, {"offset", elements.encoding().data - file}}, {}};
            setFault(broken.json, "is no strict DER: " + derFaultText(*why), why->place - file);
            take(broken);
        }
    };
}

void check(const Elements& properties, const std::string& where, Findings& findings) {
    properties([&](const Element& property) {
        const std::string name = "\"" + property.json["name"].get<std::string>() + "\"";
        if (property.json.contains("fault"))
            findings.fault(findings.file().data + property.json["faultOffset"].get<std::ptrdiff_t>(),
                           name + " of " + where + " " + property.json["fault"].get<std::string>());
        if (property.json.contains("properties"))
            check(property.lists.at(property.json["properties"]), name, findings);
        return true;
    });
}

} // namespace

Elements readProperties(const DERItem& content, const std::string& where, Findings& findings) {
    Elements properties = propertiesIn(content, findings.file().data, 0);
    check(properties, where, findings);
    return properties;
}
