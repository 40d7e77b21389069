// orloctl: the host's side of the service, for people and scripts.
#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <exception>
#include <functional>
#include <iostream>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <fcntl.h>

#include <CLI/CLI.hpp>

#include "Daemon/Conversions.h"
#include "platform/Crypto.h"
#include "tools/orloctl/Arguments.h"
#include "tools/orloctl/Client.h"
#include "tools/orloctl/Completion.h"
#include "tools/orloctl/CrashLogReport.h"
#include "tools/orloctl/LocalFiles.h"
#include "tools/orloctl/Report.h"
#include "tools/orloctl/SetBcfg.h"
#include "tools/orloctl/ShowFile.h"
#include "tools/orloctl/VerifyImg4.h"
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

// What was written for the operands and options of a verb.
class Words {
public:
    explicit Words(const CLI::App& verb) : verb_(verb) {}

    const std::vector<std::string>& all(const char* name) const { return verb_[name]->results(); }
    std::optional<std::string> find(const char* name) const {
        return all(name).empty() ? std::nullopt : std::optional(all(name).front());
    }
    std::string operator[](const char* name) const { return find(name).value_or(""); }

private:
    const CLI::App& verb_;
};

// Copies a result to the file that -o names, if any. A copy that fails does not take the answer along.
void copyResult(Report& report, const Words& words, const Value::Data& result) {
    try {
        if (const auto path = words.find("--output"))
            writeLocalFile(*path, result);
    } catch (const UsageError& failure) {
        report.note = failure.what();
        report.fail("The request was carried out, but its result was not copied.", Outcome::Usage);
    }
}

std::string placeOf(const std::string& path, const Value::Data& contents) {
    return path + ", " + std::to_string(contents.size()) + " bytes";
}

// A request with no arguments, or the operand under a key.
auto request(const char* command, const char* key = nullptr, const char* operand = nullptr) {
    return [=](const ServiceAddress& address, const Words& words) {
        return sendRequest(address, command, key ? Value::Dictionary{{key, words[operand]}} : Value::Dictionary())
            .report;
    };
}

Report call(const ServiceAddress& address, const Words& words) {
    return sendRequest(address, words["COMMAND"], parseArguments(words.all("ARGUMENT"))).report;
}

Report checkEntitlement(const ServiceAddress& address, const Words&) {
    Answer answer = sendRequest(address, "checkCorvoPostSwapEntitlement", {});
    if (answer.response["response"]["IsPostSwapEntitled"] == Value(false))
        answer.report.note = "The boot ticket does not hold the entitlement, or cannot be read. " + answer.reasons;
    return std::move(answer.report);
}

// Without classes the choice is the plug-in's.
Report exportClasses(const ServiceAddress& address, const Words& words) {
    const auto& classes = words.all("CLASS");
    Value::Dictionary arguments;
    if (!classes.empty())
        arguments["ExportList"] = Value::Array(classes.begin(), classes.end());
    return sendRequest(address, "OrloExport", arguments).report;
}

Report getTcrt(const ServiceAddress& address, const Words& words) {
    auto [report, response, user, reasons] = sendRequest(address, "getTCRT", {});
    const std::string* text = response["response"]["CertData"].text();
    if (!report.ok())
        return std::move(report);
    if (!text || text->empty()) {
        report.fail("The certificate in the hardware registry is empty.", Outcome::Failure);
        return std::move(report);
    }
    const Value::Data certificate = hexString2Binary(*text);
    copyResult(report, words, certificate);
    if (const auto path = words.find("--output"))
        report.json["result"] = placeOf(*path, certificate);
    if (report.note.empty() && response["response"]["CertSerialNumber"] == Value("DummyCertificateSerialNumber"))
        report.note = "the serial number cannot be read: the hardware registry holds no certificate but other bytes";
    return std::move(report);
}

Report rewriteBlob(const ServiceAddress& address, const Words& words) {
    auto [answer, result] = setBcfg(address, words["DEVICE-FILE"]);
    Report& report = answer.report;
    if (!report.ok())
        return std::move(report);
    copyResult(report, words, result.contents);
    report.json["result"] = placeOf(std::string(blobResultPath) + " on the device", result.contents);
    if (report.note.empty())
        report.note = result.note;
    return std::move(report);
}

