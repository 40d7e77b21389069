#include "tools/orloctl/ShowBcfg.h"

#include <cstdarg>
#include <cstdio>
#include <limits>
#include <memory>
#include <string>
#include <vector>

#include "der/DERDecode.h"
#include "sysconfig/SysConfig3.h"
#include "sysconfig/SysConfig3Ptr.h"
#include "tools/orloctl/DerText.h"

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

Report refused(const Messages& why, const Value::Data& blob) {
    Report report;
    report.ok = false;
    report.problem = "No configuration blob. " + (why.last.empty() ? outerProblem(blob) : why.last);
    addMessages(report.json, why);
    return report;
}

// The octets behind the outer SEQUENCE, at which the library does not look.
std::uint64_t octetsBehind(const Value::Data& blob) {
    const DERItem whole{blob.data(), blob.size()};
    DERDecodedInfo outer = {};
    DERDecodeItem(&whole, &outer);
    return static_cast<std::uint64_t>(blob.data() + blob.size() - (outer.content.data + outer.content.length));
}

} // namespace

Report showBcfg(const Value::Data& blob, const Value::Data& hmacKey) {
    const MessageCollector collector;
    if (blob.size() > std::numeric_limits<std::uint32_t>::max())
        return refused({{}, 0, "It is larger than 4 GiB."}, blob);
    const ObjectPtr object(decodeSysConfig3(blob.data(), static_cast<std::uint32_t>(blob.size())),
                           sysconfig::Release());
    if (!object)
        return refused(collector.collected(), blob);
    Report report;
    report.json = {
        {"magic", codeText(sysConfig3GetMagic(object.get()))},
        {"version", hexadecimal(sysConfig3GetVersion(object.get()))},
        {"payload", report.lists.add(payloadEntries(object), sysConfig3GetPayloadEntryCount(object.get()))},
        {"metadata", report.lists.add(metadataEntries(object), sysConfig3GetMetadataEntryCount(object.get()))},
        {"hmacState", hmacState(object.get(), hmacKey)},
        {"hmacs", manifestHMACs(object.get())}};
    addMessages(report.json, collector.collected());
    if (const std::uint64_t behind = octetsBehind(blob); behind != 0)
        report.json["octetsBehind"] = behind;
    if (report.json["hmacState"] == "do not match") {
        report.ok = false;
        report.problem = "The HMACs do not match the entries under this key.";
    }
    return report;
}
