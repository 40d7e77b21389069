#ifndef VELTRA_TOOLS_ORLOCTL_REPORT_H
#define VELTRA_TOOLS_ORLOCTL_REPORT_H

#include <cstdint>
#include <functional>
#include <iosfwd>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include <nlohmann/json.hpp>

struct Element;

// Hands the elements of a list one after another to `take`, until that returns false.
using Elements = std::function<void(const std::function<bool(const Element&)>& take)>;

// Lists that are made while they are written, since as a whole they can take many times the memory of the file that
// they are read from.
class Lists {
public:
    using Count = std::optional<std::uint64_t>;

    // What stands for the list in the JSON beside these lists. With a `count` of its elements and those inside them,
    // nobody goes through what is not shown to find out how many they are.
    nlohmann::ordered_json add(Elements elements, Count count = {}) {
        made_.emplace_back(std::move(elements), count);
        return nlohmann::ordered_json::binary({}, made_.size() - 1);
    }

    // The list that `json` stands for.
    const Elements& at(const nlohmann::ordered_json& json) const { return made_.at(number(json)).first; }
    Count countAt(const nlohmann::ordered_json& json) const { return made_.at(number(json)).second; }

private:
    static std::size_t number(const nlohmann::ordered_json& json) { return json.get_binary().subtype(); }

    std::vector<std::pair<Elements, Count>> made_;
};

struct Element {
    nlohmann::ordered_json json;
    Lists lists;
};

// What became of a command line. The values are the exit statuses of orloctl.
enum class Outcome {
    Success = 0,        // the plug-in answered with status 0
    Failure = 1,        // the plug-in answered with another status
    Usage = 2,          // the arguments are wrong, or the request holds what the plug-in does not take
    Unreachable = 3,    // there is no bus, no service on it, or no answer within the timeout
    UnknownCommand = 4, // the request was completed with no response object
    BadInput = 5,       // an offline reader met bad input
};

// What a verb found: the same for programs and for people. The lists look into the bytes of a file, which must outlive
// them.
struct Report { // NOLINT(bugprone-exception-escape): moving JSON asserts, which throws nothing here
    nlohmann::ordered_json json = nlohmann::ordered_json::object();
    Lists lists = {};
    Outcome outcome = Outcome::Success;
    std::string problem = {};             // sentences that say what is wrong and where; empty on success
    std::string note = {};                // what the JSON does not say and the user should know
    nlohmann::ordered_json messages = {}; // what the service told of the request, with "level", "source" and "text"

    bool ok() const { return outcome == Outcome::Success; }
    void fail(std::string why, Outcome how = Outcome::BadInput) {
        problem = std::move(why);
        outcome = how;
    }
};

// Writes the report as one JSON object, whole, with its lists in their places, beginning with "exitStatus". An integer
// that a double cannot hold, as many readers of JSON would have it, is written as a text of its digits.
void writeJson(std::ostream& out, const Report& report);

// Writes what the report found as indented lines: of a long list the beginning and the number of the others, of an
// offline reader's long values the beginning. Problem, note and messages are left out.
void writeText(std::ostream& out, const Report& report);

// Writes a line, or several, of text for people. Wherever something is written, control characters and marks of the
// writing direction are escaped: what devices, files and servers say does not work the terminal.
void print(std::ostream& out, std::string_view text);

// The first `most` bytes of a text for people, with an ellipsis in place of the others; no character is cut in two.
std::string shortened(const std::string& text, std::size_t most);

#endif
