// Headers in strict DER, for the decoder and the encoder.
#ifndef VELTRA_TESTS_DER_HEADERS_H
#define VELTRA_TESTS_DER_HEADERS_H

#include <cstdint>

#include "der/DERTypes.h"

inline constexpr struct {
    const char* identifier;
    DERTag tag;
    const char* lengthOctets;
    std::uint64_t length;
} headers[] = {
    {"05", 0x05, "00", 0},
    {"02", DERTagInteger, "01", 1},
    {"30", DERTagSequence, "7F", 127},
    {"04", DERTagOctetString, "81 80", 128},
    {"1F 1F", 31, "81 FF", 255},
    {"31", DERTagSet, "82 01 00", 256},
    {"A0", DERTagContextConstructed(0), "83 01 00 00", 0x10000},
    {"9E", DERTagContextPrimitive(30), "02", 2},
    {"41", (UINT64_C(1) << 62) + 1, "00", 0},
    {"1F 7F", 127, "03", 3},
    {"1F 81 00", 128, "00", 0},
    {"FF 85 9A C1 82 59", DERTagPrivateConstructed(0x53504159), "02", 2},
    {"DF 9F FF FF FF FF FF FF FF 7F", (UINT64_C(3) << 62) + DERTagNumberMask, "81 80", 128},
    {"FF 9F FF FF FF FF FF FF FF 7F", UINT64_MAX, "88 FF FF FF FF FF FF FF FF", UINT64_MAX},
    {"04", DERTagOctetString, "88 7F FF FF FF FF FF FF FF", INT64_MAX},
    {"04", DERTagOctetString, "88 80 00 00 00 00 00 00 00", UINT64_C(1) << 63},
};

#endif
