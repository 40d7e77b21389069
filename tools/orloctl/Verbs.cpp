#include "tools/orloctl/Verbs.h"

#include <charconv>
#include <cstdlib>
#include <iostream>
#include <set>
#include <utility>

#include "Daemon/Conversions.h"
#include "platform/Crypto.h"
#include "platform/DataClasses.h"
#include "platform/DeviceRoot.h"
#include "tools/orloctl/Arguments.h"
#include "tools/orloctl/CrashLogReport.h"
#include "tools/orloctl/DeviceCheck.h"
#include "tools/orloctl/Interruption.h"
#include "tools/orloctl/LocalFiles.h"
#include "tools/orloctl/LogTail.h"
#include "tools/orloctl/PassedFile.h"
#include "tools/orloctl/SetBcfg.h"
#include "tools/orloctl/ShowFile.h"
#include "tools/orloctl/VerifyImg4.h"

namespace {

std::string placeOf(const std::string& path, const Value::Data& contents) {
    return path + ", " + std::to_string(contents.size()) + " bytes";
}

// Copies a result to the file that -o names, if any. A copy that fails does not take the answer along.
void copyResult(Report& report, const Words& words, const Value::Data& result) {
    const auto path = words.find("--output");
    if (!path)
        return;
    try {
        writeLocalFile(*path, result);
        report.json["result"] = placeOf(*path, result);
    } catch (const UsageError& failure) {
        report.note = failure.what();
        report.fail("The request was carried out, but its result was not copied.", Outcome::Usage);
    }
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
    const std::set<std::string> different(classes.begin(), classes.end());
    Value::Dictionary arguments;
    if (!classes.empty())
        arguments["ExportList"] = Value::Array(classes.begin(), classes.end());
    Report report = sendRequest(address, "OrloExport", arguments).report;
    if (report.ok() && !classes.empty())
        report.json["result"] =
            std::to_string(different.size()) + (different.size() == 1 ? " class" : " classes") + " exported";
    return report;
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
    if (report.note.empty() && response["response"]["CertSerialNumber"] == Value("DummyCertificateSerialNumber"))
        report.note = "the serial number cannot be read: the hardware registry holds no certificate but other bytes";
    return std::move(report);
}

// The operand or the option, of which just one has to be given.
void takeOneOf(const Words& words, const char* operand, const char* option) {
    if (words.has(operand) == words.has(option))
        throw UsageError(std::string("Either ") + operand + " or " + option + " has to be given");
}

// What the service says of itself, with a note when its device is not the one that this client sees.
Report statusOfService(const ServiceAddress& address) {
    Report report = askStatus(address);
    const std::string own = deviceRootPath();
    if (report.ok() && report.json.value("deviceRoot", own) != own)
        report.note = "The device root of the service is not the one of this client, " + own;
    return report;
}

Report putPsd2(const ServiceAddress& address, const Words& words) {
    takeOneOf(words, "DEVICE-FILE", "--local");
    if (!words.has("--local"))
        return request("putPSD2", "psd2DataPath", "DEVICE-FILE")(address, words);
    const Value::Data record = readLocalFile(words["--local"]);
    const Interruption interruption; // leaves no record behind
    const PassedFile passed;
    passed.write(record);
    Report report = sendRequest(address, "putPSD2", {{"psd2DataPath", passed.path()}}).report;
    if (report.ok())
        report.json["result"] = placeOf(words["--local"], record);
    else if (report.outcome == Outcome::Failure)
        report.note = statusOfService(address).note;
    return report;
}

Report getPsd2(const ServiceAddress& address, const Words& words) {
    takeOneOf(words, "DEVICE-FILE", "--output");
    if (!words.has("--output"))
        return request("getPSD2", "psd2V4DataPath", "DEVICE-FILE")(address, words);
    const Interruption interruption; // leaves no record behind
    const PassedFile passed;
    Report report = sendRequest(address, "getPSD2", {{"psd2V4DataPath", passed.path()}}).report;
    const auto record = report.ok() ? passed.read() : std::nullopt;
    if (record)
        copyResult(report, words, *record);
    else if (report.ok())
        report.fail("The record, " + passed.path() + " on the device, cannot be read.", Outcome::Failure);
    if (!record && report.outcome == Outcome::Failure)
        report.note = statusOfService(address).note;
    return report;
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

// The description is looked at below the device root that the service has.
Report showStatus(const ServiceAddress& address, const Words&) {
    Report report = statusOfService(address);
    if (!report.ok())
        return report;
    ::setenv("VELTRA_DEVICE_ROOT", report.json.value("deviceRoot", deviceRootPath()).c_str(), 1);
    try {
        const Report description = checkDevice("");
        report.json["description"] = description.ok() ? "sound" : description.json["faults"];
    } catch (const UsageError& failure) {
        report.json["description"] = failure.what();
    }
    return report;
}

Report showLog(const ServiceAddress& address, const Words& words) {
    const std::string count = words.find("--lines").value_or("10");
    std::size_t lines = 0;
    const auto [end, problem] = std::from_chars(count.data(), count.data() + count.size(), lines);
    if (problem != std::errc() || end != count.data() + count.size())
        throw UsageError("\"" + count + "\" is no number of lines");
    if (address.json && words.has("--follow"))
        throw UsageError("What is followed has no end that one JSON object could have");
    Report report;
    if (address.json)
        report.json["lines"] = nlohmann::ordered_json::array();
    readLog(lines, words.has("--follow"), [&](std::string_view line) {
        if (address.json)
            report.json["lines"].push_back(line);
        else
            print(std::cout, line);
        std::cout.flush();
        return std::cout.good();
    });
    return report;
}

Report checkDescription(const ServiceAddress&, const Words& words) {
    return checkDevice(words["FILE"]);
}

Report listClasses(const ServiceAddress&, const Words&) {
    Report report;
    for (const DataClass& dataClass : dataClasses)
        report.json["classes"].push_back({{"class", dataClass.name}, {"instance", dataClass.composition()}});
    return report;
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
    const TrustDomain domain = trustDomain(words.find("--trust-dir"), words.find("--profile"));
    const Value::Data& file = readJudgedFile(words["FILE"]);
    return verifyImg4({file.data(), file.size()}, domain, request);
}

} // namespace

const Argument url = {"URL", "The pairing server"};
const Argument localFile = {"FILE", "A local file, - for standard input"};

const std::vector<Verb> verbs = {
    {"call",
     nullptr,
     "Send any request",
     {{"COMMAND", "The command's name"},
      {"ARGUMENT", "KEY=TEXT, KEY:=JSON ({\"$data\": \"hex\"} is data) or KEY@=FILE", "", Any}},
     call},
    {"provision",
     "corvoSCProv",
     "Provision the secure face sensor with a pairing server",
     {url},
     request("corvoSCProv", "waftonUrl", "URL")},
    {"pair",
     "corvoSCPair",
     "Pair the secure face sensor with a pairing server and load its firmware patch",
     {url},
     request("corvoSCPair", "waftonUrl", "URL")},
    {"check-entitlement",
     "checkCorvoPostSwapEntitlement",
     "Ask whether the boot ticket entitles the device to swapped parts",
     {},
     checkEntitlement},
    {"get-tcrt",
     "getTCRT",
     "Read the top module's certificate and its serial number",
     {{"-o,--output", "Write the certificate to this local file, - for standard output", "FILE"}},
     getTcrt},
    {"put-tcrt", "putTCRT", "Authenticate the display and store the top module's certificate", {}, request("putTCRT")},
    {"set-bcfg",
     "setGlobalbCfg",
     "Rewrite the \"WCh0\" and \"MiGB\" entries of a configuration blob",
     {{"DEVICE-FILE", "The blob, a path on the device"},
      {"-o,--output", "Copy the result, /tmp/new_bCfg on the device, to this local file, - for standard output",
       "FILE"}},
     rewriteBlob},
    {"export",
     "OrloExport",
     "Export the identities of components to the Orlo store",
     {{"CLASS", "Data classes, such as tcrt; the plug-in's own list without any", "", Any}},
     exportClasses},
    {"put-psd2",
     "putPSD2",
     "Put the secure face sensor's record into the Orlo store",
     {{"DEVICE-FILE", "The file with the record, a path on the device", "", MayBeLeftOut},
      {"--local", "Put the contents of this local file instead, - for standard input", "FILE"}},
     putPsd2},
    {"get-psd2",
     "getPSD2",
     "Get the secure face sensor's record from the Orlo store",
     {{"DEVICE-FILE", "The file to write, a path on the device", "", MayBeLeftOut},
      {"-o,--output", "Write this local file instead, - for standard output", "FILE"}},
     getPsd2},
    {"status", nullptr, "Say whether the service runs and what it does, without starting it", {}, showStatus},
    {"log",
     nullptr,
     "Print the end of the service's log",
     {{"-n,--lines", "So many lines; 10 unless given", "NUMBER"},
      {"-f,--follow", "Go on with those that are added, until it is interrupted"}},
     showLog},
    {"crash-logs",
     nullptr,
     "List the device's crash and panic logs, offline",
     {{"-o,--output", "Copy them into this local directory", "DIRECTORY"}},
     crashLogs},
    {"check-device",
     nullptr,
     "Say what is wrong with a description of the device, offline",
     {{"FILE", "A local file, - for standard input; /etc/veltra/device.json on the device without it", "",
       MayBeLeftOut}},
     checkDescription},
    {"list-classes", nullptr, "List the data classes, and what the instance of each is made of", {}, listClasses},
    {"show",
     nullptr,
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
     nullptr,
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
