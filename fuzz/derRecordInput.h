// The input of the target derRecord: one octet with the number of rows of a table, one with the number of DERItems in
// the record, two for each row (tag, options), and then the content to parse.
#ifndef VELTRA_FUZZ_DER_RECORD_INPUT_H
#define VELTRA_FUZZ_DER_RECORD_INPUT_H

#include <array>
#include <cstdint>

#include "der/DERTypes.h"

namespace recordInput {

constexpr std::uint8_t mostRows = 8;

// A row's tag octet, modulo the size of the list, is an index into it.
constexpr std::array<DERTag, 8> tags = {
    DERTagBoolean,  DERTagInteger,   DERTagOctetString,           DERTagObjectIdentifier,
    DERTagSequence, DERTagBitString, DERTagContextConstructed(0), DERTagPrivateConstructed(0x53504159),
};

// A row's options octet.
constexpr std::uint8_t decoderOptions = 0x0F; // as in DERItemSpec
constexpr std::uint8_t signedInteger = 0x10;  // DEROptionSignedInteger
constexpr std::uint8_t writeDER = 0x20;       // DEROptionWriteDER
constexpr std::uint8_t farAway = 0x40;        // the row's place lies beyond every record

} // namespace recordInput

#endif
