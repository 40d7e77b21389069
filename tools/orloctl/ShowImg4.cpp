#include "tools/orloctl/ShowImg4.h"

#include <algorithm>
#include <initializer_list>

#include "der/DERDecode.h"
#include "img4/Img4.h"
#include "tools/orloctl/DerItems.h"
#include "tools/orloctl/DerText.h"
#include "tools/orloctl/Img4Findings.h"
#include "tools/orloctl/Img4Properties.h"
#include "tools/orloctl/Img4Text.h"

namespace {

using namespace img4show;
using nlohmann::ordered_json;

// One field of a SEQUENCE, and where it lies once it was read.
struct Field {
    const char* name;
    DERTag tag;
    bool optional = false;
    DERItem content = {};
    DERItem encoding = {};

    bool isPresent() const { return content.data != nullptr; }
};

// Reads a file from the outside in, keeps what it finds as JSON, and the first thing that is wrong.
class Reader {
public:
    // The findings go into `report`.
    Reader(const DERItem& file, Report& report) : whole_(file), report_(report), findings_(file, report) {}

    void read();

private:
    void readContainer(const DERItem& content);
    void readBareManifest();
    ordered_json readPayload(const DERItem& encoding);
    ordered_json readCompression(const DERItem& content);
    ordered_json readPayloadProperties(const DERItem& content);
    ordered_json readManifest(const DERItem& encoding, bool isSigned);
    void readBody(const DERItem& content, std::uint32_t version, ordered_json& json);
    ordered_json readCertificates(const DERItem& content);
    ordered_json readRestoreInfo(const DERItem& encoding);

    bool readNumber(const DERItem& content, const std::string& what, std::uint32_t* number);

    bool enter(const DERItem& encoding, const char* what, DERItem* content);
    bool readFields(const DERItem& content, const char* what, std::initializer_list<Field*> fields);
    bool checkMagic(const Field& magic, std::uint32_t expected);
    void noteRest(const DERItem& outer, const char* what);

    ordered_json properties(const DERItem& dictionary, const std::string& where) {
        return report_.lists.add(readProperties(dictionary, where, findings_));
    }
    void addDigests(const DERItem& raw, ordered_json& json) const;
    DERReturn readAll(const DERItem& content);

