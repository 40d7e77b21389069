// The openssl command as a second opinion.
#ifndef VELTRA_TESTS_SUPPORT_OPENSSLTOOL_H
#define VELTRA_TESTS_SUPPORT_OPENSSLTOOL_H

#include <cstdlib>
#include <string>

#include "tests/support/TemporaryRoot.h"

// What `openssl asn1parse` prints about the DER in `bytes`; empty when it fails.
inline std::string asn1parse(std::string_view bytes) {
    const TemporaryRoot root;
    root.write("/input", bytes);
    const std::string command =
        "cd '" + root.host("/").string() + "'; '" OPENSSL_TOOL "' asn1parse -inform DER -in input > output";
    return std::system(command.c_str()) == 0 ? root.read("/output") : "";
}

#endif
