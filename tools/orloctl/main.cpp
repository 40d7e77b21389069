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
#include "platform/Files.h"
#include "platform/Format.h"
#include "tools/orloctl/Arguments.h"
#include "tools/orloctl/Client.h"
#include "tools/orloctl/Completion.h"
#include "tools/orloctl/CrashLogReport.h"
#include "tools/orloctl/Json.h"
#include "tools/orloctl/LocalFiles.h"
#include "tools/orloctl/SetBcfg.h"
#include "tools/orloctl/ShowFile.h"
#include "tools/orloctl/VerifyImg4.h"
#include "tools/orloctl/Version.h"

namespace {

using nlohmann::ordered_json;

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

struct Options {
    ServiceAddress address;
    long long timeoutSeconds = 600;
    bool json = false;
    bool copiesToOutput = false; // -o -
};

void complain(const std::string& problem) {
    print(std::cerr, "orloctl: " + problem);
}

// Reports a failure that has no response: the one JSON object, or a sentence on standard error.
int fail(const Options& options, Outcome outcome, const std::string& problem) {
    const int status = static_cast<int>(outcome);
    if (options.json)
        writeJson(std::cout, {{"exitStatus", status}, {"problem", problem}});
    else
        complain(problem);
    return status;
}

void printResponse(std::ostream& out, const Value::Dictionary& dictionary) {
    const Value response(dictionary);
    const char* verdict = response["statusCode"].integer() == 0 ? "success" : "failure";
    print(out, formatForLog("%@: %s (status %@)", {response["name"], verdict, response["statusCode"]}));
    if (const Value::Dictionary* entries = response["response"].dictionary())
        for (const auto& [key, value] : *entries)
            print(out, formatForLog("  %@ = %s", {key, jsonFromValue(value).dump().c_str()}));
    const Value& error = response["error"];
    if (!error.isNothing())
        print(out, formatForLog("  error: %@ (%@ %@)", {error["description"], error["domain"], error["code"]}));
}

// What the client itself has to add to an answer.
struct Remarks {
    std::string result; // where the result is and how large
    std::string note;   // what the answer does not say and the user should know
};

int report(const Options& options, const Answer& answer, const Remarks& remarks = {}) {
    const int status = static_cast<int>(answer.outcome);
    if (options.json) {
        ordered_json json{{"exitStatus", status}};
        if (!answer.response.empty())
            json["response"] = jsonFromValue(answer.response);
        if (!answer.problem.empty())
            json["problem"] = answer.problem;
        if (!remarks.result.empty())
            json["result"] = remarks.result;
        if (!remarks.note.empty())
            json["note"] = remarks.note;
        writeJson(std::cout, json);
        return status;
    }
    if (answer.response.empty())
        return fail(options, answer.outcome, answer.problem);
    // A result that goes to standard output has it for itself.
    std::ostream& out = options.copiesToOutput ? std::cerr : std::cout;
    printResponse(out, answer.response);
    if (!remarks.result.empty())
        print(out, "  result: " + remarks.result);
    if (!remarks.note.empty())
        complain(remarks.note);
    if (!answer.problem.empty())
        complain(answer.problem);
    return status;
}

int send(const Options& options, const std::string& command, const Value::Dictionary& arguments) {
    return report(options, sendRequest(options.address, command, arguments));
}

int call(const Options& options, const std::string& command, const std::vector<std::string>& words) {
    return send(options, command, parseArguments(words));
}

int checkEntitlement(const Options& options) {
    const Answer answer = sendRequest(options.address, "checkCorvoPostSwapEntitlement", {});
    Remarks remarks;
    if (Value(answer.response)["response"]["IsPostSwapEntitled"] == Value(false))
        remarks.note = "The boot ticket does not hold the entitlement, or cannot be read. " + answer.reasons;
    return report(options, answer, remarks);
}

// Without classes the choice is the plug-in's.
int exportClasses(const Options& options, const std::vector<std::string>& classes) {
    Value::Dictionary arguments;
    if (!classes.empty())
        arguments["ExportList"] = Value::Array(classes.begin(), classes.end());
    return send(options, "OrloExport", arguments);
}

// Copies the request's result to a file and reports both: a copy that fails does not take the answer along.
int reportCopied(const Options& options, Answer answer, Remarks remarks, const std::string& copyPath,
                 const Value::Data& contents) {
    try {
        writeLocalFile(copyPath, contents);
    } catch (const UsageError& failure) {
        remarks.note = failure.what();
        answer.outcome = Outcome::Usage;
        answer.problem = "The request was carried out, but its result was not copied.";
    }
    return report(options, answer, remarks);
}

int getTcrt(const Options& options, const std::string& copyPath) {
    Answer answer = sendRequest(options.address, "getTCRT", {});
    if (answer.outcome != Outcome::Success)
        return report(options, answer);
    const Value response(answer.response);
    const std::string* text = response["response"]["CertData"].text();
    if (!text || text->empty()) {
        answer.outcome = Outcome::Failure;
        answer.problem = "The certificate in the hardware registry is empty.";
        return report(options, answer);
    }
    Remarks remarks;
    if (response["response"]["CertSerialNumber"] == Value("DummyCertificateSerialNumber"))
        remarks.note = "the serial number cannot be read: the hardware registry holds no certificate but other bytes";
    if (copyPath.empty())
        return report(options, answer, remarks);
    const Value::Data certificate = hexString2Binary(*text);
    remarks.result = copyPath + ", " + std::to_string(certificate.size()) + " bytes";
    return reportCopied(options, answer, remarks, copyPath, certificate);
}

int callServer(const Options& options, const char* command, const std::string& url) {
    return report(options, sendRequest(options.address, command, {{"waftonUrl", url}}));
}

int rewriteBlob(const Options& options, const std::string& devicePath, const std::string& copyPath) {
    const auto [answer, result] = setBcfg(options.address, devicePath);
    if (answer.outcome != Outcome::Success)
        return report(options, answer);
    const Remarks remarks = {std::string(blobResultPath) + " on the device, " + std::to_string(result.contents.size()) +
                                 " bytes",
                             result.note};
    return copyPath.empty() ? report(options, answer, remarks)
                            : reportCopied(options, answer, remarks, copyPath, result.contents);
}

// A file for an offline reader, of whatever size. What digests need is set up before, while memory is plentiful.
Value::Data readJudgedFile(const std::string& path) {
    (void)crypto::prepare(); // a digest that cannot be computed says so itself
    return readLocalFile(path);
}

int show(const Options& options, const Report& found, Outcome failure = Outcome::BadInput) {
    const int status = static_cast<int>(found.ok ? Outcome::Success : failure);
    if (options.json) {
        ordered_json json{{"exitStatus", status}};
        json.update(found.json);
        if (!found.ok)
            json["problem"] = found.problem;
        writeJson(std::cout, json, found.lists);
        return status;
    }
    if (!found.text.empty())
        print(std::cout, std::string_view(found.text).substr(0, found.text.size() - found.text.ends_with('\n')));
    if (!found.ok)
        complain(found.problem);
    return status;
}

struct VerifyOptions {
    std::optional<std::string> profile;
    std::optional<std::string> object;
    std::optional<std::string> payloadDigest;
    std::optional<std::string> trustFolder;
};

int verify(const Options& options, const std::string& path, const VerifyOptions& how) {
    VerifyRequest request;
    if (how.object)
        request.object = fourCharacterCode("--object", *how.object);
    if (how.payloadDigest)
        request.payloadDigest = fourCharacterCode("--payload-digest", *how.payloadDigest);
    const TrustDomain domain =
        how.trustFolder ? readTrustDomain(*how.trustFolder, how.profile) : builtInTrustDomain(how.profile);
    const Value::Data file = readJudgedFile(path);
    return show(options, verifyImg4({file.data(), file.size()}, domain, request));
}

int showLocalFile(const Options& options, const std::string& path, const std::string& kind,
                  const std::optional<std::string>& keyPath) {
    if (keyPath == "-" && path == "-")
        throw UsageError("The file and the key cannot both come from standard input");
    const auto key = keyPath ? std::optional(readLocalFile(*keyPath)) : std::nullopt;
    if (key && key->empty())
        throw UsageError("The key file is empty");
    const Value::Data file = readJudgedFile(path);
    return show(options, showFile(file, kind, key));
}

class CommandLine {
public:
    CommandLine() {
        app_.set_version_flag("--version", "orloctl " VELTRA_VERSION);
        app_.add_option("--bus", options_.address.bus, "\"system\", \"session\" or a D-Bus address")
            ->type_name("BUS")
            ->envname("VELTRA_BUS")
            ->capture_default_str();
        app_.add_option("--timeout", options_.timeoutSeconds, "Seconds to wait for an answer")
            ->type_name("SECONDS")
            ->check(CLI::Range(1LL, 1'000'000LL).description(""))
            ->capture_default_str();
        app_.add_flag("--json", options_.json, "Print exactly one JSON object");
        app_.require_subcommand(1);
        app_.fallthrough();
        app_.footer(exitStatuses);
        for (const char* label : {"TEXT", "REQUIRED"}) // the names and brackets of the usage line say enough
            app_.get_formatter()->label(label, "");
        addRequests();
        addRecords();
        addReaders();
        addVerifier();
    }

