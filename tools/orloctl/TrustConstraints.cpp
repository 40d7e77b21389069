#include "tools/orloctl/TrustConstraints.h"

#include <algorithm>
#include <optional>

#include "der/DERDecode.h"
#include "tools/orloctl/DerItems.h"
#include "tools/orloctl/DerText.h"
#include "tools/orloctl/Img4Properties.h"
#include "tools/orloctl/Img4Text.h"
#include "tools/orloctl/Img4Words.h"

namespace {

constexpr DERTag mustBePresent = DERTagContextConstructed(0);
constexpr DERTag mustBeAbsent = DERTagContextConstructed(1);

struct Dictionary {
    const char* name;
    std::uint32_t code;
    const char* words;
    const DERItem* properties; // null for the one that binds nothing here
};

std::string faultText(const DERItem& rest) {
    const auto why = derHeaderFault(rest);
    return why ? "is no strict DER: " + why->reason : "cannot be decoded";
}

// Type and value of one encoded property, whole or as much as a sentence takes.
constexpr std::size_t whole = std::string::npos;
constexpr std::size_t inSentence = 128;

std::string valueText(const DERItem& encoding, std::size_t most) {
    Report report;
    img4show::Findings findings(encoding, report);
    nlohmann::ordered_json property;
    img4show::readProperties(encoding, "", findings)([&](const Element& element) {
        property = element.json;
        return false;
    });
    return property.contains("type") ? img4ValueText(property, most) : "malformed";
}

struct Element {
    DERItem encoding;
    DERDecodedInfo decoded;
};

// The first element with the tag `tag`; nothing when there is none, and then *fault says why if the dictionary is
// broken.
std::optional<Element> search(const DERItem& dictionary, DERTag tag, std::string* fault) {
    DerItems elements(dictionary);
    while (elements.next())
        if (elements.item().tag == tag)
            return Element{elements.encoding(), elements.item()};
    if (elements.isBroken())
        *fault = faultText(elements.encoding());
    return std::nullopt;
}

bool haveEqualContents(const DERDecodedInfo& one, const DERDecodedInfo& other) {
    return std::equal(one.content.data, one.content.data + one.content.length, other.content.data,
                      other.content.data + other.content.length);
}

class Reader {
public:
    explicit Reader(const Img4Record& record) : record_(record) {}

    std::vector<TrustConstraint> read() &&;

private:
    void readDictionary(const Dictionary& dictionary, const DerItems& element);
    void readConstraint(const Dictionary& dictionary, const DerItems& element);
    void judge(const Dictionary& dictionary, const DerItems& element, TrustConstraint row, DERTag kind);
    void add(const Dictionary& dictionary, TrustConstraint row);
    void refuse(const Dictionary& dictionary, const std::string& name, const std::uint8_t* place,
                const std::string& reason);

