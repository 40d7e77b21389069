#ifndef VELTRA_TESTS_ORLOCTL_PRINTEDREPORT_H
#define VELTRA_TESTS_ORLOCTL_PRINTEDREPORT_H

#include <sstream>
#include <utility>

#include "tools/orloctl/Report.h"

// A report as people and programs get it: its text, and its JSON with the lists in their places.
struct PrintedReport : Report {
    PrintedReport(Report report) : Report(std::move(report)) {
        std::ostringstream lines, object;
        writeText(lines, *this);
        writeJson(object, *this);
        text = lines.str();
        json = nlohmann::ordered_json::parse(object.str());
    }

    bool says(const std::string& words) const { return text.find(words) != std::string::npos; }

    std::string text;
};

#endif
