#include "tools/orloctl/ShowBcfg.h"

#include <cctype>
#include <cstdarg>
#include <cstdio>
#include <limits>
#include <string>
#include <vector>

#include "Daemon/Conversions.h"
#include "der/DERDecode.h"
#include "sysconfig/SysConfig3.h"
#include "sysconfig/SysConfig3Ptr.h"

namespace {

using sysconfig::SysConfig3Ptr;

using nlohmann::ordered_json;

std::vector<std::string>* messages = nullptr;

// Keeps a message of the library, without the prototype that most begin with.
void keepMessage(int, const char* format, ...) {
    char line[512];
    va_list arguments;
    va_start(arguments, format);
    (void)std::vsnprintf(line, sizeof line, format, arguments); // NOLINT(clang-analyzer-valist.Uninitialized)
    va_end(arguments);
    const std::string message = line;
    const std::size_t prototypeEnd = format[0] == '%' && format[1] == 's' ? message.find(") ") : std::string::npos;
    messages->push_back(prototypeEnd == std::string::npos ? message : message.substr(prototypeEnd + 2));
}

// Collects the library's messages for as long as it lives.
class MessageCollector {
public:
    MessageCollector() : earlier_(getSysConfig3LogHandler()) {
        messages = &collected_;
        setSysConfig3LogHandler(keepMessage);
    }
    ~MessageCollector() {
        setSysConfig3LogHandler(earlier_);
        messages = nullptr;
    }
    MessageCollector(const MessageCollector&) = delete;
    MessageCollector& operator=(const MessageCollector&) = delete;

