// The verbs of the command line: what each takes and what it does.
#ifndef VELTRA_TOOLS_ORLOCTL_VERBS_H
#define VELTRA_TOOLS_ORLOCTL_VERBS_H

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>

#include "tools/orloctl/Client.h"
#include "tools/orloctl/Report.h"

// What was written for the operands and options of a verb.
class Words {
public:
    explicit Words(const CLI::App& verb) : verb_(verb) {}

    const std::vector<std::string>& all(const char* name) const { return verb_[name]->results(); }
    std::optional<std::string> find(const char* name) const {
        return all(name).empty() ? std::nullopt : std::optional(all(name).front());
    }
    std::string operator[](const char* name) const { return find(name).value_or(""); }
    bool has(const char* name) const { return verb_[name]->count() > 0; }

private:
    const CLI::App& verb_;
};

enum Number {
    One,
    MayBeLeftOut,
    Any
};

// An option, or an operand that is named by what stands for it.
struct Argument {
    const char* name;
    const char* says;
    const char* type = "";                 // of an option's value; empty for an option without one
    Number number = One;                   // of an operand
    std::vector<std::string> members = {}; // all that the operand can be
};

struct Verb {
    const char* name;
    const char* command; // of the plug-in, which is another name of the verb; null for none
    const char* says;
    std::vector<Argument> arguments;
    std::function<Report(const ServiceAddress&, const Words&)> run; // raises what says why the words cannot be obeyed
};

extern const std::vector<Verb> verbs;

#endif
