// Plays the transcripts beside it: sends each request to the plug-in and compares what it does with what stands there.
// transcripts/README.md says how they are written.
#include <algorithm>
#include <filesystem>
#include <fstream>
#include <regex>
#include <sstream>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include "platform/DeviceAnswers.h"
#include "platform/Format.h"
#include "platform/HardwareRegistry.h"
#include "platform/Hexadecimal.h"
#include "platform/Json.h"
#include "platform/linux/system/DescribedValue.h"
#include "plugin/ZPOrloServices.h"
#include "tests/support/FailingAllocation.h"
#include "tests/support/RecordedLog.h"
#include "tests/support/ScriptedServices.h"
#include "tests/support/TemporaryRoot.h"
#include "tools/orloctl/Reasons.h"

namespace {

namespace fs = std::filesystem;

using Lines = std::vector<std::string>;

struct Case {
    std::string name;
    int line = 0;
    bool isWhole = true; // otherwise it shows what differs from the whole one before it
    Lines arrangement;
    std::string request;
    Lines expected;
};

// The first word of `text`, which loses it and the blank behind it.
std::string takeWord(std::string& text) {
    const std::size_t end = text.find(' ');
    std::string word = text.substr(0, end);
    text.erase(0, end == std::string::npos ? end : end + 1);
    return word;
}

std::vector<Case> readCases(const fs::path& path) {
    std::ifstream file(path);
    std::vector<Case> cases;
    Lines common;
    std::string text;
    for (int number = 1; std::getline(file, text); ++number) {
        if (text.empty() || text.starts_with("# "))
            continue;
        if (text.starts_with("== ") || text.starts_with("-- "))
            cases.push_back({text.substr(3), number, text.starts_with("=="), common, {}, {}});
        else if (cases.empty())
            common.push_back(text);
        else if (text.starts_with("request"))
            cases.back().request = text + " ";
        else
            (cases.back().request.empty() ? cases.back().arrangement : cases.back().expected).push_back(text);
    }
    return cases;
}

Value json(const std::string& text) {
    const std::optional<Value> value = jsonToValue(text);
    return value ? resolveDescribed(*value) : throw std::runtime_error("no JSON: " + text);
}

// File contents: data as <hex>, anything else as the text that it is.
std::string contentsOf(const std::string& text) {
    if (!text.starts_with('<'))
        return std::regex_replace(text, std::regex(R"(\\n)"), "\n");
    const Value data = json(R"({"$data": ")" + text.substr(1, text.size() - 2) + R"("})");
    return data.data() ? std::string(data.data()->begin(), data.data()->end())
                       : throw std::runtime_error("no octets: " + text);
}

// A device, services and files with which every command succeeds, and what a transcript changes of them.
class Arrangement {
public:
    Arrangement() {
        arrangeServices();
        fs::copy(VELTRA_EXAMPLE_DEVICE, root_.host("/"), fs::copy_options::recursive);
        root_.makeDirectory("/tmp");
        root_.write("/ticket", "ticket");
        device_ = nlohmann::json::parse(root_.read(description));
    }

    void change(std::string line) {
        const std::string verb = takeWord(line);
        const std::string name = takeWord(line);
        if (verb == "device")
            changeDevice(nlohmann::json::json_pointer(name), line);
        else if (verb == "script")
            script(outcomes[name], json(line));
        else if (verb == "memoryEnds") // behind that many lines
            whenRecorded(std::stoul(name), [] { failAllocation(1); });
        else if (verb == "remove")
            fs::remove_all(root_.host(name));
        else if (verb == "folder")
            root_.makeDirectory(name);
        else if (verb == "replace") // in a file, some octets by others
            replace(name, contentsOf(takeWord(line)), line);
        else if (verb == "file")
            root_.write(name, contentsOf(line));
        else
            throw std::runtime_error("no such arrangement: " + verb);
    }

    const TemporaryRoot& root() const { return root_; }

private:
    void changeDevice(const nlohmann::json::json_pointer& pointer, const std::string& value) {
        if (value.empty())
            device_.at(pointer.parent_pointer()).erase(pointer.back());
        else
            device_[pointer] = nlohmann::json::parse(value);
        root_.write(description, device_.dump());
    }

    static void script(Outcome& outcome, const Value& given) {
        outcome.result = given["result"].boolean().value_or(outcome.result);
        outcome.memoryEnds = given["memoryEnds"].boolean().value_or(false);
        if (const Value::Array* error = given["error"].array())
            outcome.error = Error{*error->at(0).text(), *error->at(1).integer(), *error->at(2).text()};
        if (given.dictionary()->contains("output"))
            outcome.output = given["output"];
    }

    void replace(const std::string& name, const std::string& from, const std::string& to) {
        std::string contents = root_.read(name);
        const std::size_t at = contents.find(from);
        if (at == std::string::npos)
            throw std::runtime_error("nothing to replace in " + name);
        root_.write(name, contents.replace(at, from.size(), contentsOf(to)));
    }

