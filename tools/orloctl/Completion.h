// What a shell offers for the word at the cursor: read from the command line's own tables, so that it is what --help
// says.
#ifndef VELTRA_TOOLS_ORLOCTL_COMPLETION_H
#define VELTRA_TOOLS_ORLOCTL_COMPLETION_H

#include <string>
#include <vector>

#include <CLI/CLI.hpp>

// Prints what may stand for the last of `words`, which are those after the program's name up to the cursor; the last
// one is what has been typed of its word and may be empty. One line for each: the word, and after a tab what it is. The
// line
// ":files" or ":directories" stands for the local ones, which the shell finds itself.
void printCompletions(const CLI::App& app, const std::vector<std::string>& words);

#endif