    int run(int argc, char** argv) {
        // For shells: the words after it are not the client's own.
        if (argc > 1 && argv[1] == std::string_view("--complete")) {
            printCompletions(app_, {argv + 2, argv + argc});
            return 0;
        }
        // A failure to parse the command line may come before the flag is read.
        options_.json = std::find(argv, argv + argc, std::string_view("--json")) != argv + argc;
        try {
            app_.parse(argc, argv);
            options_.address.timeout = std::chrono::seconds(options_.timeoutSeconds);
            options_.copiesToOutput = copyPath_ == "-";
            if (options_.json && options_.copiesToOutput)
                throw UsageError("--json and -o - both ask for standard output");
            return run_();
        } catch (const CLI::Success& printed) {
            return app_.exit(printed);
        } catch (const CLI::ParseError& wrong) {
            return fail(options_, Outcome::Usage, std::string(wrong.what()) + " (orloctl --help says more)");
        } catch (const std::exception& failure) {
            return fail(options_, Outcome::Usage, failure.what());
        }
    }

private:
    void addRequests() {
        CLI::App* verb = app_.add_subcommand("call", "Send any request");
        verb->add_option("COMMAND", command_, "The command's name")->required();
        verb->add_option("ARGUMENT", words_, "KEY=TEXT, KEY:=JSON ({\"$data\": \"hex\"} is data) or KEY@=FILE");
        verb->callback([this] { run_ = [this] { return call(options_, command_, words_); }; });

        addPairing("provision", "corvoSCProv", "Provision the secure face sensor with a pairing server");
        addPairing("pair", "corvoSCPair",
                   "Pair the secure face sensor with a pairing server and load its firmware patch");

        verb = app_.add_subcommand("check-entitlement",
                                   "Ask whether the boot ticket entitles the device to swapped parts");
        verb->callback([this] { run_ = [this] { return checkEntitlement(options_); }; });

        verb = app_.add_subcommand("get-tcrt", "Read the top module's certificate and its serial number");
        verb->add_option("-o,--output", copyPath_, "Write the certificate to this local file, - for standard output")
            ->type_name("FILE");
        verb->callback([this] { run_ = [this] { return getTcrt(options_, copyPath_); }; });

        verb = app_.add_subcommand("put-tcrt", "Authenticate the display and store the top module's certificate");
        verb->callback([this] { run_ = [this] { return call(options_, "putTCRT", {}); }; });

        verb = app_.add_subcommand("set-bcfg", "Rewrite the \"WCh0\" and \"MiGB\" entries of a configuration blob");
        verb->add_option("DEVICE-FILE", path_, "The blob, a path on the device")->required();
        verb->add_option("-o,--output", copyPath_,
                         "Copy the result, /tmp/new_bCfg on the device, to this local file, - for standard output")
            ->type_name("FILE");
        verb->callback([this] { run_ = [this] { return rewriteBlob(options_, path_, copyPath_); }; });
    }

