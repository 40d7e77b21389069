#include "tools/orloctl/Img4Properties.h"

#include <set>

#include "der/DERDecode.h"
#include "tools/orloctl/DerText.h"

namespace img4show {

using nlohmann::ordered_json;

namespace {

constexpr unsigned deepestDictionary = 8;

bool looksLikeDictionary(const DERItem& content) {
    DERDecodedInfo first;
    return content.length == 0 ||
           (DERDecodeItem(&content, &first) == DERSuccess && first.tag == Img4PropertyTag(first.tag));
}

} // namespace

PropertyFault propertyFault(const DERItem& content, DERTag tag) {
    DERDecodedInfo whole;
    DERDecodedInfo item;
    DERSequence elements;
    const auto headerFault = [](const std::uint8_t* place, const std::uint8_t* end) -> PropertyFault {
        const auto why = derHeaderFault({place, static_cast<std::uint64_t>(end - place)});
        return why ? PropertyFault{place + why->offset, "is no strict DER inside: " + why->reason}
                   : PropertyFault{place, "cannot be decoded"};
    };
    if (DERDecodeItem(&content, &whole) != DERSuccess)
        return headerFault(content.data, content.data + content.length);
    if (whole.tag != DERTagSequence)
        return {content.data, "holds " + derTagName(whole.tag) + " instead of SEQUENCE"};
    DERDecodeSeqContentInit(&whole.content, &elements);
    const std::uint8_t* place = elements.next;
    DERReturn result = DERDecodeSeqNext(&elements, &item);
    std::uint32_t code = 0;
    if (result == DERSuccess && (item.tag != DERTagIA5String || item.content.length != sizeof code ||
                                 DERParseInteger(&item.content, &code) != DERSuccess))
        return {place, "has no four-character name inside"};
    if (result == DERSuccess && Img4PropertyTag(code) != tag)
        return {place, "is named " + quotedText(item.content, sizeof code) + " inside"};
    if (result == DEREndOfSequence)
        return {place, "is empty inside"};
    if (result == DERSuccess) {
        place = elements.next;
        result = DERDecodeSeqNext(&elements, &item);
    }
    if (result == DEREndOfSequence)
        return {place, "has no value"};
    if (result != DERSuccess)
        return headerFault(place, elements.end);
    if (elements.next != elements.end)
        return {elements.next, "goes on behind its value"};
    return {elements.end, "goes on behind the SEQUENCE of name and value"};
}

namespace {

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
    DERSequence sequence;
    DERDecodedInfo element;
    DERDecodeSeqContentInit(&content, &sequence);
    while (sequence.next != sequence.end) {
        const DERItem rest = {sequence.next, static_cast<std::uint64_t>(sequence.end - sequence.next)};
        if (DERDecodeSeqNext(&sequence, &element) != DERSuccess) {
            if (findings_)
                findings_->headerFault(rest, "A property of " + where);
            return;
        }
        const DERItem encoding = {rest.data, static_cast<std::uint64_t>(sequence.next - rest.data)};
        Element property = describe(element, encoding, where, depth);
        if (!seen.insert(element.tag).second)
            property.json["hidden"] = "behind an earlier one of that tag, which a lookup takes";
        if (!take(property))
            return;
    }
}

// One element of a dictionary, which should be a property.
Element Reader::describe(const DERDecodedInfo& element, const DERItem& encoding, const std::string& where,
                         unsigned depth) const {
    const std::uint64_t number = element.tag & DERTagNumberMask;
    const bool isProperty = element.tag == Img4PropertyTag(number);
    const std::ptrdiff_t offset = encoding.data - file_.data;
    Element shown{{{"name", isProperty ? codeText(number) : derTagName(element.tag)}, {"offset", offset}}, {}};
    const std::string what = (isProperty ? quotedCode(number) : derTagName(element.tag)) + " of " + where;
    Img4Property property;
    if (!isProperty) {
        fault(encoding.data, what + " is no property");
        shown.json["fault"] = "is no property";
    } else if (DERImg4DecodeProperty(&element.content, element.tag, &property) == DERSuccess) {
        describeValue(property, what, depth, shown);
    } else {
        const PropertyFault why = propertyFault(element.content, element.tag);
        fault(why.place, what + ", which begins at offset " + std::to_string(offset) + ", " + why.reason);
        shown.json["fault"] = why.reason;
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
        if (const DERReturn result = DERParseInteger64(&value, &number); result == DERSuccess)
            json["value"] = number;
        else
            valueFault(property, what,
                       result == DERBufferOverflow ? "is an INTEGER of more than 64 bits"
                                                   : "is no non-negative INTEGER in its shortest form",
                       json);
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
