#include "tools/orloctl/Img4Words.h"

#include "der/DERDecode.h"
#include "tools/orloctl/DerText.h"

namespace {

// A part of a file: what it is called, its fields by the row that takes them, its number and the last that there is.
struct Part {
    const char* name;
    const char* fields[8];
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

// Why an initialisation refuses the file, in a sentence without its full stop.
std::string fileReason(const DERItem& file, const Img4Refusal& refusal) {
    if (file.length == 0)
        return "The file is empty";
    const Part& part = parts[refusal.subject - Img4SubjectFile];
    const std::string found = quotedText(refusal.found);
    const DERRefusal& encoding = refusal.encoding;
    std::uint32_t number = 0;
    switch (refusal.fault) {
    case Img4FaultMagic:
        if (refusal.subject != Img4SubjectFile)
            return "The magic is " + found + " instead of " + part.magic;
        return "The file is no Img4: it begins with " +
               (refusal.found.length == sizeof number ? found : "no four-character magic") + " instead of " +
               part.magic;
    case Img4FaultNumber:
        return std::string("The ") + part.number + " " + numberReason(refusal.found, 32);
    case Img4FaultRange:
        DERParseInteger(&refusal.found, &number);
        return std::string("The ") + part.number + " is " + std::to_string(number) + ", and " + part.last +
               " is the last";
    case Img4FaultLength:
        return std::string("Octets follow the ") + part.name;
    default:
        return std::string("The ") + part.name + " " + derRefusalText(encoding, part.fields[encoding.row], file.data);
    }
}

} // namespace

const char* kindName(Img4Kind kind) {
    constexpr const char* names[] = {"file", "container", "payload", "manifest", "unsigned manifest"};
    return names[kind];
}

Img4Kind readImg4(Findings& findings, Img4Record* record) {
    const DERItem& file = findings.file();
    Img4Kind kind = Img4KindUnknown;
    Img4Refusal refusal = {};
    refusal.place = file.data;
    if (Img4DecodeInitExplained(file.data, file.length, record, &kind, &refusal) != DERSuccess)
        findings.fault(refusal.place, fileReason(file, refusal));
    return kind;
}

std::string propertyReason(const Img4Refusal& refusal) {
    const DERRefusal& encoding = refusal.encoding;
    switch (refusal.fault) {
    case Img4FaultTag:
        return "is no property";
    case Img4FaultName:
        return refusal.found.length == 4 ? "is named " + quotedText(refusal.found) + " inside"
                                         : "has no four-character name inside";
    case Img4FaultValueType:
        return "is " + derTagName(encoding.tag) +
               (encoding.expected != 0 ? " instead of " + derTagName(encoding.expected)
                                       : ", and only BOOLEAN, INTEGER, OCTET STRING and IA5String can be judged");
    case Img4FaultLength:
        return "goes on behind the SEQUENCE of name and value";
    default:
        return "has a content that " + derRefusalText(encoding, encoding.row == 0 ? "name" : "value");
    }
}

std::string lookupReason(const Img4Refusal& refusal) {
    const char* const owner = refusal.subject == Img4SubjectBody   ? "The manifest's body"
                              : refusal.subject == Img4SubjectManb ? "\"MANB\""
                                                                   : "The manifest";
    const std::string code = codeText(refusal.tag & DERTagNumberMask, "\"");
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