    DERItem whole_;
    Report& report_;
    Findings findings_;
};

// The content of the SEQUENCE `encoding`.
bool Reader::enter(const DERItem& encoding, const char* what, DERItem* content) {
    DERDecodedInfo item;
    if (DERDecodeItem(&encoding, &item) != DERSuccess) {
        findings_.headerFault(encoding, what);
        return false;
    }
    if (item.tag != DERTagSequence) {
        findings_.fault(encoding.data, std::string(what) + " is no SEQUENCE but " + derTagName(item.tag));
        return false;
    }
    *content = item.content;
    return true;
}

// Reads the fields of a SEQUENCE's content in order, and refuses what the decoder refuses.
bool Reader::readFields(const DERItem& content, const char* what, std::initializer_list<Field*> fields) {
    DERSequence sequence;
    DERDecodedInfo item;
    DERDecodeSeqContentInit(&content, &sequence);
    for (Field* field : fields) {
        const DERItem rest = {sequence.next, static_cast<std::uint64_t>(sequence.end - sequence.next)};
        const std::string name = std::string(what) + "'s " + (field->optional ? "next element" : field->name);
        const DERSequence before = sequence;
        const DERReturn result = DERDecodeSeqNext(&sequence, &item);
        if (result == DEREndOfSequence && field->optional)
            continue;
        if (result == DEREndOfSequence) {
            findings_.fault(rest.data, std::string(what) + " ends before its " + field->name);
            return false;
        }
        if (result != DERSuccess) {
            findings_.headerFault(rest, name);
            return false;
        }
        if (item.tag == field->tag) {
            field->content = item.content;
            field->encoding = {rest.data, static_cast<std::uint64_t>(sequence.next - rest.data)};
        } else if (field->optional) {
            sequence = before;
        } else {
            findings_.fault(rest.data, name + " is " + derTagName(item.tag) + " instead of " + derTagName(field->tag));
            return false;
        }
    }
    const DERItem rest = {sequence.next, static_cast<std::uint64_t>(sequence.end - sequence.next)};
    if (rest.length == 0)
        return true;
    if (DERDecodeSeqNext(&sequence, &item) == DERSuccess)
        findings_.fault(rest.data, std::string(what) + " holds " + derTagName(item.tag) + " behind its last field");
    else
        findings_.headerFault(rest, std::string(what) + "'s element behind its last field");
    return false;
}

bool Reader::checkMagic(const Field& magic, std::uint32_t expected) {
    const std::uint8_t octets[] = {static_cast<std::uint8_t>(expected >> 24), static_cast<std::uint8_t>(expected >> 16),
                                   static_cast<std::uint8_t>(expected >> 8), static_cast<std::uint8_t>(expected)};
    const DERItem wanted = {octets, sizeof octets};
    if (std::equal(octets, octets + sizeof octets, magic.content.data, magic.content.data + magic.content.length))
        return true;
    findings_.fault(magic.encoding.data, "The magic is " + quotedText(magic.content, mostCharactersShown) +
                                             " instead of " + quotedText(wanted, mostCharactersShown));
    return false;
}

// The decoder does not look behind the SEQUENCE in a context item or in a bare payload, so it is no fault.
void Reader::noteRest(const DERItem& outer, const char* what) {
    DERDecodedInfo item;
    if (DERDecodeItem(&outer, &item) != DERSuccess)
        return;
    const std::uint8_t* end = item.content.data + item.content.length;
    const auto rest = static_cast<std::uint64_t>(outer.data + outer.length - end);
    if (rest != 0)
        findings_.note(std::string(what) + " is followed by octets that belong to nothing, " + std::to_string(rest) +
                       " of them, " + findings_.at(end));
}

bool Reader::readNumber(const DERItem& content, const std::string& what, std::uint32_t* number) {
    switch (DERParseInteger(&content, number)) {
    case DERSuccess:
        return true;
    case DERBufferOverflow:
        findings_.fault(content.data, what + " does not fit 32 bits");
        return false;
    default:
        findings_.fault(content.data, what + " is no non-negative INTEGER in its shortest form");
        return false;
    }
}

void Reader::addDigests(const DERItem& raw, ordered_json& json) const {
    json["offset"] = findings_.offsetOf(raw.data);
    json["length"] = raw.length;
    json["sha1"] = sha1Text(raw);
    json["sha256"] = sha256Text(raw);
    json["sha384"] = sha384Text(raw);
}

ordered_json Reader::readCompression(const DERItem& content) {
    Field algorithm = {"algorithm", DERTagInteger};
    Field size = {"uncompressed size", DERTagInteger};
    std::uint32_t number = 0;
    ordered_json json = ordered_json::object();
    if (!readFields(content, "The compression information", {&algorithm, &size}) ||
        !readNumber(algorithm.content, "The compression algorithm", &number))
        return json;
    json["algorithm"] = number;
    if (number > 1)
        findings_.fault(algorithm.encoding.data,
                        "The compression algorithm is " + std::to_string(number) + ", and 1 is the last");
    if (readNumber(size.content, "The uncompressed size", &number))
        json["uncompressedSize"] = number;
    return json;
}

ordered_json Reader::readPayloadProperties(const DERItem& content) {
    Field magic = {"magic", DERTagIA5String};
    Field set = {"SET", DERTagSet};
    DERItem fields;
    if (!enter(content, "The payload properties", &fields) ||
        !readFields(fields, "The payload properties", {&magic, &set}) ||
        !checkMagic(magic, Img4FourCC('P', 'A', 'Y', 'P')))
        return ordered_json::array();
    noteRest(content, "The SEQUENCE of payload properties");
    return properties(set.content, "the payload");
}

ordered_json Reader::readPayload(const DERItem& encoding) {
    Field magic = {"magic", DERTagIA5String};
    Field type = {"type", DERTagIA5String};
    Field version = {"version", DERTagIA5String};
    Field data = {"data", DERTagOctetString};
    Field keybag = {"keybag", DERTagOctetString, true};
    Field compression = {"compression information", DERTagSequence, true};
    Field properties = {"properties", DERTagContextConstructed(0), true};
    ordered_json json = ordered_json::object();
    DERItem content;
    addDigests(encoding, json);
    if (!enter(encoding, "The payload", &content) ||
        !readFields(content, "The payload", {&magic, &type, &version, &data, &keybag, &compression, &properties}) ||
        !checkMagic(magic, Img4FourCC('I', 'M', '4', 'P')))
        return json;
    json["type"] = escapedText(type.content);
    json["version"] = escapedText(version.content);
    json["data"] = dataJson(data.content);
    if (data.content.length == 0)
        findings_.note("The payload's data is empty, so that the payload counts as absent");
    if (keybag.isPresent())
        json["keybag"] = dataJson(keybag.content);
    if (compression.isPresent())
        json["compression"] = readCompression(compression.content);
    if (properties.isPresent())
        json["properties"] = readPayloadProperties(properties.content);
    return json;
}

ordered_json Reader::readCertificates(const DERItem& content) {
    std::uint64_t count = 0;
    DerItems items(content);
    for (; items.next(); ++count)
        if (items.item().tag != DERTagSequence)
            findings_.fault(items.encoding().data, "Certificate " + std::to_string(count) + " of the chain is " +
                                                       derTagName(items.item().tag) + " instead of SEQUENCE");
    if (items.isBroken())
        findings_.headerFault(items.encoding(), "Certificate " + std::to_string(count) + " of the chain");
    return report_.lists.add([content, file = whole_.data](const auto& take) {
        DerItems certificates(content);
        while (
            certificates.next() &&
            take({{{"offset", certificates.encoding().data - file}, {"length", certificates.encoding().length}}, {}}))
            ;
    });
}

// Whether the decoder's search for MANB and MANP, on which every lookup stands, comes to an end.
void Reader::readBody(const DERItem& content, std::uint32_t version, ordered_json& json) {
    const DERTag type = version == 2 ? DERTagSequence : DERTagSet;
    Img4Property manb;
    Img4Property manp;
    json["body"] = properties(content, "the manifest body");
    if (DERImg4DecodeFindProperty(&content, Img4PropertyTag(Img4FourCC('M', 'A', 'N', 'B')), type, &manb) !=
        DERSuccess) {
        findings_.fault(content.data, "The manifest body has no sound property \"MANB\" with a " + derTagName(type) +
                                          ", as version " + std::to_string(version) +
                                          " asks for, so that every lookup fails");
        return;
    }
    if (DERImg4DecodeFindProperty(&manb.value, Img4PropertyTag(Img4FourCC('M', 'A', 'N', 'P')), DERTagSet, &manp) !=
        DERSuccess)
        findings_.fault(manb.value.data,
                        "\"MANB\" has no sound property \"MANP\" with a SET, so that every lookup fails");
}

ordered_json Reader::readManifest(const DERItem& encoding, bool isSigned) {
    Field magic = {"magic", DERTagIA5String};
    Field version = {"version", DERTagInteger};
    Field body = {"body", DERTagSet};
    Field signature = {"signature", DERTagOctetString};
    Field chain = {"certificate chain", DERTagSequence};
    ordered_json json = ordered_json::object();
    std::uint32_t number = 0;
    DERItem content;
    addDigests(encoding, json);
    json["signed"] = isSigned;
    if (!enter(encoding, "The manifest", &content) ||
        !(isSigned ? readFields(content, "The manifest", {&magic, &version, &body, &signature, &chain})
                   : readFields(content, "The manifest", {&magic, &version, &body})) ||
        !checkMagic(magic, Img4FourCC('I', 'M', '4', 'M')) ||
        !readNumber(version.content, "The manifest version", &number))
        return json;
    json["version"] = number;
    if (number > 2)
        findings_.fault(version.encoding.data,
                        "The manifest version is " + std::to_string(number) + ", and 2 is the last");
    readBody(body.content, number, json);
    if (isSigned) {
        json["signature"] = dataJson(signature.content);
        json["certificates"] = readCertificates(chain.content);
    }
    return json;
}

ordered_json Reader::readRestoreInfo(const DERItem& encoding) {
    Field magic = {"magic", DERTagIA5String};
    Field set = {"SET", DERTagSet};
    DERItem content;
    ordered_json json = {{"offset", findings_.offsetOf(encoding.data)}, {"length", encoding.length}};
    if (enter(encoding, "The restore information", &content) &&
        readFields(content, "The restore information", {&magic, &set}) &&
        checkMagic(magic, Img4FourCC('I', 'M', '4', 'R')))
        json["properties"] = properties(set.content, "the restore information");
    return json;
}

void Reader::readContainer(const DERItem& content) {
    Field magic = {"magic", DERTagIA5String};
    Field payload = {"payload", DERTagSequence};
    Field manifest = {"manifest", DERTagContextConstructed(0), true};
    Field restoreInfo = {"restore information", DERTagContextConstructed(1), true};
    report_.json["kind"] = "container";
    if (!readFields(content, "The container", {&magic, &payload, &manifest, &restoreInfo}))
        return;
    report_.json["payload"] = readPayload(payload.encoding);
    if (manifest.isPresent()) {
        report_.json["manifest"] = readManifest(manifest.content, true);
        noteRest(manifest.content, "The manifest");
    }
    if (restoreInfo.isPresent()) {
        report_.json["restoreInfo"] = readRestoreInfo(restoreInfo.content);
        noteRest(restoreInfo.content, "The restore information");
    }
}

// A manifest counts as unsigned when the decoder takes it for nothing but that.
void Reader::readBareManifest() {
    Img4Record record;
    const bool isSigned = Img4DecodeInitUnsignedManifest(whole_.data, whole_.length, &record) != DERSuccess;
    report_.json["kind"] = isSigned ? "manifest" : "unsigned manifest";
    report_.json["manifest"] = readManifest(whole_, isSigned);
}

// Reads the file by its magic, and returns what the decoder says of it.
DERReturn Reader::readAll(const DERItem& content) {
    Img4Record record;
    DERDecodedInfo first;
    std::uint32_t magic = 0;
    const bool hasMagic = DERDecodeItem(&content, &first) == DERSuccess && first.tag == DERTagIA5String &&
                          first.content.length == 4 && DERParseInteger(&first.content, &magic) == DERSuccess;
    const std::uint8_t* const end = content.data + content.length;
    const bool fills = end == whole_.data + whole_.length;
    switch (magic) {
    case Img4FourCC('I', 'M', '4', 'P'):
        report_.json["kind"] = "payload";
        report_.json["payload"] = readPayload(whole_);
        noteRest(whole_, "The payload");
        return Img4DecodeInitPayload(whole_.data, whole_.length, &record);
    case Img4FourCC('I', 'M', 'G', '4'):
        if (!fills)
            findings_.fault(end, "Octets follow the container");
        readContainer(content);
        return Img4DecodeInit(whole_.data, whole_.length, &record);
    case Img4FourCC('I', 'M', '4', 'M'):
        if (!fills)
            findings_.fault(end, "Octets follow the manifest");
        readBareManifest();
        return report_.json["kind"] == "manifest" ? Img4DecodeInitManifest(whole_.data, whole_.length, &record)
                                                  : Img4DecodeInitUnsignedManifest(whole_.data, whole_.length, &record);
    default:
        findings_.fault(content.data, "The file is no Img4: it begins with " +
                                          (hasMagic ? quotedCode(magic) : "no four-character magic") +
                                          " instead of \"IMG4\", \"IM4P\" or \"IM4M\"");
        return DERUnexpectedTag;
    }
}

void Reader::read() {
    DERItem content;
    report_.json["length"] = whole_.length;
    if (whole_.length == 0)
        findings_.fault(whole_.data, "The file is empty");
    else if (enter(whole_, "The file", &content)) {
        if (const DERReturn status = readAll(content); status != DERSuccess)
            findings_.fault(whole_.data, "The decoder refuses the file with status " + std::to_string(status));
    }
    report_.json["notes"] = findings_.notes();
    report_.text = img4Text(report_);
}

} // namespace

Report showImg4(const std::uint8_t* data, std::size_t length) {
    Report report;
    Reader({data, length}, report).read();
    return report;
}
