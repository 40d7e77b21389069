#include "tools/orloctl/Completion.h"

#include <algorithm>
#include <iostream>
#include <sstream>
#include <string_view>

#include "img4/Img4Trust.h"
#include "platform/DataClasses.h"
#include "platform/Files.h"

namespace {

void offer(const std::string& word, const std::string& typed, std::string_view says = {}) {
    const auto breaksLines = [](char c) { return static_cast<unsigned char>(c) < ' '; };
    if (word.starts_with(typed) && std::none_of(word.begin(), word.end(), breaksLines))
        std::cout << word << '\t' << says << '\n';
}

void offerBuses(const std::string& typed) {
    for (const char* bus : {"system", "session", "unix:path="})
        offer(bus, typed);
}

void offerDataClasses(const std::string& typed) {
    for (const DataClass& dataClass : dataClasses)
        offer(std::string(dataClass.name), typed);
}

void offerTrustProfiles(const std::string& typed) {
    for (std::uint16_t i = 0; i < Img4NumTrustProfiles; ++i)
        offer(Img4TrustProfiles[i].name, typed);
}

void offerDeviceFiles(const std::string& typed) {
    const std::string folder = typed.empty() ? "/" : typed.substr(0, typed.rfind('/') + 1);
    for (const std::string& name : files::list(folder)) {
        const std::string path = folder + name;
        offer(files::kindOf(path) == files::Kind::Directory ? path + '/' : path, typed);
    }
}

// What may be written for a placeholder of --help.
constexpr struct {
    std::string_view placeholder;
    void (*offer)(const std::string& typed);
} kinds[] = {
    {"BUS", offerBuses},
    {"CLASS", offerDataClasses},
    {"DEVICE-FILE", offerDeviceFiles},
    {"DIRECTORY", [](const std::string&) { std::cout << ":directories\n"; }},
    {"FILE", [](const std::string&) { std::cout << ":files\n"; }},
    {"PROFILE", offerTrustProfiles},
};

// The words of an option or operand that takes no others, which stand in braces in the name of its type.
void offerMembers(const std::string& typeName, const std::string& typed) {
    const std::size_t open = typeName.find('{');
    if (open == std::string::npos)
        return;
    std::istringstream words(typeName.substr(open + 1, typeName.find('}') - open - 1));
    for (std::string word; std::getline(words, word, ',');)
        offer(word, typed);
}

void offerKind(std::string_view placeholder, const std::string& typed) {
    for (const auto& kind : kinds)
        if (kind.placeholder == placeholder)
            kind.offer(typed);
}

// The names of an option with their dashes.
std::vector<std::string> namesOf(const CLI::Option& option) {
    std::vector<std::string> names;
    for (const std::string& name : option.get_snames())
        names.push_back("-" + name);
    for (const std::string& name : option.get_lnames())
        names.push_back("--" + name);
    return names;
}

// A verb takes the options of those above it too.
const CLI::Option* optionNamed(const CLI::App* verb, const std::string& word) {
    for (; verb; verb = verb->get_parent())
        for (const CLI::Option* option : verb->get_options()) {
            const auto names = namesOf(*option);
            if (std::find(names.begin(), names.end(), word) != names.end())
                return option;
        }
    return nullptr;
}

void offerOptions(const CLI::App& verb, const std::string& typed) {
    for (const CLI::App* level = &verb; level; level = level->get_parent())
        for (const CLI::Option* option : level->get_options())
            for (const std::string& name : namesOf(*option))
                if (level == &verb || option != level->get_help_ptr())
                    offer(name, typed, option->get_description());
}

std::vector<const CLI::App*> verbsOf(const CLI::App& app) {
    return app.get_subcommands([](const CLI::App* verb) { return !verb->get_group().empty(); });
}

void offerOperands(const CLI::App& verb, std::size_t before, const std::string& typed) {
    for (const CLI::App* next : verbsOf(verb))
        offer(next->get_name(), typed, next->get_description());
    std::size_t position = 0;
    for (const CLI::Option* operand : verb.get_options()) {
        if (!operand->get_positional())
            continue;
        const bool takesAllThatFollow = operand->get_expected_max() > 1;
        if (position == before || (takesAllThatFollow && position < before)) {
            offerMembers(operand->get_type_name(), typed);
            offerKind(operand->get_name(true), typed);
            // What may be left out may be left out now.
            before += operand->get_required() || takesAllThatFollow ? 0 : 1;
        }
        ++position;
    }
}

} // namespace

void printCompletions(const CLI::App& app, const std::vector<std::string>& words) {
    const CLI::App* verb = &app;
    const CLI::Option* waiting = nullptr; // for its value
    std::size_t operands = 0;
    bool optionsHaveEnded = false;
    for (std::size_t i = 0; i + 1 < words.size(); ++i) {
        const std::string& word = words[i];
        const auto verbs = verbsOf(*verb);
        const auto next =
            std::find_if(verbs.begin(), verbs.end(), [&](const CLI::App* known) { return known->get_name() == word; });
        if (waiting)
            waiting = nullptr;
        else if (!optionsHaveEnded && word.starts_with('-') && word.size() > 1) {
            optionsHaveEnded = word == "--";
            const CLI::Option* option = optionNamed(verb, word);
            waiting = option && option->get_items_expected_max() > 0 ? option : nullptr;
        } else if (operands == 0 && next != verbs.end())
            verb = *next;
        else
            ++operands;
    }
    const std::string typed = words.empty() ? std::string() : words.back();
    if (waiting)
        offerKind(waiting->get_type_name(), typed);
    else if (!optionsHaveEnded && typed.starts_with('-'))
        offerOptions(*verb, typed);
    else
        offerOperands(*verb, operands, typed);
}
