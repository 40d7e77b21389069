#include "tools/orloctl/DerText.h"

#include "der/DERDecode.h"
#include "der/DEREncode.h"
#include "platform/Hexadecimal.h"
#include "tools/orloctl/Report.h"

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
constexpr std::size_t mostInSentence = 512;
constexpr DERTag null = 5, enumerated = 10, relativeOid = 13;

bool isUniversal(DERTag tag) {
    return (tag & ~constructedFlag) < std::size(typeNames);
}

bool isOneOf(std::uint32_t types, DERTag tag) {
    return isUniversal(tag) && (types >> (tag & DERTagNumberMask) & 1) != 0;
}

// Why the octets are none of that primitive type.
std::optional<DerFault> octetsFault(DERTag type, const DERItem& content) {
    const auto [octets, length] = content;
    const std::uint8_t* const last = octets + length - 1;
    const bool isBits = type == DERTagBitString, isNumber = type == DERTagInteger || type == enumerated;
    const bool isIdentifier = type == DERTagObjectIdentifier || type == relativeOid;
    std::uint8_t unused = 0;
    if ((type == DERTagBoolean && length != 1) || (type == null && length != 0) ||
        (length == 0 && (isNumber || isBits || isIdentifier)))
        return DerFault{octets,
                        std::string("the length of ") + typeNames[type] + " is never " + std::to_string(length)};
    if (type == DERTagBoolean && octets[0] != 0x00 && octets[0] != 0xFF)
        return DerFault{octets, "a BOOLEAN is 00 or FF, and this one is " + hexText(content)};
    if (isNumber && length > 1 && octets[0] == ((octets[1] & 0x80) != 0 ? 0xFF : 0x00))
        return DerFault{octets, "the number is not in its shortest form"};
    if (DERItem bits; isBits && DERParseBitString(&content, &bits, &unused) != DERSuccess)
        return unused > 7 || length == 1 ? DerFault{octets, "the count of unused bits is " + std::to_string(unused)}
                                         : DerFault{last, "the unused bits are not zero"};
    for (std::uint64_t i = 0; isIdentifier && i < length; ++i)
        if (octets[i] == 0x80 && (i == 0 || octets[i - 1] < 0x80))
            return DerFault{octets + i, "a component is not in its shortest form"};
    if (isIdentifier && *last >= 0x80)
        return DerFault{last, "the last component is cut short"};
    return std::nullopt;
}

bool isPrintable(std::uint8_t octet) {
    return octet >= 0x20 && octet <= 0x7E;
}

} // namespace

std::string derFaultText(const DERRefusal& refusal) {
    constexpr const char* texts[] = {"",
                                     "the header is cut short",
                                     "the tag number begins with a zero digit",
                                     "the tag number fits one octet and is written in the long form",
                                     "the tag number does not fit 61 bits",
                                     "the length is indefinite, which DER does not allow",
                                     "",
                                     "the length is not in its shortest form"};
    const DERItem der = {refusal.item, static_cast<std::uint64_t>(refusal.place - refusal.item)};
    DERDecodedInfo there;
    std::uint64_t declared = 0;
    if (refusal.fault == DERFaultLengthOctets)
        return "the length takes " + std::to_string(*refusal.place & 0x7F) + " octets, and at most 8 are allowed";
    if (refusal.fault < std::size(texts))
        return texts[refusal.fault];
    DERDecodeItemPartialBufferGetLength(&der, &there, &declared);
    return "the content is cut short: " + std::to_string(there.content.length) + " of " + std::to_string(declared) +
           " octets are there";
}

std::string derRefusalText(const DERRefusal& refusal, const char* field, const std::uint8_t* file) {
    switch (refusal.fault) {
    case DERFaultNoSequence:
        return "is " + derTagName(refusal.tag) + " instead of SEQUENCE";
    case DERFaultTag:
        return "has " + derTagName(refusal.tag) + " instead of " + derTagName(refusal.expected) + " as its " + field;
    case DERFaultMissing:
        return std::string("ends before its ") + field;
    case DERFaultExcess:
        return "holds " + (refusal.tag != 0 ? derTagName(refusal.tag) : "an item") + " behind its last field";
    default:
        return "is no strict DER" +
               (file == nullptr || file == refusal.item
                    ? ""
                    : " in the item at offset " + std::to_string(refusal.item - file)) +
               ": " + derFaultText(refusal);
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
    const std::string code = tagClass == 3 ? codeText(number, "\"") : "";
    return std::string(classes[tagClass]) + " " + (code.starts_with('"') ? code : "[" + std::to_string(number) + "]") +
           (isConstructed(tag) ? "" : " primitive");
}

std::string codeText(std::uint64_t number, const char* quote) {
    Octets octets(1, static_cast<std::uint8_t>(number));
    for (std::uint64_t rest = number >> 8; rest != 0; rest >>= 8)
        octets.insert(octets.begin(), static_cast<std::uint8_t>(rest));
    // Quotes and backslashes would be mistaken for those around a code.
    const bool isSpelled = octets.size() == 4 && std::ranges::all_of(octets, [](std::uint8_t octet) {
                               return isPrintable(octet) && octet != '"' && octet != '\\';
                           });
    return isSpelled ? quote + std::string(octets.begin(), octets.end()) + quote : "0x" + hexadecimal(octets);
}

std::string escapedText(const DERItem& text) {
    std::string escaped;
    for (std::uint64_t i = 0; i < text.length; ++i)
        if (isPrintable(text.data[i]) && text.data[i] != '\\')
            escaped += static_cast<char>(text.data[i]);
        else
            escaped += "\\x" + hexText({text.data + i, 1});
    return escaped;
}

std::string quotedText(const std::string& text) {
    return "\"" + shortened(text, mostInSentence) + "\"";
}

std::string quotedText(const DERItem& text) {
    return quotedText(escapedText({text.data, std::min<std::uint64_t>(text.length, mostInSentence + 1)}));
}

std::string hexText(const DERItem& data) {
    return hexadecimal({data.data, data.length});
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
