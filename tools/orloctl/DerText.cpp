#include "tools/orloctl/DerText.h"

#include "der/DERDecode.h"
#include "der/DEREncode.h"
#include "platform/Hexadecimal.h"

#include <algorithm>
#include <iterator>
#include <memory>

#include <openssl/objects.h>

namespace {

using Octets = std::vector<std::uint8_t>;

constexpr std::uint64_t classShift = 62;
constexpr DERTag constructedFlag = UINT64_C(1) << 61;

// The universal types by tag number (X.680 8.6), and those that are none or constructed; strings are primitive in DER
// (X.690 10.2).
constexpr const char* typeNames[] = {
    "end of contents",   "BOOLEAN",          "INTEGER",       "BIT STRING",     "OCTET STRING",    "NULL",
    "OBJECT IDENTIFIER", "ObjectDescriptor", "EXTERNAL",      "REAL",           "ENUMERATED",      "EMBEDDED PDV",
    "UTF8String",        "RELATIVE-OID",     "TIME",          "universal [15]", "SEQUENCE",        "SET",
    "NumericString",     "PrintableString",  "TeletexString", "VideotexString", "IA5String",       "UTCTime",
    "GeneralizedTime",   "GraphicString",    "VisibleString", "GeneralString",  "UniversalString", "CHARACTER STRING",
    "BMPString"};
constexpr std::uint32_t undefinedTypes = 1U << 0 | 1U << 15;
constexpr std::uint32_t constructedTypes = 1U << 8 | 1U << 11 | 1U << 16 | 1U << 17 | 1U << 29;
constexpr std::uint32_t textTypes =
    1U << 12 | 1U << 18 | 1U << 19 | 1U << 20 | 1U << 22 | 1U << 23 | 1U << 24 | 1U << 26;
constexpr DERTag null = 5, enumerated = 10, relativeOid = 13;

bool isUniversal(DERTag tag) {
    return (tag & ~constructedFlag) < std::size(typeNames);
}

bool isOneOf(std::uint32_t types, DERTag tag) {
    return isUniversal(tag) && (types >> (tag & DERTagNumberMask) & 1) != 0;
}

// Why the octets are none of that primitive type.
std::optional<DerFault> octetsFault(DERTag type, const DERItem& content) {
    const std::uint64_t length = content.length;
    const std::uint8_t* const octets = content.data;
    const std::uint8_t* const last = octets + length - 1;
    DERItem bits;
    std::uint8_t unused = 0;
    switch (type) {
    case DERTagBoolean:
        if (length != 1)
            return DerFault{octets, "a BOOLEAN has one octet, and this one has " + std::to_string(length)};
        if (octets[0] != 0x00 && octets[0] != 0xFF)
            return DerFault{octets, "a BOOLEAN is 00 or FF, and this one is " + hexText(content)};
        break;
    case DERTagInteger:
    case enumerated:
        if (length == 0)
            return DerFault{octets, "the number has no octets"};
        if (length > 1 && octets[0] == ((octets[1] & 0x80) != 0 ? 0xFF : 0x00))
            return DerFault{octets, "the number is not in its shortest form"};
        break;
    case DERTagBitString:
        if (DERParseBitString(&content, &bits, &unused) == DERSuccess)
            break;
        if (length == 0)
            return DerFault{octets, "a BIT STRING has at least one octet"};
        if (unused > 7 || length == 1)
            return DerFault{octets, "the count of unused bits is " + std::to_string(unused)};
        return DerFault{last, "the unused bits are not zero"};
    case null:
        if (length != 0)
            return DerFault{octets, "a NULL has no content"};
        break;
    case DERTagObjectIdentifier:
    case relativeOid:
        if (length == 0)
            return DerFault{octets, "an identifier has at least one octet"};
        for (std::uint64_t i = 0; i < length; ++i)
            if (octets[i] == 0x80 && (i == 0 || octets[i - 1] < 0x80))
                return DerFault{octets + i, "a component is not in its shortest form"};
        if (*last >= 0x80)
            return DerFault{last, "the last component is cut short"};
        break;
    default:
        break;
    }
    return std::nullopt;
}

bool isPrintable(std::uint8_t octet) {
    return octet >= 0x20 && octet <= 0x7E;
}

// The octets of a number, without zeros before them.
Octets octetsOf(std::uint64_t number) {
    Octets octets(1, static_cast<std::uint8_t>(number));
    while ((number >>= 8) != 0)
        octets.insert(octets.begin(), static_cast<std::uint8_t>(number));
    return octets;
}

// Quotes and backslashes would be mistaken for those around a code.
bool isSpelling(const Octets& octets) {
    return octets.size() == 4 && std::ranges::all_of(octets, [](std::uint8_t octet) {
               return isPrintable(octet) && octet != '"' && octet != '\\';
           });
}

std::string codeOf(std::uint64_t number, const std::string& quote) {
    const Octets octets = octetsOf(number);
    return isSpelling(octets) ? quote + std::string(octets.begin(), octets.end()) + quote : "0x" + hexadecimal(octets);
}

} // namespace