    void addRecords() {
        CLI::App* verb = app_.add_subcommand("export", "Export the identities of components to the Orlo store");
        verb->add_option("CLASS", words_, "Data classes, such as tcrt; the plug-in's own list without any");
        verb->callback([this] { run_ = [this] { return exportClasses(options_, words_); }; });

        addFileRequest("put-psd2", "Put the secure face sensor's record into the Orlo store",
                       "The file with the record, a path on the device", "putPSD2", "psd2DataPath");
        addFileRequest("get-psd2", "Get the secure face sensor's record from the Orlo store",
                       "The file to write, a path on the device", "getPSD2", "psd2V4DataPath");
    }

    // A verb whose command takes one path.
    void addFileRequest(const char* name, const char* says, const char* saysOfFile, const char* command,
                        const char* key) {
        CLI::App* verb = app_.add_subcommand(name, says);
        verb->add_option("DEVICE-FILE", path_, saysOfFile)->required();
        verb->callback([this, command, key] {
            run_ = [this, command, key] { return send(options_, command, {{key, path_}}); };
        });
    }

    void addPairing(const char* name, const char* command, const char* purpose) {
        CLI::App* verb = app_.add_subcommand(name, purpose);
        verb->add_option("URL", url_, "The pairing server")->required();
        verb->callback([this, command] { run_ = [this, command] { return callServer(options_, command, url_); }; });
    }

