// A system log that keeps what is written to it, for tests of what is logged and at which level. A test that links the
// object library recorded-log gets it in place of the real one.
#ifndef VELTRA_TESTS_RECORDED_LOG_H
#define VELTRA_TESTS_RECORDED_LOG_H

#include <string>
#include <vector>

// Starts recording; earlier lines are forgotten.
void recordLog();

// The console lines since recordLog, with the line number of an operation's line left out: "<operation> - <message>".
std::vector<std::string> recordedConsole();

// The lines since recordLog, as "<level> [<file>] <message>", without time and line number; those that were written to
// the framework's handle of the system log as "<level> <message>". What went to neither handle is marked.
std::vector<std::string> recordedLog();

#endif
