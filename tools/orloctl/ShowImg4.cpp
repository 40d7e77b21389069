#include "tools/orloctl/ShowImg4.h"

#include "img4/Img4.h"
#include "tools/orloctl/DerItems.h"
#include "tools/orloctl/DerText.h"
#include "tools/orloctl/Img4Findings.h"
#include "tools/orloctl/Img4Properties.h"
#include "tools/orloctl/Img4Words.h"

namespace {

using namespace img4show;
using nlohmann::ordered_json;

// The content of the item at the start of `encoding`; absent when there is none.
DERItem contentOf(const DERItem& encoding) {
    DerItems items(encoding);
    return items.next() ? items.item().content : DERItem{};
}

// Turns what the decoder has read of a file into JSON. The findings go into `report`.
class Reader {
public:
    Reader(const DERItem& file, Report& report) : whole_(file), report_(report), findings_(file, report) {}

    void read();

private:
    ordered_json payload();
    ordered_json compression(const DERItem& content);
    ordered_json payloadProperties();
    ordered_json manifest(bool isSigned);
    void addBody(ordered_json& json);
    ordered_json certificates(const DERItem& content);
    void addRestoreInfo();

    // The decoder does not look behind the SEQUENCE in a context item or in a bare payload, so it is no fault.
    void noteRest(const DERItem& outer, const char* what);
    ordered_json properties(const DERItem& dictionary, const std::string& where) {
        return report_.lists.add(readProperties(dictionary, where, findings_));
    }
    void addDigests(const DERItem& raw, ordered_json& json) const;

