#include "tools/orloctl/TrustConstraints.h"

#include <algorithm>

#include "der/DERDecode.h"
#include "tools/orloctl/DerText.h"
#include "tools/orloctl/Img4Findings.h"
#include "tools/orloctl/Img4Properties.h"
#include "tools/orloctl/Img4Words.h"

namespace {

struct Dictionary {
    DERTag tag;
    const char* name;
    const char* words;
};

constexpr Dictionary dictionaries[] = {
    {Img4PropertyTag(Img4FourCC('M', 'A', 'N', 'P')), "MANP", "the manifest"},
    {Img4PropertyTag(Img4FourCC('O', 'B', 'J', 'P')), "OBJP", "the object"},
    {Img4PropertyTag(Img4FourCC('m', 'a', 'n', 'x')), "manx", "measurements"},
    {0, "", "what is not known"},
};

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
    std::string text = property.value("type", "malformed");
    if (property.contains("value"))
        return text + " " + shortened(property["value"].dump(), most);
    if (property.contains("length"))
        text += " " + property["length"].dump() + (property["length"] == 1 ? " byte: " : " bytes: ") +
                shortened(property["hex"], most);
    return property.contains("sha256") ? text + " (SHA-256 " + property["sha256"].get<std::string>() + ")" : text;
}

// What the constraint demands; empty when it is none.
std::string demandOf(const Img4Constraint& constraint, std::size_t most) {
    switch (constraint.kind) {
    case DERTagBoolean:
    case DERTagInteger:
    case DERTagOctetString:
        return "must be " + valueText(constraint.encoding, most);
    case DERTagContextConstructed(0):
        return "must be there";
    case DERTagContextConstructed(1):
        return "must not be there";
    default:
        return "";
    }
}

// Why it is none, in a clause whose subject it is.
std::string malformedReason(const Img4Constraint& constraint, bool isRead) {
    if (!isRead)
        return "is no strict DER: " + derFaultText(constraint.refusal.encoding);
    if (constraint.kind != 0)
        return "is " + derTagName(constraint.kind) + ", which is no kind of constraint";
    return constraint.refusal.fault == Img4FaultTag ? "is no dictionary of constraints"
                                                    : img4show::propertyReason(constraint.refusal);
}

void add(const Img4Constraint* constraint, void* context) {
    const Img4Refusal& refusal = constraint->refusal;
    if (constraint->dictionary == 0 && refusal.fault != Img4FaultEncoding)
        return; // it is not about one of them
    DERDecodedInfo item = {};
    const bool isRead = DERDecodeItem(&constraint->encoding, &item) == DERSuccess;
    const auto* const dictionary =
        std::find_if(std::begin(dictionaries), std::end(dictionaries) - 1,
                     [&](const Dictionary& each) { return constraint->dictionary == each.tag; });
    TrustConstraint row = {dictionary->name,
                           codeText(item.tag & DERTagNumberMask),
                           demandOf(*constraint, whole),
                           TrustConstraint::NotChecked,
                           "",
                           "",
                           refusal.place};
    if (constraint->isChecked)
        row.state = refusal.fault == Img4FaultNone ? TrustConstraint::Met : TrustConstraint::Broken;
    if (constraint->found.data != nullptr)
        row.found = valueText(constraint->found, whole);
    if (row.demand.empty()) {
        row.name = isRead ? derTagName(item.tag) : "one";
        row.demand = malformedReason(*constraint, isRead);
        row.reason =
            std::string("Of the leaf's constraints on ") + dictionary->words + ", " + row.name + " " + row.demand;
    } else {
        row.reason = "The leaf certificate says that " + quotedCode(item.tag & DERTagNumberMask) + " of " +
                     dictionary->words + " " + demandOf(*constraint, inSentence) + ", and " +
                     (constraint->found.data != nullptr    ? "it is " + valueText(constraint->found, inSentence)
                      : refusal.status == DEREndOfSequence ? "there is none"
                                                           : "one of the properties there is no strict DER");
    }
    static_cast<std::vector<TrustConstraint>*>(context)->push_back(std::move(row));
}

} // namespace

std::vector<TrustConstraint> readConstraints(const Img4Record& record) {
    std::vector<TrustConstraint> rows;
    Img4DecodeEvaluateCertificatePropertiesExplained(&record, add, &rows);
    return rows;
}