std::string derFaultText(const DERRefusal& refusal) {
    const DERItem der = {refusal.item, static_cast<std::uint64_t>(refusal.place - refusal.item)};
    DERDecodedInfo there;
    std::uint64_t declared = 0;
    switch (refusal.fault) {
    case DERFaultHeaderCutShort:
        return "the header is cut short";
    case DERFaultTagLeadingZero:
        return "the tag number begins with a zero digit";
    case DERFaultTagForm:
        return "the tag number fits one octet and is written in the long form";
    case DERFaultTagNumber:
        return "the tag number does not fit 61 bits";
    case DERFaultLengthIndefinite:
        return "the length is indefinite, which DER does not allow";
    case DERFaultLengthOctets:
        return "the length takes " + std::to_string(*refusal.place & 0x7F) + " octets, and at most 8 are allowed";
    case DERFaultLengthForm:
        return "the length is not in its shortest form";
    default:
        DERDecodeItemPartialBufferGetLength(&der, &there, &declared);
        return "the content is cut short: " + std::to_string(there.content.length) + " of " + std::to_string(declared) +
               " octets are there";
    }
}

std::optional<DerFault> derContentFault(DERTag tag, const DERItem& content) {
    if (!isUniversal(tag))
        return std::nullopt;
    const DERTag number = tag & DERTagNumberMask;
    if (isOneOf(undefinedTypes, tag))
        return DerFault{content.data, "there is no universal type with the number " + std::to_string(number)};
    if (isOneOf(constructedTypes, tag) != isConstructed(tag))
        return DerFault{content.data, std::string("DER has ") + typeNames[number] + " in " +
                                          (isConstructed(tag) ? "primitive" : "constructed") + " form only"};
    return octetsFault(tag, content);
}

nlohmann::ordered_json derValue(DERTag tag, const DERItem& content) {
    std::uint64_t number = 0;
    if (isOneOf(textTypes, tag) && !isConstructed(tag))
        return escapedText(content);
    if (tag == DERTagBoolean && content.length == 1)
        return content.data[0] != 0;
    if (tag == DERTagObjectIdentifier)
        if (std::string numbers = oidText(content); !numbers.empty())
            return numbers;
    if (tag != DERTagInteger && tag != enumerated)
        return content.length != 0 ? nlohmann::ordered_json(hexText(content)) : nlohmann::ordered_json();
    if (DERParseInteger64(&content, &number) == DERSuccess)
        return number;
    if (content.length == 0 || content.length > sizeof number)
        return "0x" + hexText(content);
    number = (content.data[0] & 0x80) != 0 ? UINT64_MAX : 0;
    for (std::uint64_t i = 0; i < content.length; ++i)
        number = number << 8 | content.data[i];
    return static_cast<std::int64_t>(number);
}

bool isConstructed(DERTag tag) {
    return (tag & constructedFlag) != 0;
}

std::string derTagName(DERTag tag) {
    constexpr const char* classes[] = {"universal", "application", "context", "private"};
    const std::uint64_t number = tag & DERTagNumberMask;
    if (isUniversal(tag)) {
        const bool isUsual = isOneOf(constructedTypes, tag) == isConstructed(tag);
        return (isUsual ? "" : isConstructed(tag) ? "constructed " : "primitive ") + std::string(typeNames[number]);
    }
    const std::uint64_t tagClass = tag >> classShift;
    return std::string(classes[tagClass]) + " " +
           (tagClass == 3 && isSpelling(octetsOf(number)) ? quotedCode(number) : "[" + std::to_string(number) + "]") +
           (isConstructed(tag) ? "" : " primitive");
}

std::string codeText(std::uint64_t number) {
    return codeOf(number, "");
}

std::string quotedCode(std::uint64_t number) {
    return codeOf(number, "\"");
}

std::string escapedText(const DERItem& text, std::uint64_t most) {
    std::string escaped;
    for (std::uint64_t i = 0; i < std::min(text.length, most); ++i)
        if (isPrintable(text.data[i]) && text.data[i] != '\\')
            escaped += static_cast<char>(text.data[i]);
        else
            escaped += "\\x" + hexText({text.data + i, 1});
    return escaped + (text.length > most ? "..." : "");
}

std::string quotedText(const DERItem& text, std::uint64_t most) {
    return "\"" + escapedText(text, most) + "\"";
}

std::string hexText(const DERItem& data, std::uint64_t most) {
    return hexadecimal({data.data, std::min(data.length, most)}) + (data.length > most ? "..." : "");
}

Octets derEncoding(DERTag tag, const DERItem& content) {
    Octets encoding(DERLengthOfItem(tag, content.length));
    std::uint64_t written = 0;
    DEREncodeItemSized(tag, content.length, content.data, encoding.data(), encoding.size(), &written);
    return encoding;
}

std::string oidText(const DERItem& content, bool isNamed) {
    char text[128];
    if (content.length >= sizeof text) // each octet takes a character and more
        return "";
    const Octets encoding = derEncoding(DERTagObjectIdentifier, content);
    const std::uint8_t* place = encoding.data();
    const std::unique_ptr<ASN1_OBJECT, decltype(&ASN1_OBJECT_free)> object(
        d2i_ASN1_OBJECT(nullptr, &place, static_cast<long>(encoding.size())), ASN1_OBJECT_free);
    const int length = object ? OBJ_obj2txt(text, sizeof text, object.get(), isNamed ? 0 : 1) : 0;
    return length > 0 && static_cast<std::size_t>(length) < sizeof text ? text : "";
}