    const std::vector<std::string>& collected() const { return collected_; }

private:
    std::vector<std::string> collected_;
    SysConfig3LogHandler earlier_;
};

std::string hexadecimal(std::uint32_t number) {
    char digits[16];
    (void)std::snprintf(digits, sizeof digits, "0x%X", number);
    return digits;
}

// A number as its four characters when all of them can be shown, in hexadecimal otherwise.
std::string fourCharacters(std::uint32_t code) {
    std::string characters;
    for (int shift = 24; shift >= 0; shift -= 8)
        characters += static_cast<char>(code >> shift & 0xFF);
    for (const char character : characters)
        if (character < 0x20 || character > 0x7E)
            return hexadecimal(code);
    return characters;
}

std::string hexDigits(const SysConfigData& view) {
    if (!view.data)
        return "";
    const Value digits = DatatoHexString(Value::Data(view.data, view.data + view.length));
    return digits.isNothing() ? "" : *digits.text();
}

ordered_json payloadEntries(const __SysConfig3* object) {
    ordered_json entries = ordered_json::array();
    for (const auto* entry = sysConfig3GetHeadPayloadEntry(object); entry;
         entry = sysConfig3PayloadEntryGetNextEntry(entry)) {
        ordered_json json{{"key", fourCharacters(sysConfig3PayloadEntryGetKey(entry))},
                          {"comment", sysConfig3PayloadEntryGetComment(entry)}};
        SysConfigData data = {};
        if (sysConfig3PayloadEntryGetData(entry, &data))
            json["data"] = hexDigits(data);
        else if (const char* string = sysConfig3PayloadEntryGetString(entry))
            json["string"] = string;
        else
            json["deleted"] = sysConfig3PayloadEntryGetDeleted(entry);
        entries.push_back(std::move(json));
    }
    return entries;
}

ordered_json metadataEntries(const __SysConfig3* object) {
    ordered_json entries = ordered_json::array();
    for (const auto* entry = sysConfig3GetHeadMetadataEntry(object); entry;
         entry = sysConfig3MetadataEntryGetNextEntry(entry)) {
        ordered_json json{{"key", sysConfig3MetadataEntryGetKey(entry)}};
        SysConfigData data = {};
        if (sysConfig3MetadataEntryGetData(entry, &data))
            json["data"] = hexDigits(data);
        else
            json["string"] = sysConfig3MetadataEntryGetString(entry);
        entries.push_back(std::move(json));
    }
    return entries;
}

ordered_json manifestHMACs(const __SysConfig3* object) {
    const auto* manifest = sysConfig3GetManifest(object);
    SysConfigData payload = {}, metadata = {}, full = {};
    sysConfig3ManifestGetPayloadHMAC(manifest, &payload);
    sysConfig3ManifestGetMetadataHMAC(manifest, &metadata);
    sysConfig3ManifestGetFullHMAC(manifest, &full);
    return {{"payload", hexDigits(payload)}, {"metadata", hexDigits(metadata)}, {"full", hexDigits(full)}};
}

std::string hmacState(__SysConfig3* object, const Value::Data& key) {
    if (!sysConfig3HMACIsSupported(sysConfig3GetVersion(object)))
        return "not used by this version";
    if (key.empty())
        return "not checked, for want of a key";
    Value::Data copy = key;
    sysConfig3SetHMACKey(object, {copy.data(), static_cast<std::uint32_t>(copy.size())});
    return sysConfig3IsValidHMAC(object) ? "valid" : "do not match";
}

// Why the outer structure of a blob is refused; the library itself says nothing about that.
std::string outerProblem(const Value::Data& blob) {
    const DERItem der{blob.data(), blob.size()};
    DERTag tag = 0;
    DERSequence sequence = {};
    if (blob.empty())
        return "The file is empty.";
    if (const DERReturn result = DERDecodeSeqInit(&der, &tag, &sequence); result != DERSuccess || tag != DERTagSequence)
        return result == DERDecodeError ? "No strict DER item of definite length lies whole at offset 0."
                                        : "The item at offset 0 is no SEQUENCE.";
    constexpr struct {
        const char* name;
        DERTag tag;
    } elements[] = {{"magic", DERTagInteger},
                    {"version", DERTagInteger},
                    {"payload", DERTagPrivateConstructed(0x53504159)},
                    {"metadata", DERTagPrivateConstructed(0x4D455441)},
                    {"manifest", DERTagPrivateConstructed(0x4D414E49)}};
    for (const auto& element : elements) {
        const std::string place =
            std::string(element.name) + " element, at offset " + std::to_string(sequence.next - blob.data());
        DERDecodedInfo item = {};
        const DERReturn result = DERDecodeSeqNext(&sequence, &item);
        if (result == DEREndOfSequence)
            return "The blob ends before the " + place + ".";
        if (result != DERSuccess)
            return "The " + place + ", is not strict DER.";
        if (item.tag != element.tag)
            return "The " + place + ", has another tag than its own.";
    }
    return "Octets follow the manifest element, at offset " + std::to_string(sequence.next - blob.data()) + ".";
}

std::string valueText(const ordered_json& entry) {
    if (entry.contains("data")) {
        const std::string digits = entry["data"];
        constexpr std::size_t shown = 64;
        return "data, " + std::to_string(digits.size() / 2) + " bytes: " + digits.substr(0, shown) +
               (digits.size() > shown ? "..." : "");
    }
    if (entry.contains("string"))
        return "string: " + entry["string"].dump(-1, ' ', true, ordered_json::error_handler_t::replace);
    return entry["deleted"].get<bool>() ? "deleted" : "no value";
}

std::string entriesText(const char* title, const ordered_json& entries) {
    std::string text = std::string(title) + ": " + std::to_string(entries.size()) + "\n";
    for (const ordered_json& entry : entries) {
        text += "  " + entry["key"].dump(-1, ' ', true, ordered_json::error_handler_t::replace);
        if (entry.contains("comment"))
            text += "  comment " + entry["comment"].dump(-1, ' ', true, ordered_json::error_handler_t::replace);
        text += "  " + valueText(entry) + "\n";
    }
    return text;
}

std::string reportText(const ordered_json& json) {
    std::string text = "Configuration blob \"" + json["magic"].get<std::string>() + "\", version " +
                       json["version"].get<std::string>() + "\n";
    text += entriesText("Payload entries", json["payload"]);
    text += entriesText("Metadata entries", json["metadata"]);
    text += "HMACs: " + json["hmacState"].get<std::string>() + "\n";
    for (const auto& [name, digits] : json["hmacs"].items())
        text += "  " + name + ": " +
                (digits.get_ref<const std::string&>().empty() ? "absent" : digits.get<std::string>()) + "\n";
    for (const ordered_json& message : json["messages"])
        text += "Note: " + message.get<std::string>() + "\n";
    return text;
}

Report refused(const std::vector<std::string>& why, const Value::Data& blob) {
    Report report;
    report.ok = false;
    report.problem = "No configuration blob. " + (why.empty() ? outerProblem(blob) : why.back());
    report.json = {{"messages", why}};
    return report;
}

} // namespace

Report showBcfg(const Value::Data& blob, const Value::Data& hmacKey) {
    const MessageCollector collector;
    if (blob.size() > std::numeric_limits<std::uint32_t>::max())
        return refused({"It is larger than 4 GiB."}, blob);
    const SysConfig3Ptr object(decodeSysConfig3(blob.data(), static_cast<std::uint32_t>(blob.size())));
    if (!object)
        return refused(collector.collected(), blob);
    Report report;
    report.json = {{"magic", fourCharacters(sysConfig3GetMagic(object.get()))},
                   {"version", hexadecimal(sysConfig3GetVersion(object.get()))},
                   {"payload", payloadEntries(object.get())},
                   {"metadata", metadataEntries(object.get())},
                   {"hmacState", hmacState(object.get(), hmacKey)},
                   {"hmacs", manifestHMACs(object.get())},
                   {"messages", collector.collected()}};
    report.text = reportText(report.json);
    if (report.json["hmacState"] == "do not match") {
        report.ok = false;
        report.problem = "The HMACs do not match the entries under this key.";
    }
    return report;
}