    void addReaders() {
        CLI::App* crashLogs = app_.add_subcommand("crash-logs", "List the device's crash and panic logs, offline");
        crashLogs->add_option("-o,--output", copyPath_, "Copy them into this local directory")
            ->type_name("DIRECTORY")
            ->check([](const std::string& path) {
                return std::string(path == "-" ? "Logs are copied into a directory, not to standard output" : "");
            });
        crashLogs->callback(
            [this] { run_ = [this] { return show(options_, collectCrashLogs(copyPath_), Outcome::Usage); }; });

        CLI::App* verb = app_.add_subcommand("show", "Show what a local file holds, without the service");
        verb->validate_positionals();
        verb->add_option("FORMAT", format_,
                         "bcfg: entries and HMAC state of a configuration blob; img4: properties and digests of a "
                         "container, bare payload or bare manifest; der: the items as a tree, and where strict DER "
                         "ends; found out unless given")
            ->check(CLI::IsMember({"bcfg", "img4", "der"}));
        addLocalFile(verb);
        const CLI::Option* key =
            verb->add_option("--hmac-key-file", keyPath_, "Check a blob's HMACs with the key in this local file")
                ->type_name("FILE");
        verb->callback([this, key] {
            run_ = [this, isKeyed = key->count() > 0] {
                return showLocalFile(options_, path_, format_, isKeyed ? std::optional(keyPath_) : std::nullopt);
            };
        });
    }

    void addVerifier() {
        CLI::App* verb = app_.add_subcommand("verify", "Say whether a local file is trusted, without the service");
        verb->validate_positionals();
        verb->add_option("FORMAT", format_,
                         "img4: the chain, the signature and the constraints of a container or bare manifest; found "
                         "out unless given")
            ->check(CLI::IsMember({"img4"}));
        addLocalFile(verb);
        verb->add_option("--profile", verifyOptions_.profile,
                         "The trust profile, such as kImg4DecodeSecureBootEc384Sha384; without it, the one that fits")
            ->type_name("PROFILE");
        CLI::Option* object = verb->add_option("--object", verifyOptions_.object,
                                               "Evaluate the object with this four-character code too");
        object->type_name("CODE");
        verb->add_option("--payload-digest", verifyOptions_.payloadDigest,
                         "Compare the payload's digest with this property of the object, such as DGST")
            ->needs(object)
            ->type_name("CODE");
        verb->add_option("--trust-dir", verifyOptions_.trustFolder,
                         "Take roots and names from this folder, which scripts/make-trust-domain has made, instead of "
                         "those that are built in")
            ->type_name("DIRECTORY");
        verb->callback([this] { run_ = [this] { return verify(options_, path_, verifyOptions_); }; });
    }

    void addLocalFile(CLI::App* verb) {
        verb->add_option("FILE", path_, "A local file, - for standard input")->required();
    }

    CLI::App app_{"Sends requests to the Veltra Orlo services, and reads their file formats offline.", "orloctl"};
    Options options_;
    std::string command_;
    std::string format_;
    std::string path_;
    std::string copyPath_;
    std::string keyPath_;
    std::string url_;
    VerifyOptions verifyOptions_;
    std::vector<std::string> words_;
    std::function<int()> run_;
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
