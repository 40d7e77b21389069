// Words for DER: what an item is called, what its content says, and in which octet and by which rule an encoding is
// refused.
#ifndef VELTRA_TOOLS_ORLOCTL_DERTEXT_H
#define VELTRA_TOOLS_ORLOCTL_DERTEXT_H

#include "der/DERTypes.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include <nlohmann/json.hpp>

struct DerFault {
    const std::uint8_t* place;
    std::string reason; // a clause without a full stop
};

// A clause for an item that cannot be decoded.
std::string derFaultText(const DERRefusal& refusal);

// Why an item, or a SEQUENCE with its fields, is refused, in a clause whose subject it is. `field` is the name of the
// one that the refusal's row stands for. With the start of the file the clause says in which item of it the encoding is
// unsound.
std::string derRefusalText(const DERRefusal& refusal, const char* field = "", const std::uint8_t* file = nullptr);

// Why the content of an item with the given tag is not DER, as far as its universal type tells; nothing when it is, and
// for types without rules of their own. The items inside a constructed content are not looked at.
std::optional<DerFault> derContentFault(DERTag tag, const DERItem& content);

// What the content of a primitive item says: a truth, a number, numbers with dots, a text, or else its octets in
// hexadecimal; null when there are none.
nlohmann::ordered_json derValue(DERTag tag, const DERItem& content);

bool isConstructed(DERTag tag);

// "SEQUENCE", "context [0]", "private \"MANB\"": a private tag whose number spells four characters is spelled out. A
// form other than the usual one is named: "constructed OCTET STRING", "context [0] primitive".
std::string derTagName(DERTag tag);

// The four characters that the number spells, between quotes if those are given, when all of them can be shown, else
// the number in hexadecimal.
std::string codeText(std::uint64_t number, const char* quote = "");

// The octets as text, those that are no printable ASCII and the backslash as \xNN.
std::string escapedText(const DERItem& text);

// The text, or the beginning of a long one, in quotes; the second form escapes octets as above.
std::string quotedText(const std::string& text);
std::string quotedText(const DERItem& text);

// The content of an OBJECT IDENTIFIER as numbers with dots or, where it has one, by its name; empty when it is
// malformed or longer than 127 characters.
std::string oidText(const DERItem& content, bool isNamed = false);

// Two lower-case digits an octet.
std::string hexText(const DERItem& data);

// The whole encoding of an item with that content.
std::vector<std::uint8_t> derEncoding(DERTag tag, const DERItem& content);

#endif
