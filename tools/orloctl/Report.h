#ifndef VELTRA_TOOLS_ORLOCTL_REPORT_H
#define VELTRA_TOOLS_ORLOCTL_REPORT_H

#include <functional>
#include <iosfwd>
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
    // What stands for the list in the JSON beside these lists.
    nlohmann::ordered_json add(Elements elements) {
        made_.push_back(std::move(elements));
        return nlohmann::ordered_json::binary({}, made_.size() - 1);
    }

    // The list that `json` stands for.
    const Elements& at(const nlohmann::ordered_json& json) const { return made_.at(json.get_binary().subtype()); }

private:
    std::vector<Elements> made_;
};

struct Element {
    nlohmann::ordered_json json;
    Lists lists;
};

// What an offline reader found in a file: once for programs, once for people. The lists look into the file's bytes,
// which must outlive them.
struct Report { // NOLINT(bugprone-exception-escape): moving JSON asserts, which throws nothing here
    nlohmann::ordered_json json = {};
    Lists lists = {};
    std::string text = {};
    bool ok = true;
    std::string problem = {}; // a sentence that says what is wrong and where; empty when ok
};

// Writes `json` on lines of its own, whole, with its lists in their places. An integer that a double cannot hold, as
// many readers of JSON would have it, is written as a text of its digits.
void writeJson(std::ostream& out, const nlohmann::ordered_json& json, const Lists& lists = {});

// Writes a line, or several, of text for people. Here as in writeJson, control characters but line ends, and marks of
// the writing direction, are escaped: what devices, files and servers say does not work the terminal.
void print(std::ostream& out, std::string_view text);

// The first `most` bytes of a text for people, with an ellipsis in place of the others; no character is cut in two.
std::string shortened(const std::string& text, std::size_t most);

#endif