    DERItem whole_;
    Report& report_;
    Findings findings_;
    Img4Record record_ = {};
};

void Reader::noteRest(const DERItem& outer, const char* what) {
    DerItems items(outer);
    if (!items.next() || items.encoding().length == outer.length)
        return;
    const std::uint8_t* end = outer.data + items.encoding().length;
    findings_.note(std::string(what) + " is followed by octets that belong to nothing, " +
                   std::to_string(outer.length - items.encoding().length) + " of them, " + findings_.at(end));
}

void Reader::addDigests(const DERItem& raw, ordered_json& json) const {
    json["offset"] = findings_.offsetOf(raw.data);
    json["length"] = raw.length;
    json["sha1"] = sha1Text(raw);
    json["sha256"] = sha256Text(raw);
    json["sha384"] = sha384Text(raw);
}

// The decoder looks at the size only when it is asked for.
ordered_json Reader::compression(const DERItem& content) {
    ordered_json json = ordered_json::object();
    DerItems numbers(content);
    for (const auto& [key, what] : {std::pair("algorithm", "algorithm"), {"uncompressedSize", "uncompressed size"}}) {
        std::uint32_t number = 0;
        if (!numbers.next())
            break;
        if (DERParseInteger(&numbers.item().content, &number) == DERSuccess)
            json[key] = number;
        else
            findings_.fault(numbers.item().content.data,
                            std::string("The ") + what + " " + numberReason(numbers.item().content, 32));
    }
    return json;
}

ordered_json Reader::payloadProperties() {
    DERItem content;
    if (Img4DecodeGetPayloadProperties(&record_, &content) != DERSuccess)
        return {};
    DerItems fields(contentOf(content));
    noteRest(content, "The SEQUENCE of payload properties");
    return fields.next() && fields.next() && fields.item().tag == DERTagSet
               ? properties(fields.item().content, "the payload")
               : ordered_json::array();
}

ordered_json Reader::payload() {
    const Img4PayloadRecord& payload = record_.payload;
    ordered_json json = ordered_json::object();
    addDigests(record_.payloadRaw, json);
    if (payload.type.data != nullptr)
        json["type"] = escapedText(payload.type);
    if (payload.version.data != nullptr)
        json["version"] = escapedText(payload.version);
    if (payload.data.data != nullptr)
        json["data"] = dataJson(payload.data);
    if (payload.data.data != nullptr && payload.data.length == 0)
        findings_.note("The payload's data is empty, so that the payload counts as absent");
    if (payload.keybag.data != nullptr)
        json["keybag"] = dataJson(payload.keybag);
    if (payload.compression.data != nullptr)
        json["compression"] = compression(payload.compression);
    if (ordered_json found = payloadProperties(); !found.is_null())
        json["properties"] = std::move(found);
    return json;
}

ordered_json Reader::certificates(const DERItem& content) {
    std::uint64_t count = 0;
    DerItems items(content);
    for (; items.next(); ++count)
        if (items.item().tag != DERTagSequence)
            findings_.fault(items.encoding().data, "Certificate " + std::to_string(count) + " of the chain is " +
                                                       derTagName(items.item().tag) + " instead of SEQUENCE");
    if (items.isBroken())
        findings_.headerFault(items.encoding(), "Certificate " + std::to_string(count) + " of the chain");
    return report_.lists.add([content, file = whole_.data](const auto& take) {
        DerItems list(content);
        while (list.next() && take({{{"offset", list.encoding().data - file}, {"length", list.encoding().length}}, {}}))
            ;
    });
}

void Reader::addBody(ordered_json& json) {
    DERItem manb;
    DERItem manp;
    Img4Refusal refusal;
    json["body"] = properties(contentOf(record_.manifest.body), "the manifest body");
    if (Img4DecodeFindDictionariesExplained(&record_, &manb, &manp, &refusal) != DERSuccess)
        findings_.fault(refusal.place, lookupReason(refusal) + ", so that every lookup fails");
}

ordered_json Reader::manifest(bool isSigned) {
    const Img4ManifestRecord& manifest = record_.manifest;
    ordered_json json = ordered_json::object();
    std::uint32_t version = 0;
    addDigests(record_.manifestRaw, json);
    json["signed"] = isSigned;
    if (manifest.version.data != nullptr && DERParseInteger(&manifest.version, &version) == DERSuccess)
        json["version"] = version;
    if (manifest.body.data != nullptr)
        addBody(json);
    if (manifest.signature.data != nullptr)
        json["signature"] = dataJson(manifest.signature);
    if (manifest.certChain.data != nullptr)
        json["certificates"] = certificates(manifest.certChain);
    return json;
}

void Reader::addRestoreInfo() {
    DerItems fields(contentOf(whole_));
    while (fields.next() && fields.item().tag != DERTagContextConstructed(1))
        ;
    if (fields.item().tag != DERTagContextConstructed(1))
        return;
    const DERItem& encoding = fields.item().content;
    ordered_json json = {{"offset", findings_.offsetOf(encoding.data)}, {"length", encoding.length}};
    if (record_.restoreInfo.properties.data != nullptr)
        json["properties"] = properties(record_.restoreInfo.properties, "the restore information");
    report_.json["restoreInfo"] = std::move(json);
    noteRest(encoding, "The restore information");
}

void Reader::read() {
    Img4Kind kind = Img4KindUnknown;
    Img4Refusal refusal = {};
    report_.json["length"] = whole_.length;
    if (Img4DecodeInitExplained(whole_.data, whole_.length, &record_, &kind, &refusal) != DERSuccess)
        findings_.fault(refusal.place, fileReason(whole_, refusal));
    if (kind != Img4KindUnknown)
        report_.json["kind"] = kindName(kind);
    if (record_.payloadRaw.data != nullptr) {
        report_.json["payload"] = payload();
        noteRest(record_.payloadRaw, "The payload");
    }
    if (record_.manifestRaw.data != nullptr) {
        report_.json["manifest"] = manifest(kind != Img4KindUnsignedManifest);
        if (kind == Img4KindContainer)
            noteRest(record_.manifestRaw, "The manifest");
    }
    if (kind == Img4KindContainer)
        addRestoreInfo();
    report_.json["notes"] = findings_.notes();
}

} // namespace

Report showImg4(const std::uint8_t* data, std::size_t length) {
    Report report;
    Reader({data, length}, report).read();
    return report;
}
