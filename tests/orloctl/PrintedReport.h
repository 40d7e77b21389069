#ifndef VELTRA_TESTS_ORLOCTL_PRINTEDREPORT_H
#define VELTRA_TESTS_ORLOCTL_PRINTEDREPORT_H

#include <sstream>
#include <utility>

#include "tools/orloctl/Report.h"

// The report with its JSON as a program reads it from what is printed, lists and all, and its text as people do.
inline Report printed(Report report) {
    std::ostringstream out;
    std::ostringstream text;
    writeJson(out, report);
    writeText(text, report);
    report.json = nlohmann::ordered_json::parse(out.str());
    report.text = text.str();
    return report;
}

#endif
