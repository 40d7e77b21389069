#include "tools/orloctl/Img4Text.h"

namespace {

using nlohmann::ordered_json;

constexpr std::uint64_t mostProperties = 10000;
constexpr std::uint64_t mostCertificates = 100;
constexpr std::size_t mostCharactersShown = 128;

std::string bytesText(const ordered_json& json, std::size_t most = mostCharactersShown) {
    const auto length = json["length"].get<std::uint64_t>();
    std::string text = std::to_string(length) + (length == 1 ? " byte" : " bytes");
    if (json.contains("hex") && length != 0)
        text += ": " + shortened(json["hex"], most);
    if (json.contains("sha256"))
        text += " (SHA-256 " + json["sha256"].get<std::string>() + ")";
    return text;
}

std::string placeText(const ordered_json& json) {
    return json["length"].dump() + " bytes at offset " + json["offset"].dump();
}

class Lines {
public:
    explicit Lines(const Lists& lists) : lists_(lists) {}

    void add(unsigned depth, const std::string& line) {
        text_ += std::string(2 * std::size_t{depth}, ' ') + line + "\n";
    }
    void addProperties(unsigned depth, const Elements& properties);
    // There is an empty array in place of a dictionary that could not be entered.
    void addProperties(unsigned depth, const ordered_json& properties) {
        if (properties.is_binary())
            addProperties(depth, lists_.at(properties));
    }
    void addCertificates(const ordered_json& certificates);
    void addDigests(const ordered_json& section);
    void addPayload(const ordered_json& payload);
    void addManifest(const ordered_json& manifest);
    void addRestoreInfo(const ordered_json& restoreInfo);

    std::string text() && {
        if (properties_ > mostProperties)
            add(0, std::to_string(properties_ - mostProperties) + " further properties are not shown");
        return std::move(text_);
    }

private:
    const Lists& lists_;
    std::string text_;
    std::uint64_t properties_ = 0;
};

// brdI  INTEGER 12
std::string propertyLine(const ordered_json& property) {
    std::string line = property["name"];
    if (property.contains("type"))
        line += "  " + img4ValueText(property, mostCharactersShown);
    if (property.contains("fault"))
        line += "  WRONG: " + property["fault"].get<std::string>();
    if (property.contains("hidden"))
        line += "  hidden " + property["hidden"].get<std::string>();
    return line;
}

void Lines::addProperties(unsigned depth, const Elements& properties) {
    properties([&](const Element& property) {
        if (++properties_ <= mostProperties)
            add(depth, propertyLine(property.json));
        if (property.json.contains("properties"))
            addProperties(depth + 1, property.lists.at(property.json["properties"]));
        return true;
    });
}

void Lines::addCertificates(const ordered_json& certificates) {
    std::string lines;
    std::uint64_t count = 0;
    lists_.at(certificates)([&](const Element& certificate) {
        if (++count <= mostCertificates)
            lines += "    " + placeText(certificate.json) + "\n";
        return true;
    });
    add(1, "certificates: " + std::to_string(count));
    text_ += lines;
    if (count > mostCertificates)
        add(2, "... " + std::to_string(count - mostCertificates) + " more");
}

void Lines::addDigests(const ordered_json& section) {
    for (const auto& [key, name] : {std::pair("sha1", "SHA-1"), {"sha256", "SHA-256"}, {"sha384", "SHA-384"}})
        add(1, std::string(name) + ": " + section[key].get<std::string>());
}

void Lines::addPayload(const ordered_json& payload) {
    add(0, "Payload, " + placeText(payload));
    for (const char* key : {"type", "version"})
        if (payload.contains(key))
            add(1, std::string(key) + ": \"" + shortened(payload[key], mostCharactersShown) + "\"");
    for (const char* key : {"data", "keybag"})
        if (payload.contains(key))
            add(1, std::string(key) + ": " + bytesText(payload[key]));
    if (payload.contains("compression")) {
        std::string line = "compression:";
        for (const auto& [key, value] : payload["compression"].items())
            line += " " + key + " " + value.dump();
        add(1, line);
    }
    if (payload.contains("properties")) {
        add(1, "properties:");
        addProperties(2, payload["properties"]);
    }
    addDigests(payload);
}

void Lines::addManifest(const ordered_json& manifest) {
    add(0, std::string(manifest["signed"].get<bool>() ? "Manifest, " : "Unsigned manifest, ") + placeText(manifest));
    if (manifest.contains("version"))
        add(1, "version: " + manifest["version"].dump());
    if (manifest.contains("body"))
        addProperties(1, manifest["body"]);
    if (manifest.contains("signature"))
        add(1, "signature: " + bytesText(manifest["signature"]));
    if (manifest.contains("certificates"))
        addCertificates(manifest["certificates"]);
    addDigests(manifest);
}

void Lines::addRestoreInfo(const ordered_json& restoreInfo) {
    add(0, "Restore information, " + placeText(restoreInfo));
    if (restoreInfo.contains("properties"))
        addProperties(1, restoreInfo["properties"]);
}

} // namespace

std::string img4ValueText(const ordered_json& property, std::size_t most) {
    std::string text = property["type"];
    if (property.contains("value"))
        text += " " + shortened(property["value"].dump(), most);
    else if (property.contains("length"))
        text += " " + bytesText(property, most);
    return text;
}

std::string img4Text(const Report& report) {
    const ordered_json& json = report.json;
    Lines lines(report.lists);
    lines.add(0, "Img4 " + json.value("kind", "file") + ", " + json["length"].dump() + " bytes");
    if (json.contains("payload"))
        lines.addPayload(json["payload"]);
    if (json.contains("manifest"))
        lines.addManifest(json["manifest"]);
    if (json.contains("restoreInfo"))
        lines.addRestoreInfo(json["restoreInfo"]);
    for (const ordered_json& note : json["notes"])
        lines.add(0, "Note: " + note.get<std::string>());
    return std::move(lines).text();
}
