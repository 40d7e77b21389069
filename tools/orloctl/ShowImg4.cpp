#include <set>

#include "img4/Img4.h"
#include "platform/Crypto.h"
#include "tools/orloctl/DerItems.h"
#include "tools/orloctl/DerText.h"
#include "tools/orloctl/Findings.h"
#include "tools/orloctl/Img4Words.h"
#include "tools/orloctl/ShowFile.h"

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

// Turns what the decoder has read of a file into JSON. The findings go into `report`.
class Reader {
public:
    Reader(const DERItem& file, Report& report) : report_(report), findings_(file, report) {}

    void read() {
        report_.json["length"] = findings_.file().length;
        const Img4Kind kind = readImg4(findings_, &record_);
        if (kind != Img4KindUnknown)
            report_.json["kind"] = kindName(kind);
        if (record_.payloadRaw.data != nullptr)
            report_.json["payload"] = payload();
        if (record_.manifestRaw.data != nullptr)
            report_.json["manifest"] = manifest(kind != Img4KindUnsignedManifest);
        if (kind == Img4KindContainer)
            addRestoreInfo();
        report_.json["notes"] = findings_.notes();
    }

private:
    // The content of the item at the start of `outer`, absent when there is none. The decoder does not look behind the
    // item in a context item or in a bare payload, so what is there is no fault.
    DERItem contentOf(const DERItem& outer, const char* what) {
        DerItems items(outer);
        if (!items.next())
            return {};
        if (const std::uint64_t rest = outer.length - items.encoding().length; rest != 0)
            findings_.note(std::string(what) + " is followed by octets that belong to nothing, " +
                           std::to_string(rest) + " of them, at offset " +
                           std::to_string(findings_.offsetOf(outer.data + items.encoding().length)));
        return items.item().content;
    }

    // Where the section is that the decoder digests, and what it is called.
    ordered_json section(const DERItem& raw, const char* what) {
        contentOf(raw, what);
        return {{"offset", findings_.offsetOf(raw.data)},
                {"length", raw.length},
                {"sha1", digestText(raw, crypto::sha1Size)},
                {"sha256", digestText(raw, crypto::sha256Size)},
                {"sha384", digestText(raw, crypto::sha384Size)}};
    }

    ordered_json properties(const DERItem& dictionary, const std::string& where) {
        return report_.lists.add(readProperties(dictionary, where, findings_));
    }

    // The decoder looks at the size only when it is asked for.
    ordered_json compression(const DERItem& content) {
        ordered_json json = ordered_json::object();
        DerItems numbers(content);
        for (const auto& [key, what] :
             {std::pair("algorithm", "algorithm"), {"uncompressedSize", "uncompressed size"}}) {
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

    ordered_json payload() {
        const Img4PayloadRecord& payload = record_.payload;
        ordered_json json = section(record_.payloadRaw, "The payload");
        DERItem encoding;
        for (const auto& [name, text] : {std::pair("type", payload.type), {"version", payload.version}})
            if (text.data != nullptr)
                json[name] = escapedText(text);
        for (const auto& [name, data] : {std::pair("data", payload.data), {"keybag", payload.keybag}})
            if (data.data != nullptr)
                json[name] = dataJson(data);
        if (payload.data.data != nullptr && payload.data.length == 0)
            findings_.note("The payload's data is empty, so that the payload counts as absent");
        if (payload.compression.data != nullptr)
            json["compression"] = compression(payload.compression);
        if (Img4DecodeGetPayloadProperties(&record_, &encoding) == DERSuccess) {
            DerItems fields(contentOf(encoding, "The SEQUENCE of payload properties"));
            if (fields.next() && fields.next() && fields.item().tag == DERTagSet)
                json["properties"] = properties(fields.item().content, "the payload");
        }
        return json;
    }

    ordered_json certificates(const DERItem& content) {
        const std::uint8_t* const file = findings_.file().data;
        std::uint64_t count = 0;
        DerItems items(content);
        for (; items.next(); ++count)
            if (items.item().tag != DERTagSequence)
                findings_.fault(items.encoding().data, "Certificate " + std::to_string(count) + " of the chain is " +
                                                           derTagName(items.item().tag) + " instead of SEQUENCE");
        if (const DERRefusal* why = items.refusal())
            findings_.fault(why->place,
                            "Certificate " + std::to_string(count) + " of the chain " + derRefusalText(*why, "", file));
        return report_.lists.add([content, file](const auto& take) {
            DerItems list(content);
            while (list.next() &&
                   take({{{"offset", list.encoding().data - file}, {"length", list.encoding().length}}, {}}))
                ;
        });
    }

    ordered_json manifest(bool isSigned) {
        const Img4ManifestRecord& manifest = record_.manifest;
        ordered_json json = section(record_.manifestRaw, "The manifest");
        std::uint32_t version = 0;
        json["signed"] = isSigned;
        if (manifest.version.data != nullptr && DERParseInteger(&manifest.version, &version) == DERSuccess)
            json["version"] = version;
        if (manifest.body.data != nullptr) {
            DERItem manb;
            DERItem manp;
            Img4Refusal refusal;
            json["body"] = properties(contentOf(manifest.body, "The manifest's body"), "the manifest body");
            if (Img4DecodeFindDictionariesExplained(&record_, &manb, &manp, &refusal) != DERSuccess)
                findings_.fault(refusal.place, lookupReason(refusal) + ", so that every lookup fails");
        }
        if (manifest.signature.data != nullptr)
            json["signature"] = dataJson(manifest.signature);
        if (manifest.certChain.data != nullptr)
            json["certificates"] = certificates(manifest.certChain);
        return json;
    }

    void addRestoreInfo() {
        DerItems outer(findings_.file());
        outer.next();
        DerItems fields(outer.item().content);
        while (fields.next() && fields.item().tag != DERTagContextConstructed(1))
            ;
        if (fields.item().tag != DERTagContextConstructed(1))
            return;
        const DERItem& encoding = fields.item().content;
        ordered_json json = {{"offset", findings_.offsetOf(encoding.data)}, {"length", encoding.length}};
        if (record_.restoreInfo.properties.data != nullptr)
            json["properties"] = properties(record_.restoreInfo.properties, "the restore information");
        report_.json["restoreInfo"] = std::move(json);
        contentOf(encoding, "The restore information");
    }

    Report& report_;
    Findings findings_;
    Img4Record record_ = {};
};

} // namespace

Report showImg4(const DERItem& file) {
    Report report;
    Reader(file, report).read();
    return report;
}

Elements readProperties(const DERItem& content, const std::string& where, Findings& findings) {
    Elements properties = propertiesIn(content, findings.file().data, 0);
    check(properties, where, findings);
    return properties;
}
