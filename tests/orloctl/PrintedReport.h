#ifndef VELTRA_TESTS_ORLOCTL_PRINTEDREPORT_H
#define VELTRA_TESTS_ORLOCTL_PRINTEDREPORT_H

#include <sstream>
#include <utility>

#include "tools/orloctl/Report.h"

// The report with its JSON as a program reads it from what is printed, lists and all.
inline Report printed(Report report) {
    std::ostringstream out;
    writeJson(out, report.json, report.lists);
    report.json = nlohmann::ordered_json::parse(out.str());
    return report;
}

#endif