    static constexpr const char* description = "/etc/veltra/device.json";
    TemporaryRoot root_;
    nlohmann::json device_;
};

// A line as a transcript shows it: without what differs from build to build and from run to run.
std::string shown(std::string line, const HSMessageRequest& request) {
    static const std::pair<std::regex, std::string> masks[] = {
        {std::regex(R"((\]:|at line )\d+)"), "$1#"},
        {std::regex("Challenge : <[0-9a-f]{64}>"), "Challenge : <#>"},
        {std::regex("//" VELTRA_ORLO_CA_HOST), "//CA"},
        {std::regex("//" VELTRA_ORLO_DATA_STORE_HOST), "//DS"},
        {std::regex(" version " VELTRA_TEST_VERSION "\\.1$"), " version #"},
        {std::regex("\n"), "\\n"},
    };
    for (const std::string& what :
         {"Received Request : " + request.description(), "request.messageDict : " + request.messageDict.description()})
        if (line.ends_with("] " + what))
            line.replace(line.find(" : ") + 3, std::string::npos, "#");
    if (line.ends_with(" "))
        line.back() = '_';
    for (const auto& [pattern, mask] : masks)
        line = std::regex_replace(line, pattern, mask);
    return line;
}

std::string shown(const HSMessageRequest& request, bool completed, const std::optional<HSMessageResponse>& response) {
    std::string line = completed ? "=" : "= not completed";
    if (!response)
        return line + " nothing";
    line += format(response->name() == request.messageStr ? " %ld" : " of another name %ld", response->statusCode());
    if (!response->response().isNothing())
        line += format(" %@", response->response());
    if (const std::optional<Error>& error = response->error())
        line += format(" error %@ %ld %@", error->domain, error->code, error->text);
    return line;
}

bool isText(const std::string& contents) {
    return std::ranges::all_of(contents, [](unsigned char c) { return c == '\n' || (c >= ' ' && c < 0x7F); });
}

// What the request made of the device's files.
void compareFiles(const TemporaryRoot& root, const std::map<std::string, std::string>& before, Lines& lines) {
    const std::map<std::string, std::string> after = root.contents();
    for (const auto& [path, contents] : after)
        if (!before.contains(path) || before.at(path) != contents)
            lines.push_back("wrote " + path + " " +
                            (isText(contents) ? contents
                                              : hexadecimal({reinterpret_cast<const std::uint8_t*>(contents.data()),
                                                             contents.size()})));
    for (const auto& entry : before)
        if (!after.contains(entry.first))
            lines.push_back("removed " + entry.first);
}

// Marks the messages that the client shows as the reasons of a failed request.
void markReasons(const std::string& command, Lines& lines) {
    const auto isMessage = [](const std::string& line) { return line[0] >= '1' && line[0] <= '4'; };
    const auto last = std::find_if(lines.rbegin(), lines.rend(), isMessage);
    for (std::string& line : lines) {
        std::string text = line;
        const std::string level = takeWord(text);
        if (text.starts_with('['))
            takeWord(text);
        if (isMessage(line) && isReason(command, std::stoi(level), text, &line == &*last))
            line.insert(1, "!");
    }
}

Lines play(const Case& played) {
    Arrangement arrangement;
    for (const std::string& line : played.arrangement)
        arrangement.change(line);
    std::string words = played.request;
    takeWord(words);
    const std::string command = takeWord(words);
    const HSMessageRequest request{command.empty() ? Value() : Value(command), words.empty() ? Value() : json(words)};

    const auto before = arrangement.root().contents();
    Lines answers;
    KACopyAnswer("", {}); // what is wrong with the description is said at the first query
    recordLog();
    ZPOrloServices().handleMessage(
        request, [&](bool completed, const auto& response) { answers.push_back(shown(request, completed, response)); });
    failAllocation(0);
    whenRecorded(0, nullptr);
    Lines lines = recordedLines();
    if (!answers.empty() && answers.front().starts_with("= -1"))
        markReasons(command, lines);
    for (const auto& [key, value] : sessionOptions)
        lines.push_back("option " + key + " " + value.description());
    lines.insert(lines.end(), answers.begin(), answers.end());
    compareFiles(arrangement.root(), before, lines);
    if (liveSessions != 0 || HardwareRegistry::heldServices() != 0)
        lines.push_back(
            format("not released: %d sessions, %lu services", liveSessions, HardwareRegistry::heldServices()));
    for (std::string& line : lines)
        line = shown(line, request);
    return lines;
}

// The expected lines, with those that are the same as in the whole case: "+3" three of them, "+" all that are left,
// "-3" three that are left out.
Lines expand(const Lines& expected, const Lines& whole) {
    Lines lines;
    std::size_t at = 0;
    for (const std::string& line : expected) {
        const bool keeps = line.starts_with('+');
        if (!keeps && !line.starts_with('-')) {
            lines.push_back(line);
            continue;
        }
        const std::size_t end = line == "+" ? whole.size() : at + std::stoul(line.substr(1));
        for (; at < end; ++at)
            if (keeps)
                lines.push_back(whole.at(at));
    }
    return lines;
}

std::string joined(const Lines& lines) {
    std::string text;
    for (const std::string& line : lines)
        text += line + "\n";
    return text;
}

std::vector<fs::path> transcripts() {
    std::vector<fs::path> paths;
    for (const auto& entry : fs::directory_iterator(VELTRA_TRANSCRIPTS))
        if (entry.path().extension() == ".txt")
            paths.push_back(entry.path());
    std::ranges::sort(paths);
    return paths;
}

class Transcripts : public testing::TestWithParam<fs::path> {};

TEST_P(Transcripts, areWhatThePluginDoes) {
    Lines whole;
    for (const Case& played : readCases(GetParam())) {
        const Lines expected = expand(played.expected, whole);
        EXPECT_EQ(joined(expected), joined(play(played)))
            << GetParam().string() << ":" << played.line << ": " << played.name;
        if (played.isWhole)
            whole = expected;
    }
}

INSTANTIATE_TEST_SUITE_P(Of, Transcripts, testing::ValuesIn(transcripts()),
                         [](const auto& played) { return played.param.stem().string(); });

} // namespace
