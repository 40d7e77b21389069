#include "tools/orloctl/Img4Text.h"

namespace {

using nlohmann::ordered_json;

std::string bytesText(const ordered_json& json) {
    const auto length = json["length"].get<std::uint64_t>();
    std::string text = std::to_string(length) + (length == 1 ? " byte" : " bytes");
    if (json.contains("hex") && length != 0)
        text += ": " + json["hex"].get<std::string>();
    if (json.contains("sha256"))
        text += " (SHA-256 " + json["sha256"].get<std::string>() + ")";
    return text;
}

std::string placeText(const ordered_json& json) {
    return json["length"].dump() + " bytes at offset " + json["offset"].dump();
}

class Lines {
public:
    void add(unsigned depth, const std::string& line) {
        text_ += std::string(2 * std::size_t{depth}, ' ') + line + "\n";
    }
    void addProperties(unsigned depth, const ordered_json& properties);
    void addDigests(const ordered_json& section);
    void addPayload(const ordered_json& payload);
    void addManifest(const ordered_json& manifest);
    void addRestoreInfo(const ordered_json& restoreInfo);

    std::string text() && { return std::move(text_); }

private:
    std::string text_;
};

// brdI  INTEGER 12
std::string propertyLine(const ordered_json& property) {
    std::string line = property["name"];
    if (property.contains("type"))
        line += "  " + img4ValueText(property);
    if (property.contains("fault"))
        line += "  WRONG: " + property["fault"].get<std::string>();
    if (property.contains("hidden"))
        line += "  hidden " + property["hidden"].get<std::string>();
    return line;
}

void Lines::addProperties(unsigned depth, const ordered_json& properties) {
    for (const ordered_json& property : properties) {
        add(depth, propertyLine(property));
        if (property.contains("properties"))
            addProperties(depth + 1, property["properties"]);
    }
}

void Lines::addDigests(const ordered_json& section) {
    for (const auto& [key, name] : {std::pair("sha1", "SHA-1"), {"sha256", "SHA-256"}, {"sha384", "SHA-384"}})
        add(1, std::string(name) + ": " + section[key].get<std::string>());
}

void Lines::addPayload(const ordered_json& payload) {
    add(0, "Payload, " + placeText(payload));
    for (const char* key : {"type", "version"})
        if (payload.contains(key))
            add(1, std::string(key) + ": \"" + payload[key].get<std::string>() + "\"");
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
    if (manifest.contains("certificates")) {
        add(1, "certificates: " + std::to_string(manifest["certificates"].size()));
        for (const ordered_json& certificate : manifest["certificates"])
            add(2, placeText(certificate));
    }
    addDigests(manifest);
}

void Lines::addRestoreInfo(const ordered_json& restoreInfo) {
    add(0, "Restore information, " + placeText(restoreInfo));
    if (restoreInfo.contains("properties"))
        addProperties(1, restoreInfo["properties"]);
}

} // namespace

std::string img4ValueText(const ordered_json& property) {
    std::string text = property["type"];
    if (property.contains("value"))
        text += " " + property["value"].dump();
    else if (property.contains("length"))
        text += " " + bytesText(property);
    return text;
}

std::string img4PropertiesText(const ordered_json& properties, unsigned depth) {
    Lines lines;
    lines.addProperties(depth, properties);
    return std::move(lines).text();
}

std::string img4Text(const ordered_json& json) {
    Lines lines;
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
