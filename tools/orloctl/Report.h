#ifndef VELTRA_TOOLS_ORLOCTL_REPORT_H
#define VELTRA_TOOLS_ORLOCTL_REPORT_H

#include <string>

#include <nlohmann/json.hpp>

// What an offline reader found in a file: once for programs, once for people.
struct Report { // NOLINT(bugprone-exception-escape): moving JSON asserts, which throws nothing here
    nlohmann::ordered_json json;
    std::string text;
    bool ok = true;
    std::string problem; // a sentence that says what is wrong and where; empty when ok
};

#endif