Report crashLogs(const ServiceAddress&, const Words& words) {
    if (words["--output"] == "-")
        throw UsageError("Logs are copied into a directory, not to standard output");
    return collectCrashLogs(words["--output"]);
}

// A file for an offline reader, of whatever size, which lives as long as the reports that look into it. What digests
// need is set up before, while memory is plentiful.
const Value::Data& readJudgedFile(const std::string& path) {
    static Value::Data file;
    (void)crypto::prepare(); // a digest that cannot be computed says so itself
    return file = readLocalFile(path);
}

Report show(const ServiceAddress&, const Words& words) {
    const auto keyPath = words.find("--hmac-key-file");
    if (keyPath == "-" && words["FILE"] == "-")
        throw UsageError("The file and the key cannot both come from standard input");
    const auto key = keyPath ? std::optional(readLocalFile(*keyPath)) : std::nullopt;
    if (key && key->empty())
        throw UsageError("The key file is empty");
    return showFile(readJudgedFile(words["FILE"]), words["FORMAT"], key);
}

Report verify(const ServiceAddress&, const Words& words) {
    VerifyRequest request;
    const auto codeOf = [&words](const char* option) {
        const auto word = words.find(option);
        return word ? std::optional(fourCharacterCode(option, *word)) : std::nullopt;
    };
    request.object = codeOf("--object");
    request.payloadDigest = codeOf("--payload-digest");
    if (request.payloadDigest && !request.object)
        throw UsageError("--payload-digest requires --object");
    const auto folder = words.find("--trust-dir");
    const auto profile = words.find("--profile");
    const TrustDomain domain = folder ? readTrustDomain(*folder, profile) : builtInTrustDomain(profile);
    const Value::Data& file = readJudgedFile(words["FILE"]);
    return verifyImg4({file.data(), file.size()}, domain, request);
}

enum Number {
    One,
    MayBeLeftOut,
    Any
};

// An option, or an operand that is named by what stands for it.
struct Argument {
    const char* name;
    const char* says;
    const char* type = "";                 // of an option's value
    Number number = One;                   // of an operand
    std::vector<std::string> members = {}; // all that the operand can be
};

struct Verb {
    const char* name;
    const char* says;
    std::vector<Argument> arguments;
    std::function<Report(const ServiceAddress&, const Words&)> run;
};

const Argument url = {"URL", "The pairing server"};
const Argument localFile = {"FILE", "A local file, - for standard input"};

