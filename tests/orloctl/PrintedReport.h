#ifndef VELTRA_TESTS_ORLOCTL_PRINTEDREPORT_H
#define VELTRA_TESTS_ORLOCTL_PRINTEDREPORT_H

#include <sstream>
#include <utility>

#include "tools/orloctl/Report.h"

inline std::string linesOf(const Report& report) {
    std::ostringstream lines;
    writeText(lines, report);
    return lines.str();
}

// A report as people and programs get it: its text, and its JSON with the lists in their places.
struct PrintedReport : Report {
    PrintedReport(Report report) : Report(std::move(report)), text(linesOf(*this)) {
        std::ostringstream object;
        writeJson(object, *this);
        json = nlohmann::ordered_json::parse(object.str());
    }

    bool says(const std::string& words) const { return text.find(words) != std::string::npos; }

    std::string text;
};

#endif
