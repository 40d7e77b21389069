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

// Collects the library's messages, of which a blob can cause several for each of its entries, for as long as it lives.
struct Messages {
    Messages() : earlier(getSysConfig3LogHandler()) {
        current = this;
        setSysConfig3LogHandler(keep);
    }
    ~Messages() { setSysConfig3LogHandler(earlier); }
    Messages(const Messages&) = delete;
    Messages& operator=(const Messages&) = delete;

    void addTo(ordered_json& json) const {
        json["messages"] = first;
        if (leftOut != 0)
            json["messagesLeftOut"] = leftOut;
    }

    // Keeps a message without the prototype that most begin with.
    static void keep(int, const char* format, ...) {
        char line[512];
        va_list arguments;
        va_start(arguments, format);
        (void)std::vsnprintf(line, sizeof line, format, arguments); // NOLINT(clang-analyzer-valist.Uninitialized)
        va_end(arguments);
        current->last = line;
        if (const auto end = current->last.find(") "); end != std::string::npos && format[0] == '%' && format[1] == 's')
            current->last.erase(0, end + 2);
        if (current->first.size() < mostMessages)
            current->first.push_back(current->last);
        else
            ++current->leftOut;
    }

    static inline Messages* current = nullptr;
    const SysConfig3LogHandler earlier;
    std::vector<std::string> first;
    std::size_t leftOut = 0;
    std::string last;
};

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

std::string hmac(const __SysConfig3* object, bool (*get)(const __SysConfig3ManifestEntry*, SysConfigData*)) {
    SysConfigData octets = {};
    get(sysConfig3GetManifest(object), &octets);
    return hexDigits(octets);
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

// Why there is no object, in a sentence without its full stop; empty when only the library's last message says so.
std::string reason(const SysConfig3Refusal& refusal, const std::uint8_t* blob) {
    constexpr const char* names[] = {"",         "blob",           "magic",   "version", "payload", "payload entry",
                                     "metadata", "metadata entry", "manifest"};
    constexpr const char* payloadFields[] = {"key", "comment", "data", "string", "deleted flag", ""};
    constexpr const char* metadataFields[] = {"key", "data", "string", ""};
    const auto& [fault, row, place, item, tag, expected] = refusal.encoding;
    const bool isPayloadEntry = refusal.subject == SysConfig3SubjectPayloadEntry;
    const bool isEntry = isPayloadEntry || refusal.subject == SysConfig3SubjectMetadataEntry;
    const std::string name = names[refusal.subject];
    if (fault == DERFaultNone)
        return refusal.status == DERDecodeError ? "The " + name + " has a deleted flag that is no DER BOOLEAN" : "";
    const std::string field = !isEntry ? name : isPayloadEntry ? payloadFields[row] : metadataFields[row];
    return "The " + (fault >= DERFaultNoSequence && !isEntry ? "blob" : name) + " " +
           derRefusalText(refusal.encoding, field.c_str(), blob);
}

} // namespace

Report showBcfg(const Value::Data& blob, const Value::Data& hmacKey) {
    const Messages said;
    Report report;
    Findings findings({blob.data(), blob.size()}, report);
    SysConfig3Refusal refusal = {};
    refusal.place = blob.data();
    const bool fits = blob.size() <= std::numeric_limits<std::uint32_t>::max();
    const ObjectPtr object(
        fits ? decodeSysConfig3Explained(blob.data(), static_cast<std::uint32_t>(blob.size()), &refusal) : nullptr,
        sysconfig::Release());
    if (!object) {
        const std::string why = !fits          ? "It is larger than 4 GiB"
                                : blob.empty() ? "The file is empty"
                                               : reason(refusal, blob.data());
        findings.fault(refusal.place, "No configuration blob. " + (why.empty() ? said.last : why));
        said.addTo(report.json);
        return report;
    }
    const Elements payload =
        entries(object, sysConfig3GetHeadPayloadEntry, sysConfig3PayloadEntryGetNextEntry, payloadEntry);
    const Elements metadata =
        entries(object, sysConfig3GetHeadMetadataEntry, sysConfig3MetadataEntryGetNextEntry, metadataEntry);
    report.json = {{"magic", codeText(sysConfig3GetMagic(object.get()))},
                   {"version", hexadecimal(sysConfig3GetVersion(object.get()))},
                   {"payload", report.lists.add(payload, sysConfig3GetPayloadEntryCount(object.get()))},
                   {"metadata", report.lists.add(metadata, sysConfig3GetMetadataEntryCount(object.get()))},
                   {"hmacState", hmacState(object.get(), hmacKey)},
                   {"hmacs",
                    {{"payload", hmac(object.get(), sysConfig3ManifestGetPayloadHMAC)},
                     {"metadata", hmac(object.get(), sysConfig3ManifestGetMetadataHMAC)},
                     {"full", hmac(object.get(), sysConfig3ManifestGetFullHMAC)}}}};
    said.addTo(report.json);
    if (const auto behind = blob.data() + blob.size() - refusal.place; behind != 0)
        report.json["octetsBehind"] = behind;
    if (report.json["hmacState"] == "do not match")
        report.fail("The HMACs do not match the entries under this key.");
    return report;
}
