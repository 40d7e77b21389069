#include "tools/orloctl/ShowFile.h"

#include <algorithm>
#include <string_view>

#include "tools/orloctl/DerItems.h"
#include "tools/orloctl/LocalFiles.h"

namespace {

std::string_view textOf(const DERItem& item) {
    return {reinterpret_cast<const char*>(item.data), static_cast<std::size_t>(item.length)};
}

// PEM and what stands before it is text; DER has an octet there that no text has, such as the tag of a string.
bool isText(std::string_view octets) {
    return std::ranges::none_of(octets, [](char c) {
        const auto octet = static_cast<unsigned char>(c);
        return octet < ' ' && c != '\t' && c != '\n' && c != '\r';
    });
}

// By the magic of an Img4 file, or the place of a blob's payload element behind two numbers of four octets.
std::string formatOf(const DERItem& file) {
    constexpr std::string_view magics[] = {"IMG4", "IM4M", "IM4P"};
    DERDecodedInfo outer;
    if (DERDecodeItem(&file, &outer) != DERSuccess || outer.tag != DERTagSequence)
        return "der";
    DerItems fields(outer.content);
    if (!fields.next())
        return "der";
    if (fields.item().tag == DERTagIA5String)
        return std::ranges::find(magics, textOf(fields.item().content)) != std::end(magics) ? "img4" : "der";
    const bool isNumber = fields.item().tag == DERTagInteger && fields.item().content.length == 4;
    return isNumber && fields.next() && fields.next() && fields.item().tag == DERTagPrivateConstructed(0x53504159)
               ? "bcfg"
               : "der";
}

} // namespace

bool isPem(Findings& findings) {
    constexpr std::string_view mark = "-----BEGIN ";
    constexpr std::size_t longestPreface = 4096;
    const std::string_view text = textOf(findings.file()).substr(0, longestPreface);
    const std::size_t place = text.find(mark);
    if (place == std::string_view::npos || (place != 0 && text[place - 1] != '\n') || !isText(text.substr(0, place)))
        return false;
    findings.fault(findings.file().data + place, "The file is PEM, text in which DER stands as base64, which has to be "
                                                 "turned into DER first, for instance with openssl");
    return true;
}

Report showFile(const Value::Data& file, std::string format, const std::optional<Value::Data>& hmacKey) {
    const DERItem item = {file.data(), file.size()};
    Report report;
    Findings findings(item, report);
    if (isPem(findings))
        format = "pem";
    else if (format.empty())
        format = formatOf(item);
    if (hmacKey && format != "bcfg")
        throw UsageError("An HMAC key is for a configuration blob, and the file is none");
    if (format == "bcfg")
        report = showBcfg(file, hmacKey.value_or(Value::Data()));
    else if (format != "pem")
        report = format == "img4" ? showImg4(item) : showDer(item);
    nlohmann::ordered_json json{{"format", format}};
    json.update(report.json);
    report.json = std::move(json);
    return report;
}