    const Img4Record& record_;
    std::vector<TrustConstraint> rows_;
};

bool isEvaluated(const Dictionary& dictionary) {
    return dictionary.properties != nullptr && dictionary.properties->data != nullptr;
}

void Reader::add(const Dictionary& dictionary, TrustConstraint row) {
    if (!isEvaluated(dictionary))
        row.state = TrustConstraint::NotChecked;
    rows_.push_back(std::move(row));
}

// `reason` is a clause whose subject is the element.
void Reader::refuse(const Dictionary& dictionary, const std::string& name, const std::uint8_t* place,
                    const std::string& reason) {
    add(dictionary,
        {dictionary.name, name, reason, TrustConstraint::Broken, "",
         std::string("Of the leaf's constraints on ") + dictionary.words + ", " + name + " " + reason, place});
}

// Judges the constraint of the kind `kind` in `element`, whose demand is in `row`.
void Reader::judge(const Dictionary& dictionary, const DerItems& element, TrustConstraint row, DERTag kind) {
    std::string fault;
    const auto found =
        isEvaluated(dictionary) ? search(*dictionary.properties, element.item().tag, &fault) : std::nullopt;
    if (found)
        row.found = valueText(found->encoding, whole);
    const bool isMet = kind == mustBeAbsent    ? !found && fault.empty()
                       : kind == mustBePresent ? found.has_value()
                                               : found && haveEqualContents(found->decoded, element.item());
    if (!isMet) {
        const bool isAnyValue = kind == mustBePresent || kind == mustBeAbsent;
        row.state = TrustConstraint::Broken;
        row.reason = "The leaf certificate says that " + quotedCode(element.item().tag & DERTagNumberMask) + " of " +
                     dictionary.words + " " +
                     (isAnyValue ? row.demand : "must be " + valueText(element.encoding(), inSentence)) + ", and " +
                     (found            ? "it is " + valueText(found->encoding, inSentence)
                      : !fault.empty() ? "one of the properties there " + fault
                                       : "there is none");
    }
    add(dictionary, std::move(row));
}

void Reader::readConstraint(const Dictionary& dictionary, const DerItems& element) {
    const DERDecodedInfo& item = element.item();
    Img4Property constraint;
    Img4Refusal refusal;
    if (DERImg4DecodePropertyExplained(&item.content, item.tag, &constraint, &refusal) != DERSuccess) {
        refuse(dictionary, derTagName(item.tag), refusal.place, img4show::propertyReason(refusal));
        return;
    }
    TrustConstraint row = {
        dictionary.name,        codeText(item.tag & DERTagNumberMask), "", TrustConstraint::Met, "", "",
        element.encoding().data};
    switch (constraint.valueTag) {
    case DERTagBoolean:
    case DERTagInteger:
    case DERTagOctetString:
        row.demand = "must be " + valueText(element.encoding(), whole);
        break;
    case mustBePresent:
        row.demand = "must be there";
        break;
    case mustBeAbsent:
        row.demand = "must not be there";
        break;
    default:
        refuse(dictionary, derTagName(item.tag), element.encoding().data,
               "is " + derTagName(constraint.valueTag) + ", which is no kind of constraint");
        return;
    }
    judge(dictionary, element, std::move(row), constraint.valueTag);
}

void Reader::readDictionary(const Dictionary& dictionary, const DerItems& element) {
    const DERDecodedInfo& item = element.item();
    Img4Property constraining;
    Img4Refusal refusal;
    if (DERImg4DecodePropertyExplained(&item.content, item.tag, &constraining, &refusal) != DERSuccess) {
        refuse(dictionary, derTagName(item.tag), refusal.place, img4show::propertyReason(refusal));
        return;
    }
    if (constraining.valueTag != DERTagSet) {
        refuse(dictionary, derTagName(item.tag), element.encoding().data,
               "is " + derTagName(constraining.valueTag) + " instead of SET");
        return;
    }
    DerItems constraints(constraining.value);
    while (constraints.next())
        readConstraint(dictionary, constraints);
    if (constraints.isBroken())
        refuse(dictionary, "one", constraints.encoding().data, faultText(constraints.encoding()));
}

std::vector<TrustConstraint> Reader::read() && {
    const Dictionary dictionaries[] = {
        {"MANP", Img4FourCC('M', 'A', 'N', 'P'), "the manifest", &record_.manp},
        {"OBJP", Img4FourCC('O', 'B', 'J', 'P'), "the object", &record_.objp},
        {"manx", Img4FourCC('m', 'a', 'n', 'x'), "measurements", nullptr},
    };
    const Dictionary unknown = {"", 0, "what is not known", &record_.manp};
    DERDecodedInfo set;
    if (DERDecodeItem(&record_.manifest.certProperties, &set) != DERSuccess)
        return {};
    DerItems elements(set.content);
    while (elements.next()) {
        const auto* dictionary =
            std::find_if(std::begin(dictionaries), std::end(dictionaries),
                         [&](const Dictionary& each) { return elements.item().tag == Img4PropertyTag(each.code); });
        if (dictionary != std::end(dictionaries))
            readDictionary(*dictionary, elements);
        else
            refuse(unknown, derTagName(elements.item().tag), elements.encoding().data,
                   "is no dictionary of constraints");
    }
    if (elements.isBroken())
        refuse(unknown, "one", elements.encoding().data, faultText(elements.encoding()));
    return std::move(rows_);
}

} // namespace

std::vector<TrustConstraint> readConstraints(const Img4Record& record) {
    return Reader(record).read();
}
