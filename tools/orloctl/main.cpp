// orloctl: the host's side of the service, for people and scripts.
#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <exception>
#include <iostream>
#include <string>
#include <string_view>
#include <vector>

#include <fcntl.h>

#include <CLI/CLI.hpp>

#include "platform/NearestName.h"
#include "tools/orloctl/Completion.h"
#include "tools/orloctl/LocalFiles.h"
#include "tools/orloctl/Verbs.h"
#include "tools/orloctl/Version.h"

namespace {

constexpr const char* exitStatuses = R"(Exit status:
  0  success
  1  the plug-in answered with a failure, or there is no result to rely on
  2  wrong usage, a request that the service refuses, or a local file or
     output that cannot be read or written
  3  the service cannot be reached, or did not answer in time
  4  the plug-in does not know the command
  5  an offline reader met bad input, or a file is not trusted

The bus is the one in the environment variable VELTRA_BUS unless --bus names another. Paths of the device are seen below
the device root (environment variable VELTRA_DEVICE_ROOT, default /).)";

class CommandLine {
public:
    CommandLine() {
        app_.set_version_flag("--version", "orloctl " VELTRA_VERSION);
        app_.add_option("--bus", address_.bus, "\"system\", \"session\" or a D-Bus address")
            ->type_name("BUS")
            ->envname("VELTRA_BUS")
            ->capture_default_str();
        app_.add_option("--timeout", timeoutSeconds_, "Seconds to wait for an answer")
            ->type_name("SECONDS")
            ->check(CLI::Range(1LL, 1'000'000LL).description(""))
            ->capture_default_str();
        app_.add_flag("--json", address_.json, "Print exactly one JSON object");
        app_.add_flag("-v,--verbose", address_.verbose, "Print each message of the request as it comes");
        app_.require_subcommand(1);
        app_.fallthrough();
        app_.footer(exitStatuses);
        for (const char* label : {"TEXT", "REQUIRED"}) // the names and brackets of the usage line say enough
            app_.get_formatter()->label(label, "");
        for (const Verb& verb : verbs)
            add(verb);
    }

    int run(int argc, char** argv) {
        // For shells: the words after it are not the client's own.
        if (argc > 1 && argv[1] == std::string_view("--complete")) {
            printCompletions(app_, {argv + 2, argv + argc});
            return 0;
        }
        // A failure to parse the command line may come before the flag is read.
        address_.json = std::find(argv, argv + argc, std::string_view("--json")) != argv + argc;
        try {
            app_.parse(argc, argv);
            return print(reportOfVerb());
        } catch (const CLI::Success& printed) {
            return app_.exit(printed);
        } catch (const CLI::ParseError& wrong) {
            const auto words = app_.remaining();
            const bool isUnknown = app_.get_subcommands().empty() && !words.empty() && words.front()[0] != '-';
            return print(
                wrongUsage((isUnknown ? noVerb(words.front()) : wrong.what()) + " (orloctl --help says more)"));
        } catch (const std::exception& failure) {
            return print(wrongUsage(failure.what()));
        }
    }

private:
    void add(const Verb& verb) {
        CLI::App* const added = app_.add_subcommand(verb.name, verb.says);
        added->validate_positionals();
        if (verb.command)
            added->alias(verb.command);
        for (const Argument& argument : verb.arguments) {
            if (argument.name[0] == '-' && !*argument.type) {
                added->add_flag(argument.name, argument.says);
                continue;
            }
            CLI::Option* const option = added->add_option(argument.name, argument.says);
            if (argument.name[0] == '-')
                option->type_name(argument.type);
            else
                option->required(argument.number == One)
                    ->expected(argument.number == Any ? CLI::detail::expected_max_vector_size : 1);
            if (!argument.members.empty())
                option->check(CLI::IsMember(argument.members));
        }
    }

    Report reportOfVerb() {
        const CLI::App& given = *app_.get_subcommands().front();
        const CLI::Option* const output = given.get_option_no_throw("--output");
        copiesToOutput_ = output && output->count() > 0 && output->results().front() == "-";
        if (address_.json && copiesToOutput_)
            throw UsageError("--json and -o - both ask for standard output");
        address_.timeout = std::chrono::seconds(timeoutSeconds_);
        return std::ranges::find(verbs, given.get_name(), &Verb::name)->run(address_, Words(given));
    }

    static std::string noVerb(const std::string& word) {
        std::vector<std::string_view> names;
        for (const Verb& verb : verbs) {
            names.emplace_back(verb.name);
            if (verb.command)
                names.emplace_back(verb.command);
        }
        const std::string_view meant = nearestName(word, names);
        return "There is no verb \"" + word + "\"" + (meant.empty() ? "" : "; is " + std::string(meant) + " meant?");
    }

    static Report wrongUsage(const std::string& problem) {
        Report report;
        report.fail(problem, Outcome::Usage);
        return report;
    }

    // Its exit status is the report's.
    int print(Report report) const {
        if (report.ok() && !address_.verbose)
            report.messages = nullptr;
        if (address_.json)
            writeJson(std::cout, report);
        else {
            // A result that goes to standard output has it for itself.
            writeText(copiesToOutput_ ? std::cerr : std::cout, report);
            for (const std::string& sentence : {report.note, report.problem})
                if (!sentence.empty())
                    ::print(std::cerr, "orloctl: " + sentence);
            if (!address_.verbose) // they have been printed as they came
                for (const auto& message : report.messages)
                    ::print(std::cerr, "  " + messageLine(message.at("source").get<std::string>(),
                                                          message.at("text").get<std::string>()));
        }
        return static_cast<int>(report.outcome);
    }

    CLI::App app_{"Sends requests to the Veltra Orlo services, and reads their file formats offline.", "orloctl"};
    ServiceAddress address_;
    long long timeoutSeconds_ = 600;
    bool copiesToOutput_ = false; // -o -
};

// A standard stream that is closed gets a file on which reading and writing fail: nothing that is opened later is then
// taken for it.
void occupyStandardStreams() {
    for (int number = STDIN_FILENO; number <= STDERR_FILENO; ++number)
        if (::fcntl(number, F_GETFD) == -1)
            (void)::open("/dev/null", number == STDIN_FILENO ? O_WRONLY : O_RDONLY);
}

// A status that tells of success while what was printed is lost would deceive whoever reads it.
int unlessOutputIsLost(int status) {
    errno = 0;
    std::cout.flush();
    if (std::cout.good())
        return status;
    std::cerr << "orloctl: Cannot write to standard output: "
              << (errno != 0 ? std::strerror(errno) : "it did not take all of it") << '\n';
    return static_cast<int>(Outcome::Usage);
}

} // namespace

int main(int argc, char** argv) {
    occupyStandardStreams();
    (void)std::signal(SIGPIPE, SIG_IGN); // a pipe that nobody reads is output that is lost, of which the status tells
    return unlessOutputIsLost(CommandLine().run(argc, argv));
}
