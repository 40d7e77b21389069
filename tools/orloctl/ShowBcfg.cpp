#include <cstdarg>
#include <cstdio>
#include <limits>
#include <memory>
#include <string>
#include <vector>

#include "sysconfig/SysConfig3.h"
#include "sysconfig/SysConfig3Ptr.h"
#include "tools/orloctl/DerText.h"
#include "tools/orloctl/ShowFile.h"

namespace {

// Entries are read while they are written, from an object that lives as long as the report.
using ObjectPtr = std::shared_ptr<__SysConfig3>;

using nlohmann::ordered_json;

constexpr std::size_t mostMessages = 100;

// The library's messages, of which a blob can cause several for each of its entries.
struct Messages {
    std::vector<std::string> first;
    std::size_t leftOut = 0;
    std::string last;
};

Messages* messages = nullptr;

// Keeps a message of the library, without the prototype that most begin with.
void keepMessage(int, const char* text, ...) {
    char line[512];
    va_list arguments;
    va_start(arguments, text);
    (void)std::vsnprintf(line, sizeof line, text, arguments); // NOLINT(clang-analyzer-valist.Uninitialized)
    va_end(arguments);
    const std::string message = line;
    const std::size_t prototypeEnd = text[0] == '%' && text[1] == 's' ? message.find(") ") : std::string::npos;
    messages->last = prototypeEnd == std::string::npos ? message : message.substr(prototypeEnd + 2);
    if (messages->first.size() < mostMessages)
        messages->first.push_back(messages->last);
    else
        ++messages->leftOut;
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

    const Messages& collected() const { return collected_; }

private:
    Messages collected_;
    SysConfig3LogHandler earlier_;
};

void addMessages(ordered_json& json, const Messages& said) {
    json["messages"] = said.first;
    if (said.leftOut != 0)
        json["messagesLeftOut"] = said.leftOut;
}

std::string hexadecimal(std::uint32_t number) {
    char digits[16];
    (void)std::snprintf(digits, sizeof digits, "0x%X", number);
    return digits;
}

std::string hexDigits(const SysConfigData& view) {
    return hexText({view.data, view.length});
}

ordered_json payloadEntry(const __SysConfig3PayloadEntry* entry) {
    ordered_json json{{"key", codeText(sysConfig3PayloadEntryGetKey(entry))},
                      {"comment", sysConfig3PayloadEntryGetComment(entry)}};
    SysConfigData data = {};
    if (sysConfig3PayloadEntryGetData(entry, &data))
        json["data"] = hexDigits(data);
    else if (const char* string = sysConfig3PayloadEntryGetString(entry))
        json["string"] = string;
    else
        json["deleted"] = sysConfig3PayloadEntryGetDeleted(entry);
    return json;
}

ordered_json metadataEntry(const __SysConfig3MetadataEntry* entry) {
    ordered_json json{{"key", sysConfig3MetadataEntryGetKey(entry)}};
    SysConfigData data = {};
    if (sysConfig3MetadataEntryGetData(entry, &data))
        json["data"] = hexDigits(data);
    else
        json["string"] = sysConfig3MetadataEntryGetString(entry);
    return json;
}

Elements payloadEntries(const ObjectPtr& object) {
    return [object](const auto& take) {
        const auto* entry = sysConfig3GetHeadPayloadEntry(object.get());
        while (entry && take({payloadEntry(entry), {}}))
            entry = sysConfig3PayloadEntryGetNextEntry(entry);
    };
}

Elements metadataEntries(const ObjectPtr& object) {
    return [object](const auto& take) {
        const auto* entry = sysConfig3GetHeadMetadataEntry(object.get());
        while (entry && take({metadataEntry(entry), {}}))
            entry = sysConfig3MetadataEntryGetNextEntry(entry);
    };
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

// Why there is no object, of which `said` is the library's last message.
std::string reason(const SysConfig3Refusal& refusal, const std::string& said, const Value::Data& blob) {
    constexpr const char* names[] = {"",         "blob",           "magic",   "version", "payload", "payload entry",
                                     "metadata", "metadata entry", "manifest"};
    const DERRefusal& encoding = refusal.encoding;
    const std::string name = names[refusal.subject];
    const std::string place = ", at offset " + std::to_string(refusal.place - blob.data());
    const std::string subject = "The " + name + place + ", ";
    switch (encoding.fault) {
    case DERFaultMissing:
        return "The blob ends before the " + name + place + ".";
    case DERFaultExcess:
        return "Octets follow the manifest" + place + ".";
    case DERFaultNoSequence:
        return subject + "is " + derTagName(encoding.tag) + " and should be SEQUENCE.";
    case DERFaultTag:
        return subject + "is " + derTagName(encoding.tag) + " and should be " + derTagName(encoding.expected) + ".";
    case DERFaultNone:
        break;
    default:
        return subject + "is no DER: " + derFaultText(encoding) + ".";
    }
    switch (refusal.status) {
    case DERUnexpectedTag:
        return subject + "has a field that does not belong there.";
    case DERIncompleteSequence:
        return subject + "lacks a field.";
    case DERDecodeError:
        return subject + "has a field that is no DER, or more fields than there are.";
    default:
        return said;
    }
}

Report refused(const std::string& why, const Messages& said) {
    Report report;
    report.fail("No configuration blob. " + why);
    addMessages(report.json, said);
    return report;
}

} // namespace

Report showBcfg(const Value::Data& blob, const Value::Data& hmacKey) {
    const MessageCollector collector;
    if (blob.size() > std::numeric_limits<std::uint32_t>::max())
        return refused("It is larger than 4 GiB.", {});
    if (blob.empty())
        return refused("The file is empty.", {});
    SysConfig3Refusal refusal;
    const ObjectPtr object(decodeSysConfig3Explained(blob.data(), static_cast<std::uint32_t>(blob.size()), &refusal),
                           sysconfig::Release());
    const Messages& said = collector.collected();
    if (!object)
        return refused(reason(refusal, said.last, blob), said);
    Report report;
    report.json = {
        {"magic", codeText(sysConfig3GetMagic(object.get()))},
        {"version", hexadecimal(sysConfig3GetVersion(object.get()))},
        {"payload", report.lists.add(payloadEntries(object), sysConfig3GetPayloadEntryCount(object.get()))},
        {"metadata", report.lists.add(metadataEntries(object), sysConfig3GetMetadataEntryCount(object.get()))},
        {"hmacState", hmacState(object.get(), hmacKey)},
        {"hmacs", manifestHMACs(object.get())}};
    addMessages(report.json, said);
    if (const auto behind = blob.data() + blob.size() - refusal.place; behind != 0)
        report.json["octetsBehind"] = behind;
    if (report.json["hmacState"] == "do not match")
        report.fail("The HMACs do not match the entries under this key.");
    return report;
}
