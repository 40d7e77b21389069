#include <cstdarg>
#include <cstdio>
#include <limits>
#include <memory>
#include <string>
#include <string_view>
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

// Collects the library's messages, of which a blob can cause several for each of its entries, for as long as it lives.
class Messages {
public:
    Messages() : earlier_(getSysConfig3LogHandler()) {
        current = this;
        setSysConfig3LogHandler(keep);
    }
    ~Messages() { setSysConfig3LogHandler(earlier_); }
    Messages(const Messages&) = delete;
    Messages& operator=(const Messages&) = delete;

    const std::string& last() const { return last_; }
    void addTo(ordered_json& json) const {
        json["messages"] = first_;
        if (leftOut_ != 0)
            json["messagesLeftOut"] = leftOut_;
    }

private:
    static void keep(int level, const char* format, ...);

    static inline Messages* current = nullptr;
    const SysConfig3LogHandler earlier_;
    std::vector<std::string> first_;
    std::size_t leftOut_ = 0;
    std::string last_;
};

// Keeps a message without the prototype that most begin with.
void Messages::keep(int, const char* format, ...) {
    char line[512];
    va_list arguments;
    va_start(arguments, format);
    (void)std::vsnprintf(line, sizeof line, format, arguments); // NOLINT(clang-analyzer-valist.Uninitialized)
    va_end(arguments);
    const std::string message = line;
    const std::size_t end = std::string_view(format).starts_with("%s") ? message.find(") ") : std::string::npos;
    current->last_ = end == std::string::npos ? message : message.substr(end + 2);
    if (current->first_.size() < mostMessages)
        current->first_.push_back(current->last_);
    else
        ++current->leftOut_;
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

template <typename Entry>
Elements entries(const ObjectPtr& object, const Entry* (*head)(const __SysConfig3*), const Entry* (*next)(const Entry*),
                 ordered_json (*describe)(const Entry*)) {
    return [=](const auto& take) {
        const Entry* entry = head(object.get());
        while (entry && take({describe(entry), {}}))
            entry = next(entry);
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
    said.addTo(report.json);
    return report;
}

} // namespace

Report showBcfg(const Value::Data& blob, const Value::Data& hmacKey) {
    const Messages said;
    if (blob.size() > std::numeric_limits<std::uint32_t>::max())
        return refused("It is larger than 4 GiB.", said);
    if (blob.empty())
        return refused("The file is empty.", said);
    SysConfig3Refusal refusal;
    const ObjectPtr object(decodeSysConfig3Explained(blob.data(), static_cast<std::uint32_t>(blob.size()), &refusal),
                           sysconfig::Release());
    if (!object)
        return refused(reason(refusal, said.last(), blob), said);
    Report report;
    const Elements payload =
        entries(object, sysConfig3GetHeadPayloadEntry, sysConfig3PayloadEntryGetNextEntry, payloadEntry);
    const Elements metadata =
        entries(object, sysConfig3GetHeadMetadataEntry, sysConfig3MetadataEntryGetNextEntry, metadataEntry);
    report.json = {{"magic", codeText(sysConfig3GetMagic(object.get()))},
                   {"version", hexadecimal(sysConfig3GetVersion(object.get()))},
                   {"payload", report.lists.add(payload, sysConfig3GetPayloadEntryCount(object.get()))},
                   {"metadata", report.lists.add(metadata, sysConfig3GetMetadataEntryCount(object.get()))},
                   {"hmacState", hmacState(object.get(), hmacKey)},
                   {"hmacs", manifestHMACs(object.get())}};
    said.addTo(report.json);
    if (const auto behind = blob.data() + blob.size() - refusal.place; behind != 0)
        report.json["octetsBehind"] = behind;
    if (report.json["hmacState"] == "do not match")
        report.fail("The HMACs do not match the entries under this key.");
    return report;
}
