#include "tools/orloctl/Img4Properties.h"

#include <set>

#include "tools/orloctl/DerItems.h"
#include "tools/orloctl/DerText.h"
#include "tools/orloctl/Img4Words.h"

namespace img4show {

using nlohmann::ordered_json;

namespace {

constexpr unsigned deepestDictionary = 8;

bool looksLikeDictionary(const DERItem& content) {
    DERDecodedInfo first;
    return content.length == 0 ||
           (DERDecodeItem(&content, &first) == DERSuccess && first.tag == Img4PropertyTag(first.tag));
}

class Reader {
public:
    // Without `findings` the properties are only shown.
    Reader(const DERItem& file, Findings* findings) : file_(file), findings_(findings) {}

    Elements dictionary(const DERItem& content, const std::string& where, unsigned depth) const {
        return [reader = *this, content, where, depth](const auto& take) { reader.walk(content, where, depth, take); };
    }

private:
    void walk(const DERItem& content, const std::string& where, unsigned depth,
              const std::function<bool(const Element&)>& take) const;
    Element describe(const DERDecodedInfo& element, const DERItem& encoding, const std::string& where,
                     unsigned depth) const;
    void describeValue(const Img4Property& property, const std::string& what, unsigned depth, Element& shown) const;
    void valueFault(const Img4Property& property, const std::string& what, const std::string& reason,
                    ordered_json& json) const;
    void fault(const std::uint8_t* place, const std::string& reason) const {
        if (findings_)
            findings_->fault(place, reason);
    }

    DERItem file_;
    Findings* findings_;
};

void Reader::walk(const DERItem& content, const std::string& where, unsigned depth,
                  const std::function<bool(const Element&)>& take) const {
    std::set<DERTag> seen;
    DerItems elements(content);
    while (elements.next()) {
        Element property = describe(elements.item(), elements.encoding(), where, depth);
        if (!seen.insert(elements.item().tag).second)
            property.json["hidden"] = "behind an earlier one of that tag, which a lookup takes";
        if (!take(property))
            return;
    }
    if (elements.isBroken() && findings_)
        findings_->headerFault(elements.encoding(), "A property of " + where);
}

// One element of a dictionary, which should be a property.
Element Reader::describe(const DERDecodedInfo& element, const DERItem& encoding, const std::string& where,
                         unsigned depth) const {
    const std::uint64_t number = element.tag & DERTagNumberMask;
    const std::string place = std::to_string(encoding.data - file_.data);
    Img4Property property;
    Img4Refusal refusal;
    const DERReturn result = DERImg4DecodePropertyExplained(&element.content, element.tag, &property, &refusal);
    const bool isProperty = refusal.fault != Img4FaultTag;
    Element shown{
        {{"name", isProperty ? codeText(number) : derTagName(element.tag)}, {"offset", encoding.data - file_.data}},
        {}};
    const std::string what = (isProperty ? quotedCode(number) : derTagName(element.tag)) + " of " + where;
    if (result == DERSuccess) {
        describeValue(property, what, depth, shown);
    } else {
        shown.json["fault"] = propertyReason(refusal);
        if (isProperty)
            fault(refusal.place, what + ", which begins at offset " + place + ", " + propertyReason(refusal));
        else
            fault(encoding.data, what + " is no property");
    }
    return shown;
}

void Reader::valueFault(const Img4Property& property, const std::string& what, const std::string& reason,
                        ordered_json& json) const {
    fault(property.value.data, what + " " + reason);
    json["fault"] = reason;
    json["hex"] = hexText(property.value);
}

void Reader::describeValue(const Img4Property& property, const std::string& what, unsigned depth,
                           Element& shown) const {
    const DERItem& value = property.value;
    ordered_json& json = shown.json;
    bool truth = false;
    std::uint64_t number = 0;
    json["type"] = derTagName(property.valueTag);
    switch (property.valueTag) {
    case DERTagBoolean:
        if (DERParseBoolean(&value, &truth) == DERSuccess)
            json["value"] = truth;
        else
            valueFault(property, what, "is a BOOLEAN that is not 00 or FF", json);
        break;
    case DERTagInteger:
        if (DERParseInteger64(&value, &number) == DERSuccess)
            json["value"] = number;
        else
            valueFault(property, what, numberReason(value, 64), json);
        break;
    case DERTagIA5String:
        json["value"] = escapedText(value);
        if (value.length > mostCharactersShown)
            json["sha256"] = sha256Text(value);
        break;
    case DERTagSet:
    case DERTagSequence:
        if (depth < deepestDictionary && looksLikeDictionary(value))
            json["properties"] =
                shown.lists.add(dictionary(value, quotedCode(property.tag & DERTagNumberMask), depth + 1));
        else
            json.update(dataJson(value));
        break;
    default:
        if (const auto why = derContentFault(property.valueTag, value))
            valueFault(property, what, "has a value that is not DER: " + why->reason, json);
        else
            json.update(dataJson(value));
        break;
    }
}

void goThrough(const Elements& properties) {
    properties([](const Element& property) {
        if (property.json.contains("properties"))
            goThrough(property.lists.at(property.json["properties"]));
        return true;
    });
}

} // namespace

Elements readProperties(const DERItem& content, const std::string& where, Findings& findings) {
    goThrough(Reader(findings.file(), &findings).dictionary(content, where, 0));
    return Reader(findings.file(), nullptr).dictionary(content, where, 0);
}

} // namespace img4show