const Verb verbs[] = {
    {"call",
     "Send any request",
     {{"COMMAND", "The command's name"},
      {"ARGUMENT", "KEY=TEXT, KEY:=JSON ({\"$data\": \"hex\"} is data) or KEY@=FILE", "", Any}},
     call},
    {"provision",
     "Provision the secure face sensor with a pairing server",
     {url},
     request("corvoSCProv", "waftonUrl", "URL")},
    {"pair",
     "Pair the secure face sensor with a pairing server and load its firmware patch",
     {url},
     request("corvoSCPair", "waftonUrl", "URL")},
    {"check-entitlement", "Ask whether the boot ticket entitles the device to swapped parts", {}, checkEntitlement},
    {"get-tcrt",
     "Read the top module's certificate and its serial number",
     {{"-o,--output", "Write the certificate to this local file, - for standard output", "FILE"}},
     getTcrt},
    {"put-tcrt", "Authenticate the display and store the top module's certificate", {}, request("putTCRT")},
    {"set-bcfg",
     "Rewrite the \"WCh0\" and \"MiGB\" entries of a configuration blob",
     {{"DEVICE-FILE", "The blob, a path on the device"},
      {"-o,--output", "Copy the result, /tmp/new_bCfg on the device, to this local file, - for standard output",
       "FILE"}},
     rewriteBlob},
    {"export",
     "Export the identities of components to the Orlo store",
     {{"CLASS", "Data classes, such as tcrt; the plug-in's own list without any", "", Any}},
     exportClasses},
    {"put-psd2",
     "Put the secure face sensor's record into the Orlo store",
     {{"DEVICE-FILE", "The file with the record, a path on the device"}},
     request("putPSD2", "psd2DataPath", "DEVICE-FILE")},
    {"get-psd2",
     "Get the secure face sensor's record from the Orlo store",
     {{"DEVICE-FILE", "The file to write, a path on the device"}},
     request("getPSD2", "psd2V4DataPath", "DEVICE-FILE")},
    {"crash-logs",
     "List the device's crash and panic logs, offline",
     {{"-o,--output", "Copy them into this local directory", "DIRECTORY"}},
     crashLogs},
    {"show",
     "Show what a local file holds, without the service",
     {{"FORMAT",
       "bcfg: entries and HMAC state of a configuration blob; img4: properties and digests of a container, bare "
       "payload or bare manifest; der: the items as a tree, and where strict DER ends; found out unless given",
       "",
       MayBeLeftOut,
       {"bcfg", "img4", "der"}},
      localFile,
      {"--hmac-key-file", "Check a blob's HMACs with the key in this local file", "FILE"}},
     show},
    {"verify",
     "Say whether a local file is trusted, without the service",
     {{"FORMAT",
       "img4: the chain, the signature and the constraints of a container or bare manifest; found out unless given",
       "",
       MayBeLeftOut,
       {"img4"}},
      localFile,
      {"--profile", "The trust profile, such as kImg4DecodeSecureBootEc384Sha384; without it, the one that fits",
       "PROFILE"},
      {"--object", "Evaluate the object with this four-character code too", "CODE"},
      {"--payload-digest", "Compare the payload's digest with this property of --object's object, such as DGST",
       "CODE"},
      {"--trust-dir",
       "Take roots and names from this folder, which scripts/make-trust-domain has made, instead of those that are "
       "built in",
       "DIRECTORY"}},
     verify},
};

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
        app_.add_flag("--json", json_, "Print exactly one JSON object");
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
        json_ = std::find(argv, argv + argc, std::string_view("--json")) != argv + argc;
        try {
            app_.parse(argc, argv);
            return print(reportOfVerb());
        } catch (const CLI::Success& printed) {
            return app_.exit(printed);
        } catch (const CLI::ParseError& wrong) {
            const auto words = app_.remaining();
            const bool isUnknown = app_.get_subcommands().empty() && !words.empty();
            return print(wrongUsage((isUnknown ? "There is no verb \"" + words.front() + "\"" : wrong.what()) +
                                    " (orloctl --help says more)"));
        } catch (const std::exception& failure) {
            return print(wrongUsage(failure.what()));
        }
    }

private:
    void add(const Verb& verb) {
        CLI::App* const added = app_.add_subcommand(verb.name, verb.says);
        added->validate_positionals();
        for (const Argument& argument : verb.arguments) {
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
        if (json_ && copiesToOutput_)
            throw UsageError("--json and -o - both ask for standard output");
        address_.timeout = std::chrono::seconds(timeoutSeconds_);
        return std::ranges::find(verbs, given.get_name(), &Verb::name)->run(address_, Words(given));
    }

    static Report wrongUsage(const std::string& problem) {
        Report report;
        report.fail(problem, Outcome::Usage);
        return report;
    }

    // Its exit status is the report's.
    int print(const Report& report) const {
        if (json_)
            writeJson(std::cout, report);
        else {
            // A result that goes to standard output has it for itself.
            writeText(copiesToOutput_ ? std::cerr : std::cout, report);
            for (const std::string& sentence : {report.note, report.problem})
                if (!sentence.empty())
                    ::print(std::cerr, "orloctl: " + sentence);
        }
        return static_cast<int>(report.outcome);
    }

    CLI::App app_{"Sends requests to the Veltra Orlo services, and reads their file formats offline.", "orloctl"};
    ServiceAddress address_;
    long long timeoutSeconds_ = 600;
    bool json_ = false;
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
