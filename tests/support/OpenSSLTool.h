// The openssl command as a second opinion.
#ifndef VELTRA_TESTS_SUPPORT_OPENSSLTOOL_H
#define VELTRA_TESTS_SUPPORT_OPENSSLTOOL_H

#include <cstdint>
#include <string>
#include <vector>

// What `openssl asn1parse` prints about the DER in `bytes`; empty when it fails.
std::string asn1parse(const std::vector<std::uint8_t>& bytes);

#endif
