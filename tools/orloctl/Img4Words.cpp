#include "tools/orloctl/Img4Words.h"

#include "der/DERDecode.h"
#include "tools/orloctl/DerText.h"

namespace {

// A part of a file: what it is called, its fields by the row that takes them, its number and the last that there is.
struct Part {
    const char* name;
    const char* fields[7];
    const char* magic = "";
    const char* number = "";
    const char* last = "";
};

// From Img4SubjectFile on.
constexpr Part parts[] = {
    {"file", {}, R"("IMG4", "IM4P" or "IM4M")"},
    {"container", {"magic", "payload", "manifest", "restore information"}, R"("IMG4")"},
    {"payload", {"magic", "type", "version", "data", "keybag", "compression information", "properties"}, R"("IM4P")"},
    {"compression information", {"algorithm", "uncompressed size"}, "", "compression algorithm", "1"},
    {"payload properties", {"magic", "SET"}, R"("PAYP")"},
    {"manifest", {"magic", "version", "body", "signature", "certificate chain"}, R"("IM4M")", "manifest version", "2"},
    {"restore information", {"magic", "SET"}, R"("IM4R")"},
};

std::string encodingReason(const DERItem& file, const Part& part, const DERRefusal& refusal) {
    const std::string the = std::string("The ") + part.name;
    switch (refusal.fault) {
    case DERFaultNoSequence:
        return the + " is no SEQUENCE but " + derTagName(refusal.tag);
    case DERFaultTag:
        return the + "'s " + part.fields[refusal.row] + " is " + derTagName(refusal.tag) + " instead of " +
               derTagName(refusal.expected);
    case DERFaultMissing:
        return the + " ends before its " + part.fields[refusal.row];
    case DERFaultExcess:
        return the + " holds " + derTagName(refusal.tag) + " behind its last field";
    default:
        return (refusal.item == file.data ? the : std::string("An item of the ") + part.name) +
               ", which begins at offset " + std::to_string(refusal.item - file.data) +
               ", is no strict DER: " + derFaultText(refusal);
    }
}

} // namespace

const char* kindName(Img4Kind kind) {
    constexpr const char* names[] = {"file", "container", "payload", "manifest", "unsigned manifest"};
    return names[kind];
}

std::string fileReason(const DERItem& file, const Img4Refusal& refusal) {
    if (file.length == 0)
        return "The file is empty";
    const Part& part = parts[refusal.subject - Img4SubjectFile];
    std::uint32_t number = 0;
    switch (refusal.fault) {
    case Img4FaultMagic:
        if (refusal.subject != Img4SubjectFile)
            return "The magic is " + quotedText(refusal.found, mostCharactersShown) + " instead of " + part.magic;
        return "The file is no Img4: it begins with " +
               (refusal.found.length == sizeof number ? quotedText(refusal.found, mostCharactersShown)
                                                      : "no four-character magic") +
               " instead of " + part.magic;
    case Img4FaultNumber:
        return std::string("The ") + part.number + " " + numberReason(refusal.found, 32);
    case Img4FaultRange:
        DERParseInteger(&refusal.found, &number);
        return std::string("The ") + part.number + " is " + std::to_string(number) + ", and " + part.last +
               " is the last";
    case Img4FaultLength:
        return std::string("Octets follow the ") + part.name;
    default:
        return encodingReason(file, part, refusal.encoding);
    }
}

std::string propertyReason(const Img4Refusal& refusal) {
    const DERRefusal& encoding = refusal.encoding;
    switch (refusal.fault) {
    case Img4FaultTag:
        return "is no property";
    case Img4FaultName:
        return refusal.found.length == 4 ? "is named " + quotedText(refusal.found, 4) + " inside"
                                         : "has no four-character name inside";
    case Img4FaultValueType:
        return "is " + derTagName(encoding.tag) +
               (encoding.expected != 0 ? " instead of " + derTagName(encoding.expected)
                                       : ", and only BOOLEAN, INTEGER, OCTET STRING and IA5String can be judged");
    case Img4FaultLength:
        return "goes on behind the SEQUENCE of name and value";
    default:
        break;
    }
    switch (encoding.fault) {
    case DERFaultNoSequence:
        return "holds " + derTagName(encoding.tag) + " instead of SEQUENCE";
    case DERFaultMissing:
        return encoding.row == 0 ? "is empty inside" : "has no value";
    case DERFaultExcess:
        return "goes on behind its value";
    default:
        return "is no strict DER inside: " + derFaultText(encoding);
    }
}

std::string lookupReason(const Img4Refusal& refusal) {
    const char* const owner = refusal.subject == Img4SubjectBody   ? "The manifest's body"
                              : refusal.subject == Img4SubjectManb ? "\"MANB\""
                                                                   : "The manifest";
    const std::string code = quotedCode(refusal.tag & DERTagNumberMask);
    if (refusal.tag == 0)
        return std::string(owner) + " has an element that is no strict DER: " + derFaultText(refusal.encoding);
    return std::string(owner) + " has " +
           (refusal.fault == Img4FaultAbsent ? "no " + code : "a " + code + " that " + propertyReason(refusal));
}

std::string numberReason(const DERItem& number, unsigned bits) {
    std::uint64_t value = 0;
    const DERReturn result = DERParseInteger64(&number, &value);
    return result == DERDecodeError ? "is no non-negative INTEGER in its shortest form"
                                    : "does not fit " + std::to_string(bits) + " bits";
}
