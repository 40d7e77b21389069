#include "tools/orloctl/ShowImg4.h"

#include <algorithm>
#include <initializer_list>
#include <set>

#include "der/DERDecode.h"
#include "img4/Img4.h"
#include "platform/Crypto.h"
#include "tools/orloctl/DerText.h"
#include "tools/orloctl/Img4Text.h"

namespace {

using nlohmann::ordered_json;

constexpr std::uint64_t mostOctetsShown = 64;
constexpr std::uint64_t mostCharactersShown = 256;
constexpr std::uint64_t mostProperties = 10000;
constexpr std::uint64_t mostCertificates = 100;
constexpr unsigned deepestDictionary = 8;

// One field of a SEQUENCE, and where it lies once it was read.
struct Field {
    const char* name;
    DERTag tag;
    bool optional = false;
    DERItem content = {};
    DERItem encoding = {};

    bool isPresent() const { return content.data != nullptr; }
};

std::string digestText(bool (*digest)(const void*, std::size_t, std::uint8_t*) noexcept, std::size_t size,
                       const DERItem& data) {
    std::uint8_t out[crypto::sha384Size];
    return digest(data.data, data.length, out) ? hexText({out, size}, size) : "";
}

// Octets as digits. Those that are not all shown are told apart by their digest.
ordered_json dataJson(const DERItem& data) {
    ordered_json json = {{"length", data.length}, {"hex", hexText(data, mostOctetsShown)}};
    if (data.length > mostOctetsShown)
        json["sha256"] = digestText(crypto::sha256, crypto::sha256Size, data);
    return json;
}

// Reads a file from the outside in, keeps what it finds as JSON, and the first thing that is wrong.
class Reader {
public:
    // The findings go into `report`.
    Reader(const std::uint8_t* data, std::size_t length, Report& report) : whole_{data, length}, report_(report) {}

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

    ordered_json readDictionary(const DERItem& content, const std::string& where, unsigned depth);
    ordered_json readElement(const DERDecodedInfo& element, const DERItem& encoding, const std::string& where,
                             unsigned depth);
    void readValue(const Img4Property& property, const std::string& what, unsigned depth, ordered_json& json);
    void valueFault(const Img4Property& property, const std::string& what, const std::string& reason,
                    ordered_json& json);
    bool readNumber(const DERItem& content, const std::string& what, std::uint32_t* number);

    bool enter(const DERItem& encoding, const char* what, DERItem* content);
    bool readFields(const DERItem& content, const char* what, std::initializer_list<Field*> fields);
    bool checkMagic(const Field& magic, std::uint32_t expected);
    void noteRest(const DERItem& outer, const char* what);

    void fault(const std::uint8_t* place, const std::string& reason);
    void headerFault(const DERItem& rest, const std::string& what);
    void note(const std::string& text) { notes_.push_back(text); }
    std::string at(const std::uint8_t* place) const { return "at offset " + std::to_string(place - whole_.data); }
    void addDigests(const DERItem& raw, ordered_json& json) const;
    DERReturn readAll(const DERItem& content);

