#include "tools/orloctl/Completion.h"

#include <algorithm>
#include <iostream>
#include <string_view>

#include "img4/Img4Trust.h"
#include "platform/DataClasses.h"
#include "platform/Files.h"
#include "tools/orloctl/Verbs.h"

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
        offer(std::string(dataClass.name), typed, dataClass.composition());
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

void offerKind(std::string_view placeholder, const std::string& typed) {
    for (const auto& kind : kinds)
        if (kind.placeholder == placeholder)
            kind.offer(typed);
}

// A verb takes the options of those above it too.
const CLI::Option* optionNamed(const CLI::App* verb, const std::string& word) {
    const CLI::Option* option = nullptr;
    for (; verb && !option; verb = verb->get_parent())
        option = verb->get_option_no_throw(word);
    return option;
}

void offerOptions(const CLI::App& verb, const std::string& typed) {
    for (const CLI::App* level = &verb; level; level = level->get_parent())
        for (const CLI::Option* option : level->get_options())
            if (!option->get_positional() && (level == &verb || option != level->get_help_ptr())) {
                for (const std::string& letter : option->get_snames())
                    offer("-" + letter, typed, option->get_description());
                for (const std::string& name : option->get_lnames())
                    offer("--" + name, typed, option->get_description());
            }
}

void offerVerbs(const std::string& typed) {
    for (const Verb& verb : verbs)
        offer(verb.name, typed, verb.says);
}

void offerOperands(const Verb& verb, std::size_t before, const std::string& typed) {
    std::size_t position = 0;
    for (const Argument& operand : verb.arguments) {
        if (operand.name[0] == '-')
            continue;
        if (position == before || (operand.number == Any && position < before)) {
            for (const std::string& word : operand.members)
                offer(word, typed);
            offerKind(operand.name, typed);
            before += operand.number == MayBeLeftOut ? 1 : 0; // it may be left out now
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
        const auto called = verb->get_subcommands([&](const CLI::App* known) { return known->check_name(word); });
        if (waiting)
            waiting = nullptr;
        else if (!optionsHaveEnded && word.starts_with('-') && word.size() > 1) {
            optionsHaveEnded = word == "--";
            const CLI::Option* option = optionNamed(verb, word);
            waiting = option && option->get_items_expected_max() > 0 ? option : nullptr;
        } else if (operands == 0 && !called.empty())
            verb = called.front();
        else
            ++operands;
    }
    const std::string typed = words.empty() ? std::string() : words.back();
    if (waiting)
        offerKind(waiting->get_type_name(), typed);
    else if (!optionsHaveEnded && typed.starts_with('-'))
        offerOptions(*verb, typed);
    else if (verb == &app)
        offerVerbs(typed);
    else
        offerOperands(*std::ranges::find(verbs, verb->get_name(), &Verb::name), operands, typed);
}
