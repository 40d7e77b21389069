// A system log that keeps what is written to it, for tests of what is logged and at which level. A test that links the
// object library recorded-log gets it in place of the real one.
#ifndef VELTRA_TESTS_RECORDED_LOG_H
#define VELTRA_TESTS_RECORDED_LOG_H

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

// Starts recording; earlier lines are forgotten.
void recordLog();

// Calls `then` once, when that many lines have been recorded.
void whenRecorded(std::size_t count, void (*then)());

// Keeps a call of a service that stands in for the device's, in its place among the lines.
void recordCall(std::string_view call);

// Everything since recordLog in its order: the lines of the log as recordedLog has them, those of the console behind
// "console: ", with the line number of an operation's line left out ("<operation> - <message>"), and the calls behind
// "> ".
std::vector<std::string> recordedLines();

// The lines since recordLog, as "<level> [<file>] <message>", without time and line number; those that were written to
// the framework's handle of the system log as "<level> <message>". What went to neither handle is marked.
std::vector<std::string> recordedLog();

#endif