    DERItem whole_;
    ordered_json notes_ = ordered_json::array();
    std::uint64_t properties_ = 0;
    Report& report_;
};

void Reader::fault(const std::uint8_t* place, const std::string& reason) {
    if (!report_.ok)
        return;
    report_.ok = false;
    report_.json["problemOffset"] = place - whole_.data;
    report_.problem = reason + ", " + at(place) + ".";
}

void Reader::headerFault(const DERItem& rest, const std::string& what) {
    if (const auto why = derHeaderFault(rest))
        fault(rest.data + why->offset, what + ", which begins " + at(rest.data) + ", is no strict DER: " + why->reason);
}

// The content of the SEQUENCE `encoding`.
bool Reader::enter(const DERItem& encoding, const char* what, DERItem* content) {
    DERDecodedInfo item;
    if (DERDecodeItem(&encoding, &item) != DERSuccess) {
        headerFault(encoding, what);
        return false;
    }
    if (item.tag != DERTagSequence) {
        fault(encoding.data, std::string(what) + " is no SEQUENCE but " + derTagName(item.tag));
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
        const std::string name = std::string(what) + "'s " + field->name;
        const DERSequence before = sequence;
        const DERReturn result = DERDecodeSeqNext(&sequence, &item);
        if (result == DEREndOfSequence && field->optional)
            continue;
        if (result == DEREndOfSequence) {
            fault(rest.data, std::string(what) + " ends before its " + field->name);
            return false;
        }
        if (result != DERSuccess) {
            headerFault(rest, name);
            return false;
        }
        if (item.tag == field->tag) {
            field->content = item.content;
            field->encoding = {rest.data, static_cast<std::uint64_t>(sequence.next - rest.data)};
        } else if (field->optional) {
            sequence = before;
        } else {
            fault(rest.data, name + " is " + derTagName(item.tag) + " instead of " + derTagName(field->tag));
            return false;
        }
    }
    if (sequence.next == sequence.end)
        return true;
    fault(sequence.next, std::string(what) + " goes on behind its " + (*std::prev(fields.end()))->name);
    return false;
}

bool Reader::checkMagic(const Field& magic, std::uint32_t expected) {
    const std::uint8_t octets[] = {static_cast<std::uint8_t>(expected >> 24), static_cast<std::uint8_t>(expected >> 16),
                                   static_cast<std::uint8_t>(expected >> 8), static_cast<std::uint8_t>(expected)};
    const DERItem wanted = {octets, sizeof octets};
    if (std::equal(octets, octets + sizeof octets, magic.content.data, magic.content.data + magic.content.length))
        return true;
    fault(magic.encoding.data, "The magic is " + quotedText(magic.content, mostCharactersShown) + " instead of " +
                                   quotedText(wanted, mostCharactersShown));
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
        note(std::string(what) + " is followed by " + std::to_string(rest) + " octets that belong to nothing, " +
             at(end));
}

bool Reader::readNumber(const DERItem& content, const std::string& what, std::uint32_t* number) {
    switch (DERParseInteger(&content, number)) {
    case DERSuccess:
        return true;
    case DERBufferOverflow:
        fault(content.data, what + " does not fit 32 bits");
        return false;
    default:
        fault(content.data, what + " is no non-negative INTEGER in its shortest form");
        return false;
    }
}

void Reader::addDigests(const DERItem& raw, ordered_json& json) const {
    json["offset"] = raw.data - whole_.data;
    json["length"] = raw.length;
    json["sha1"] = digestText(crypto::sha1, crypto::sha1Size, raw);
    json["sha256"] = digestText(crypto::sha256, crypto::sha256Size, raw);
    json["sha384"] = digestText(crypto::sha384, crypto::sha384Size, raw);
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
        fault(algorithm.encoding.data,
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
    return readDictionary(set.content, "the payload", 0);
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
    json["type"] = escapedText(type.content, mostCharactersShown);
    json["version"] = escapedText(version.content, mostCharactersShown);
    json["data"] = dataJson(data.content);
    if (data.content.length == 0)
        note("The payload's data is empty, so that the payload counts as absent");
    if (keybag.isPresent())
        json["keybag"] = dataJson(keybag.content);
    if (compression.isPresent())
        json["compression"] = readCompression(compression.content);
    if (properties.isPresent())
        json["properties"] = readPayloadProperties(properties.content);
    return json;
}

ordered_json Reader::readCertificates(const DERItem& content) {
    ordered_json certificates = ordered_json::array();
    std::uint64_t count = 0;
    DERSequence sequence;
    DERDecodedInfo item;
    DERDecodeSeqContentInit(&content, &sequence);
    for (; sequence.next != sequence.end; ++count) {
        const DERItem rest = {sequence.next, static_cast<std::uint64_t>(sequence.end - sequence.next)};
        const std::string what = "Certificate " + std::to_string(count) + " of the chain";
        if (DERDecodeSeqNext(&sequence, &item) != DERSuccess) {
            headerFault(rest, what);
            break;
        }
        if (item.tag != DERTagSequence)
            fault(rest.data, what + " is " + derTagName(item.tag) + " instead of SEQUENCE");
        if (count < mostCertificates)
            certificates.push_back({{"offset", rest.data - whole_.data}, {"length", sequence.next - rest.data}});
    }
    if (count > mostCertificates)
        note(std::to_string(count - mostCertificates) + " further certificates are not shown");
    return certificates;
}

// Whether the decoder's search for MANB and MANP, on which every lookup stands, comes to an end.
void Reader::readBody(const DERItem& content, std::uint32_t version, ordered_json& json) {
    const DERTag type = version == 2 ? DERTagSequence : DERTagSet;
    Img4Property manb;
    Img4Property manp;
    json["body"] = readDictionary(content, "the manifest body", 0);
    if (DERImg4DecodeFindProperty(&content, Img4PropertyTag(Img4FourCC('M', 'A', 'N', 'B')), type, &manb) !=
        DERSuccess) {
        fault(content.data, "The manifest body has no sound property \"MANB\" with a " + derTagName(type) +
                                ", as version " + std::to_string(version) + " asks for, so that every lookup fails");
        return;
    }
    if (DERImg4DecodeFindProperty(&manb.value, Img4PropertyTag(Img4FourCC('M', 'A', 'N', 'P')), DERTagSet, &manp) !=
        DERSuccess)
        fault(manb.value.data, "\"MANB\" has no sound property \"MANP\" with a SET, so that every lookup fails");
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
        fault(version.encoding.data, "The manifest version is " + std::to_string(number) + ", and 2 is the last");
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
    ordered_json json = {{"offset", encoding.data - whole_.data}, {"length", encoding.length}};
    if (enter(encoding, "The restore information", &content) &&
        readFields(content, "The restore information", {&magic, &set}) &&
        checkMagic(magic, Img4FourCC('I', 'M', '4', 'R')))
        json["properties"] = readDictionary(set.content, "the restore information", 0);
    return json;
}

// The properties in the content of a SET or SEQUENCE. `where` names it for the words of a fault.
ordered_json Reader::readDictionary(const DERItem& content, const std::string& where, unsigned depth) {
    ordered_json properties = ordered_json::array();
    std::set<DERTag> seen;
    DERSequence sequence;
    DERDecodedInfo element;
    DERDecodeSeqContentInit(&content, &sequence);
    while (sequence.next != sequence.end) {
        const DERItem rest = {sequence.next, static_cast<std::uint64_t>(sequence.end - sequence.next)};
        if (DERDecodeSeqNext(&sequence, &element) != DERSuccess) {
            headerFault(rest, "A property of " + where);
            break;
        }
        const DERItem encoding = {rest.data, static_cast<std::uint64_t>(sequence.next - rest.data)};
        ordered_json property = readElement(element, encoding, where, depth);
        if (!seen.insert(element.tag).second)
            property["hidden"] = "behind an earlier one of that tag, which a lookup takes";
        if (++properties_ <= mostProperties)
            properties.push_back(std::move(property));
    }
    return properties;
}

// Why the decoder refuses the property in `content`, an element with the tag `tag`, and the place of the fault.
struct PropertyFault {
    const std::uint8_t* place;
    std::string reason;
};

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

// One element of a dictionary, which should be a property.
ordered_json Reader::readElement(const DERDecodedInfo& element, const DERItem& encoding, const std::string& where,
                                 unsigned depth) {
    const std::uint64_t number = element.tag & DERTagNumberMask;
    const bool isProperty = element.tag == Img4PropertyTag(number);
    ordered_json json = {{"name", isProperty ? codeText(number) : derTagName(element.tag)},
                         {"offset", encoding.data - whole_.data}};
    const std::string what = (isProperty ? quotedCode(number) : derTagName(element.tag)) + " of " + where;
    Img4Property property;
    if (!isProperty) {
        fault(encoding.data, what + " is no property");
        json["fault"] = "is no property";
    } else if (DERImg4DecodeProperty(&element.content, element.tag, &property) == DERSuccess) {
        readValue(property, what, depth, json);
    } else {
        const PropertyFault why = propertyFault(element.content, element.tag);
        fault(why.place, what + ", which begins " + at(encoding.data) + ", " + why.reason);
        json["fault"] = why.reason;
    }
    return json;
}

void Reader::valueFault(const Img4Property& property, const std::string& what, const std::string& reason,
                        ordered_json& json) {
    fault(property.value.data, what + " " + reason);
    json["fault"] = reason;
    json["hex"] = hexText(property.value, mostOctetsShown);
}

bool looksLikeDictionary(const DERItem& content) {
    DERDecodedInfo first;
    return content.length == 0 ||
           (DERDecodeItem(&content, &first) == DERSuccess && first.tag == Img4PropertyTag(first.tag));
}

void Reader::readValue(const Img4Property& property, const std::string& what, unsigned depth, ordered_json& json) {
    const DERItem& value = property.value;
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
        json["value"] = escapedText(value, mostCharactersShown);
        if (value.length > mostCharactersShown)
            json["sha256"] = digestText(crypto::sha256, crypto::sha256Size, value);
        break;
    case DERTagSet:
    case DERTagSequence:
        if (depth < deepestDictionary && looksLikeDictionary(value))
            json["properties"] = readDictionary(value, quotedCode(property.tag & DERTagNumberMask), depth + 1);
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
            fault(end, "Octets follow the container");
        readContainer(content);
        return Img4DecodeInit(whole_.data, whole_.length, &record);
    case Img4FourCC('I', 'M', '4', 'M'):
        if (!fills)
            fault(end, "Octets follow the manifest");
        readBareManifest();
        return report_.json["kind"] == "manifest" ? Img4DecodeInitManifest(whole_.data, whole_.length, &record)
                                                  : Img4DecodeInitUnsignedManifest(whole_.data, whole_.length, &record);
    default:
        fault(content.data, "The file is no Img4: it begins with " +
                                (hasMagic ? quotedCode(magic) : "no four-character magic") +
                                " instead of \"IMG4\", \"IM4P\" or \"IM4M\"");
        return DERUnexpectedTag;
    }
}

void Reader::read() {
    DERItem content;
    report_.json["length"] = whole_.length;
    if (whole_.length == 0)
        fault(whole_.data, "The file is empty");
    else if (enter(whole_, "The file", &content)) {
        if (const DERReturn status = readAll(content); status != DERSuccess)
            fault(whole_.data, "The decoder refuses the file with status " + std::to_string(status));
    }
    if (properties_ > mostProperties)
        note(std::to_string(properties_ - mostProperties) + " further properties are not shown");
    report_.json["notes"] = std::move(notes_);
    report_.text = img4Text(report_.json);
}

} // namespace

Report showImg4(const std::uint8_t* data, std::size_t length) {
    Report report;
    Reader(data, length, report).read();
    return report;
}
