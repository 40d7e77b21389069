#include "tools/orloctl/DerText.h"

#include "der/DERDecode.h"
#include "der/DEREncode.h"

#include <algorithm>
#include <array>
#include <memory>

#include <openssl/objects.h>

namespace {

constexpr std::uint64_t classShift = 62;
constexpr DERTag constructedFlag = UINT64_C(1) << 61;
constexpr std::uint8_t moreBit = 0x80;

enum Form {
    Primitive,
    Constructed,
    Undefined // no such type
};

struct UniversalType {
    const char* name;
    Form form;
};

// By tag number (X.680 8.6). Strings are primitive in DER (X.690 10.2).
constexpr std::array<UniversalType, 31> universalTypes = {{
    {"end of contents", Undefined},
    {"BOOLEAN", Primitive},
    {"INTEGER", Primitive},
    {"BIT STRING", Primitive},
    {"OCTET STRING", Primitive},
    {"NULL", Primitive},
    {"OBJECT IDENTIFIER", Primitive},
    {"ObjectDescriptor", Primitive},
    {"EXTERNAL", Constructed},
    {"REAL", Primitive},
    {"ENUMERATED", Primitive},
    {"EMBEDDED PDV", Constructed},
    {"UTF8String", Primitive},
    {"RELATIVE-OID", Primitive},
    {"TIME", Primitive},
    {"universal [15]", Undefined},
    {"SEQUENCE", Constructed},
    {"SET", Constructed},
    {"NumericString", Primitive},
    {"PrintableString", Primitive},
    {"TeletexString", Primitive},
    {"VideotexString", Primitive},
    {"IA5String", Primitive},
    {"UTCTime", Primitive},
    {"GeneralizedTime", Primitive},
    {"GraphicString", Primitive},
    {"VisibleString", Primitive},
    {"GeneralString", Primitive},
    {"UniversalString", Primitive},
    {"CHARACTER STRING", Constructed},
    {"BMPString", Primitive},
}};

std::uint64_t numberOf(DERTag tag) {
    return tag & DERTagNumberMask;
}

bool isUniversal(DERTag tag) {
    return tag >> classShift == 0;
}

std::optional<DerFault> integerFault(const DERItem& content) {
    if (content.length == 0)
        return DerFault{0, "the number has no octets"};
    if (content.length == 1)
        return std::nullopt;
    const bool negative = (content.data[1] & 0x80) != 0;
    if (content.data[0] == (negative ? 0xFF : 0x00))
        return DerFault{0, "the number is not in its shortest form"};
    return std::nullopt;
}

std::optional<DerFault> booleanFault(const DERItem& content) {
    if (content.length != 1)
        return DerFault{0, "a BOOLEAN has one octet, and this one has " + std::to_string(content.length)};
    if (content.data[0] != 0x00 && content.data[0] != 0xFF)
        return DerFault{0, "a BOOLEAN is 00 or FF, and this one is " + hexText(content, 1)};
    return std::nullopt;
}

std::optional<DerFault> bitStringFault(const DERItem& content) {
    DERItem bits;
    std::uint8_t unused = 0;
    if (DERParseBitString(&content, &bits, &unused) == DERSuccess)
        return std::nullopt;
    if (content.length == 0)
        return DerFault{0, "a BIT STRING has at least one octet"};
    if (unused > 7 || content.length == 1)
        return DerFault{0, "the count of unused bits is " + std::to_string(unused)};
    return DerFault{content.length - 1, "the unused bits are not zero"};
}

std::optional<DerFault> oidFault(const DERItem& content) {
    if (content.length == 0)
        return DerFault{0, "an identifier has at least one octet"};
    bool first = true;
    for (std::uint64_t i = 0; i < content.length; ++i) {
        if (first && content.data[i] == moreBit)
            return DerFault{i, "a component is not in its shortest form"};
        first = (content.data[i] & moreBit) == 0;
    }
    if (!first)
        return DerFault{content.length - 1, "the last component is cut short"};
    return std::nullopt;
}

bool isPrintable(std::uint8_t octet) {
    return octet >= 0x20 && octet <= 0x7E;
}

// Quotes and backslashes would be mistaken for those around a code.
bool isSpellable(std::uint64_t number) {
    if (number > UINT32_MAX)
        return false;
    for (unsigned shift = 0; shift < 32; shift += 8) {
        const auto octet = static_cast<std::uint8_t>(number >> shift);
        if (!isPrintable(octet) || octet == '"' || octet == '\\')
            return false;
    }
    return true;
}

std::string hexOctet(std::uint8_t octet) {
    constexpr char digits[] = "0123456789abcdef";
    return {digits[octet >> 4], digits[octet & 0xF]};
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

std::optional<DerFault> derHeaderFault(const DERItem& der) {
    DERDecodedInfo decoded;
    DERRefusal refusal;
    if (DERDecodeItemExplained(&der, &decoded, &refusal) == DERSuccess)
        return std::nullopt;
    return DerFault{static_cast<std::uint64_t>(refusal.place - der.data), derFaultText(refusal)};
}

std::optional<DerFault> derContentFault(DERTag tag, const DERItem& content) {
    const std::uint64_t number = numberOf(tag);
    if (!isUniversal(tag) || number >= universalTypes.size())
        return std::nullopt;
    const UniversalType& type = universalTypes[number];
    if (type.form == Undefined)
        return DerFault{0, "there is no universal type with the number " + std::to_string(number)};
    if ((type.form == Constructed) != isConstructed(tag))
        return DerFault{0, std::string("DER has ") + type.name + " in " +
                               (type.form == Constructed ? "constructed" : "primitive") + " form only"};
    switch (number) {
    case DERTagBoolean:
        return booleanFault(content);
    case DERTagInteger:
    case 10: // ENUMERATED
        return integerFault(content);
    case DERTagBitString:
        return bitStringFault(content);
    case 5: // NULL
        return content.length == 0 ? std::nullopt : std::optional(DerFault{0, "a NULL has no content"});
    case DERTagObjectIdentifier:
    case 13: // RELATIVE-OID
        return oidFault(content);
    default:
        return std::nullopt;
    }
}

bool isConstructed(DERTag tag) {
    return (tag & constructedFlag) != 0;
}

std::string derTagName(DERTag tag) {
    constexpr const char* classes[] = {"universal", "application", "context", "private"};
    const std::uint64_t number = numberOf(tag);
    if (isUniversal(tag) && number < universalTypes.size()) {
        const UniversalType& type = universalTypes[number];
        const bool isUsual = (type.form == Constructed) == isConstructed(tag);
        return (isUsual ? "" : isConstructed(tag) ? "constructed " : "primitive ") + std::string(type.name);
    }
    std::string name = classes[tag >> classShift];
    if (tag >> classShift == 3 && isSpellable(number))
        name += " " + quotedCode(number);
    else
        name += " [" + std::to_string(number) + "]";
    return isConstructed(tag) ? name : name + " primitive";
}

std::string codeText(std::uint64_t number) {
    const std::uint8_t octets[] = {static_cast<std::uint8_t>(number >> 24), static_cast<std::uint8_t>(number >> 16),
                                   static_cast<std::uint8_t>(number >> 8), static_cast<std::uint8_t>(number)};
    if (isSpellable(number))
        return {std::begin(octets), std::end(octets)};
    std::string digits;
    for (; number != 0; number >>= 8)
        digits.insert(0, hexOctet(static_cast<std::uint8_t>(number)));
    return "0x" + (digits.empty() ? "00" : digits);
}

std::string quotedCode(std::uint64_t number) {
    return isSpellable(number) ? "\"" + codeText(number) + "\"" : codeText(number);
}

std::string escapedText(const DERItem& text, std::uint64_t most) {
    std::string escaped;
    for (std::uint64_t i = 0; i < std::min(text.length, most); ++i) {
        const std::uint8_t octet = text.data[i];
        if (isPrintable(octet) && octet != '\\')
            escaped += static_cast<char>(octet);
        else
            escaped += "\\x" + hexOctet(octet);
    }
    return escaped + (text.length > most ? "..." : "");
}

std::string quotedText(const DERItem& text, std::uint64_t most) {
    return "\"" + escapedText(text, most) + "\"";
}

std::string hexText(const DERItem& data, std::uint64_t most) {
    std::string digits;
    for (std::uint64_t i = 0; i < std::min(data.length, most); ++i)
        digits += hexOctet(data.data[i]);
    return digits + (data.length > most ? "..." : "");
}

std::vector<std::uint8_t> derEncoding(DERTag tag, const DERItem& content) {
    std::vector<std::uint8_t> encoding(DERLengthOfItem(tag, content.length));
    std::uint64_t written = 0;
    DEREncodeItemSized(tag, content.length, content.data, encoding.data(), encoding.size(), &written);
    return encoding;
}

std::string oidText(const DERItem& content, bool isNamed) {
    char text[128];
    if (content.length >= sizeof text) // each octet takes a character and more
        return "";
    const auto encoding = derEncoding(DERTagObjectIdentifier, content);
    const std::uint8_t* place = encoding.data();
    const std::unique_ptr<ASN1_OBJECT, decltype(&ASN1_OBJECT_free)> object(
        d2i_ASN1_OBJECT(nullptr, &place, static_cast<long>(encoding.size())), ASN1_OBJECT_free);
    const int length = object ? OBJ_obj2txt(text, sizeof text, object.get(), isNamed ? 0 : 1) : 0;
    return length > 0 && static_cast<std::size_t>(length) < sizeof text ? text : "";
}
