#include "tools/orloctl/VerifyText.h"

#include "tools/orloctl/Img4Text.h"

namespace {

using nlohmann::ordered_json;

constexpr std::size_t mostObjects = 1000;
constexpr std::size_t longestName = 512;
constexpr std::size_t longestValue = 512;

std::string textOf(const ordered_json& json, const char* key) {
    return json[key].get<std::string>();
}

std::string padded(std::string text, std::size_t width) {
    text.resize(std::max(text.size(), width), ' ');
    return text;
}

// 1  leaf  CN=Tevari Manifest Signing,O=Tevari; issuer ...; EC P-384; ecdsa-with-SHA384; serial number 4f...
std::string certificateLine(const ordered_json& certificate) {
    const std::string line =
        "  " + certificate["number"].dump() + "  " + padded(textOf(certificate, "role"), 12) + "  ";
    if (certificate.contains("fault"))
        return line + textOf(certificate, "fault") + "\n";
    return line + shortened(textOf(certificate, "subject"), longestName) + "; issuer " +
           shortened(textOf(certificate, "issuer"), longestName) + "; " + textOf(certificate, "key") + "; " +
           textOf(certificate, "signatureAlgorithm") + "; serial number " +
           shortened(textOf(certificate, "serialNumber"), longestName) + "\n";
}

std::string constraintLine(const ordered_json& constraint) {
    std::string line = "  " + textOf(constraint, "dictionary") + " " + textOf(constraint, "name") + " " +
                       shortened(textOf(constraint, "demand"), longestValue) + ": " + textOf(constraint, "state");
    if (constraint["state"] == "broken" && constraint.contains("found"))
        line += ", found " + shortened(textOf(constraint, "found"), longestValue);
    return line + "\n";
}

std::string digestLines(const ordered_json& digests) {
    std::string text = "Digests, " + textOf(digests, "algorithm") + ":\n";
    for (const char* key : {"manifest", "body", "payload"})
        if (digests.contains(key))
            text += "  " + padded(std::string(key) + ":", 10) + textOf(digests, key) + "\n";
    return text;
}

std::string headText(const ordered_json& json) {
    std::string text = "Img4 " + json.value("kind", "file") + ", " + json["length"].dump() + " bytes\n";
    text += "Trust domain: " + textOf(json, "trustDomain") + "\n";
    if (json.contains("profile"))
        text += "Profile: " + textOf(json, "profile") + ", root " + textOf(json, "root") + "\n";
    return text;
}

} // namespace

std::string verifyText(const Report& report) {
    const ordered_json& json = report.json;
    std::string text = headText(json);
    if (json.contains("chain")) {
        text += "Chain:\n";
        for (const ordered_json& certificate : json["chain"])
            text += certificateLine(certificate);
    }
    if (json.contains("constraints")) {
        text += "Constraints of the leaf:\n";
        for (const ordered_json& constraint : json["constraints"])
            text += constraintLine(constraint);
    }
    if (json.contains("digests"))
        text += digestLines(json["digests"]);
    if (json.contains("manifestProperties"))
        text += "Manifest properties:\n" + img4PropertiesText(report.lists.at(json["manifestProperties"]), 1);
    if (json.contains("objects")) {
        std::size_t count = 0;
        text += "Objects:";
        report.lists.at(json["objects"])([&](const Element& object) {
            if (++count <= mostObjects)
                text += " " + object.json.get<std::string>();
            return true;
        });
        text += (count > mostObjects ? " and " + std::to_string(count - mostObjects) + " more" : "") + "\n";
    }
    if (json.contains("object"))
        text += "Object " + textOf(json["object"], "name") + ":\n" +
                img4PropertiesText(report.lists.at(json["object"]["properties"]), 1);
    for (const ordered_json& note : json["notes"])
        text += "Note: " + note.get<std::string>() + "\n";
    return text + "Result: " + (json["trusted"].get<bool>() ? textOf(json, "result") : "not trusted") + "\n";
}
