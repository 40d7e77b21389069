#ifndef VELTRA_TESTS_ORLOCTL_PRINTEDREPORT_H
#define VELTRA_TESTS_ORLOCTL_PRINTEDREPORT_H

#include <sstream>
#include <utility>

#include "tools/orloctl/Report.h"

// A report and its text as people read it.
struct PrintedReport : Report {
    PrintedReport(Report report) : Report(std::move(report)) {
        std::ostringstream out;
        writeText(out, *this);
        text = out.str();
    }

    std::string text;
};

// Its JSON too as a program reads it from what is printed, lists and all.
inline PrintedReport printed(PrintedReport report) {
    std::ostringstream out;
    writeJson(out, report);
    report.json = nlohmann::ordered_json::parse(out.str());
    return report;
}

#endif
