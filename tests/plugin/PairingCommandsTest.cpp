#include <algorithm>
#include <filesystem>
#include <functional>
#include <limits>
#include <string>
#include <string_view>
#include <vector>

#include <gtest/gtest.h>
#include <sys/resource.h>

#include "platform/Format.h"
#include "plugin/ZPOrloServices.h"
#include "tests/platform/ServicesDouble.h"
#include "tests/support/OwnProcess.h"
#include "tests/support/RecordedLog.h"
#include "tests/support/TemporaryRoot.h"

namespace {

namespace fs = std::filesystem;

using Lines = std::vector<std::string>;

constexpr const char* url = "https://server.example/corvo";
constexpr const char* patchPath = "/var/mobile/Vanter.BE-Prod.fw";
constexpr const char* calibration = "/usr/local/bin/q21isp";

const Error failure{"VanterDomain", 9, "broken"};
const Value ticket = Value::Data{'t', 'i', 'c', 'k'};
const Value digest = Value::Data{0xAB, 0x0C};
const Value information = Value::Dictionary{{"Digest", digest}};
const Value nextOutput = Value::Dictionary{{"Stage", 1}};
const Value innerOptions = Value::Dictionary{{"WaftonPairingOption", true},
                                             {"PersonalizedFirmwareRootPath", "/usr/local/share/firmware/isp/"},
                                             {"RestoreSystemPartition", "/private/var/mobile/"},
                                             {"RestoreInternal", true}};

class PairingCommands : public testing::Test {
protected:
    PairingCommands() { arrange(); }

    // A device and services on which every step succeeds.
    void arrange() {
        servicesDouble() = {};
        servicesDouble().reverseProxy.events = {{1}};
        servicesDouble().reverseProxy.proxy = proxy_;
        servicesDouble().pairing.tickets = {{"tick"}};
        servicesDouble().updater.queryInfo.output = information;
        servicesDouble().updater.performNextStage.output = nextOutput;
        root_.write(patchPath, "patch");
        root_.write(calibration, "#!/bin/sh\necho loaded \"$@\"\n");
        fs::permissions(root_.host(calibration), fs::perms::owner_all);
    }

    // The response to a request, which is completed exactly once.
    HSMessageResponse request(const char* command, const Value& messageDict) {
        recordLog();
        ZPOrloServices server;
        std::vector<HSMessageResponse> responses;
        server.handleMessage({command, messageDict}, [&](bool completed, const auto& response) {
            EXPECT_TRUE(completed);
            responses.push_back(response.value());
        });
        EXPECT_EQ(responses.size(), 1U);
        EXPECT_EQ(responses.front().name(), Value(command));
        EXPECT_TRUE(responses.front().response().isNothing());
        return responses.front();
    }

    HSMessageResponse pair() { return request("corvoSCPair", Value::Dictionary{{"waftonUrl", url}}); }

    // The lines behind the first with `text`, without those of the program's execution.
    static Lines linesBehind(std::string_view text) {
        const Lines all = recordedLog();
        auto first = std::ranges::find_if(all, [&](const auto& line) { return line.find(text) != std::string::npos; });
        Lines lines(first == all.end() ? first : first + 1, all.end());
        std::erase_if(lines, [](const auto& line) { return line.find("[HSPipeUtil]") != std::string::npos; });
        return lines;
    }

    static bool called(std::string_view call) {
        return std::ranges::find(servicesDouble().calls, call) != servicesDouble().calls.end();
    }

    const Value proxy_ = Value::Dictionary{{"HTTPSEnable", 1}};
    TemporaryRoot root_;
};

TEST_F(PairingCommands, theLibraryGetsTheURLAndTheProxyAndDecides) {
    const struct {
        const char* command;
        const char* operation;
        const char* purpose;
    } commands[] = {{"corvoSCProv", "BWCProvisionCorvoWithProxy", "provisioning"},
                    {"corvoSCPair", "BWCPairCorvoWithProxy", "pairing"}};
    const struct {
        bool result;
        std::optional<Error> error;
        Value proxy;
    } rows[] = {{true, {}, proxy_}, {true, {}, {}}, {false, failure, proxy_}, {false, {}, {}}};
    for (const auto& command : commands) {
        for (const auto& row : rows) {
            arrange();
            servicesDouble().reverseProxy.proxy = row.proxy;
            servicesDouble().pairing = {.result = row.result, .error = row.error};
            const HSMessageResponse response = request(command.command, Value::Dictionary{{"waftonUrl", url}});
            EXPECT_EQ(response.statusCode(), row.result ? 0 : -1);
            EXPECT_EQ(response.error(), row.error);
            EXPECT_TRUE(called(format("%s %s %@", command.operation, url, row.proxy)));
            EXPECT_TRUE(called("RPCopyProxyDictionaryWithOptions " + std::string(url) + " " +
                               Value(Value::Dictionary{{"TestReachability", false}}).description()));

            Lines lines = linesBehind("Received " + std::string(command.command));
            std::erase_if(lines, [](const auto& line) { return line.find("[ZPDevice]") != std::string::npos; });
            const std::string source = " [ZPOrloServices] ";
            EXPECT_EQ(lines, (Lines{format("2%sURL for %s: %s", source, command.purpose, url),
                                    format("2%sSetting up reverse proxy", source),
                                    format("2%sCalling the %s", source, command.purpose),
                                    row.result ? format("2%sCorvo SC %s passed.", source, command.purpose)
                                               : format("4%sCorvo SC %s failed!!!", source, command.purpose)}));
        }
    }
}

TEST_F(PairingCommands, whatIsNoURLIsRefusedBeforeAnythingIsAsked) {
    for (const char* command : {"corvoSCProv", "corvoSCPair"}) {
        for (const Value& argument : {Value(), Value(7), Value(""), Value("http://a b"), Value("1http://a"),
                                      Value("http://a/%zz"), Value("line\nbreak"), Value("http://user:secret@a b")}) {
            arrange();
            const HSMessageResponse response =
                request(command, argument.isNothing() ? Value() : Value(Value::Dictionary{{"waftonUrl", argument}}));
            EXPECT_EQ(response.statusCode(), -1);
            const std::string shown = argument.text() ? *argument.text() : "(null)";
            EXPECT_EQ(response.error(), (Error{"CorvoSCErrorDomain", 500, "Wafton URL not a valid URL:" + shown}));
            EXPECT_EQ(recordedLog().back(), "4 [ZPOrloServices] Wafton URL not a valid URL");
            for (const std::string& line : recordedLog())
                EXPECT_EQ(line.find("secret"), std::string::npos) << line;
            EXPECT_EQ(servicesDouble().calls, Lines{"KACopyAnswerWithError HWModelStr"});
        }
    }
}

// The lines of a load up to a step, each list with what the step adds.
const Lines begun{"1 Inside Loadpatch"};

Lines operator+(Lines lines, const Lines& more) {
    lines.insert(lines.end(), more.begin(), more.end());
    return lines;
}

const std::string broken = failure.description();
const Lines optionsMade =
    begun + Lines{"4 updaterOptions created successfully", "4 value of ticket is:" + ticket.description(),
                  "4 [ZPOrloServices] added ticket", "2 [ZPOrloServices] first: second"};
const Lines created = optionsMade + Lines{"1 Created the Vanter Updater"};
const Lines informed =
    created + Lines{"1 Device Info Dict is " + information.description(),
                    "1 extracted patch digest:" + digest.description(), "1 extracted patch digest string:ab0c"};
const Lines patchFound = informed + Lines{"1 Patch found successfully"};
const Lines succeeded{"1 loadVanterPatch success.", "2 [ZPOrloServices] Output: loaded -ns /tmp/q21_isp_load.txt\n"};
const Lines failed{"4 loadVanterPatch fail. Error: " + broken};
const std::string commandFailed = "4 VanterUpdaterExecCommand failed:";

struct Step {
    const char* name;
    std::function<void(ServicesDouble&, const TemporaryRoot&)> arrange;
    Lines lines;
    bool released = true; // an updater that was created
};

const Step steps[] = {
    {"all succeed", [](auto&, auto&) {}, patchFound + Lines{"1 Vanter Firmware Update Successful"} + succeeded},
    {"no memory for the ticket",
     [](auto& services, auto&) {
         services.pairing.tickets = {{"t", std::numeric_limits<std::size_t>::max()}};
     },
     begun + Lines{"4 updaterOptions failed to allocate"} + succeeded, false},
    {"an empty ticket", [](auto& services, auto&) { services.pairing.tickets = {{""}}; },
     begun +
         Lines{"4 updaterOptions created successfully", "4 value of ticket is:" + Value(Value::Data{}).description(),
               "2 [ZPOrloServices] first: second"} +
         Lines(patchFound.begin() + static_cast<std::ptrdiff_t>(optionsMade.size()), patchFound.end()) +
         Lines{"1 Vanter Firmware Update Successful"} + succeeded},
    {"no updater and an Error",
     [](auto& services, auto&) {
         services.updater.create = {false, {}, failure};
     },
     optionsMade + Lines{"4 [ZPOrloServices] Failed to create Vanter obj::error:" + broken} + failed, false},
    {"no updater and no Error", [](auto& services, auto&) { services.updater.create = {false}; },
     optionsMade + Lines{"4 [ZPOrloServices] Failed to create Vanter obj::error:(null)"} + succeeded, false},
    {"an updater and an Error",
     [](auto& services, auto&) {
         services.updater.create = {true, {}, failure};
     },
     optionsMade + Lines{"4 [ZPOrloServices] Failed to create Vanter obj::error:" + broken} + failed},
    {"done", [](auto& services, auto&) { services.updater.isDone = {true}; }, created + succeeded},
    {"done, with an Error",
     [](auto& services, auto&) {
         services.updater.isDone = {true, {}, failure};
     },
     created + succeeded},
    {"not to be told whether done",
     [](auto& services, auto&) {
         services.updater.isDone = {false, {}, failure};
     },
     created + Lines{commandFailed + broken} + failed},
    {"queryInfo fails",
     [](auto& services, auto&) {
         services.updater.queryInfo = {false, {}, failure};
     },
     created + Lines{commandFailed + broken} + failed},
    {"queryInfo fails without Error", [](auto& services, auto&) { services.updater.queryInfo = {false}; },
     created + Lines{commandFailed + "(null)"} + succeeded},
    {"queryInfo reports an Error", [](auto& services, auto&) { services.updater.queryInfo.error = failure; },
     created + Lines{commandFailed + broken} + failed},
    {"no device information", [](auto& services, auto&) { services.updater.queryInfo.output = {}; },
     created + Lines{"1 Device Info Dict is (null)", "4 empty DGST"} + succeeded},
    {"no digest", [](auto& services, auto&) { services.updater.queryInfo.output = Value::Dictionary{}; },
     created +
         Lines{"1 Device Info Dict is " + Value(Value::Dictionary{}).description(), "1 extracted patch digest:(null)",
               "1 extracted patch digest string:(null)", "1 Patch found successfully",
               "1 Vanter Firmware Update Successful"} +
         succeeded},
    {"no patch", [](auto&, const TemporaryRoot& root) { fs::remove(root.host(patchPath)); },
     informed + Lines{"1 Files not found"} + succeeded},
    {"an empty patch", [](auto&, const TemporaryRoot& root) { root.write(patchPath, ""); },
     informed + Lines{"1 Files not found"} + succeeded},
    {"performNextStage fails",
     [](auto& services, auto&) {
         services.updater.performNextStage = {false, nextOutput, failure};
     },
     patchFound + Lines{"4 VanterUpdaterExecCommand failed: " + broken + ":" + nextOutput.description()} + failed},
    {"performNextStage fails without Error", [](auto& services, auto&) { services.updater.performNextStage = {false}; },
     patchFound + Lines{"4 VanterUpdaterExecCommand failed: (null):(null)"} + succeeded},
    {"performNextStage reports an Error",
     [](auto& services, auto&) { services.updater.performNextStage.error = failure; },
     patchFound + Lines{"4 VanterUpdaterExecCommand failed: " + broken + ":" + nextOutput.description()} + failed},
};

TEST_F(PairingCommands, onlyAnErrorOfTheUpdaterMakesTheLoadFail) {
    for (const Step& step : steps) {
        SCOPED_TRACE(step.name);
        arrange();
        step.arrange(servicesDouble(), root_);
        EXPECT_EQ(pair().statusCode(), 0); // the library decides, and the double is content
        Lines lines = linesBehind("Calling the pairing");
        ASSERT_FALSE(lines.empty());
        EXPECT_EQ(lines.back(), "2 [ZPOrloServices] Corvo SC pairing passed.");
        lines.pop_back();
        EXPECT_EQ(lines, step.lines);

        const bool success = step.lines.back() == succeeded.back();
        EXPECT_EQ(servicesDouble().pairing.loadResults, std::vector<std::int32_t>{success ? 0 : -1});
        const Lines& calls = servicesDouble().calls;
        EXPECT_EQ(std::ranges::count(calls, "VanterUpdaterRelease"), step.released ? 1 : 0);
        EXPECT_EQ(std::ranges::count(calls, "pauseFor 10000"), success ? 1 : 0);
        EXPECT_TRUE(!success || calls.back() == "pauseFor 10000");
    }
}

TEST_F(PairingCommands, theUpdaterGetsTheTicketTheOptionsAndThePatch) {
    pair();
    Value::Dictionary expected{{"Vanter,Ticket", ticket}, {"Options", innerOptions}};
    EXPECT_EQ(servicesDouble().updater.createOptions, Value(expected));
    expected["FirmwareData"] = Value::Data{'p', 'a', 't', 'c', 'h'};
    EXPECT_EQ(servicesDouble().updater.nextStageOptions, Value(expected));

    arrange();
    servicesDouble().pairing.tickets = {{""}, {"tick"}};
    pair();
    EXPECT_EQ(servicesDouble().pairing.loadResults, (std::vector<std::int32_t>{0, 0}));
    EXPECT_EQ(std::ranges::count(servicesDouble().calls, "pauseFor 10000"), 2);
    servicesDouble().pairing.tickets = {{""}};
    pair();
    EXPECT_EQ(servicesDouble().updater.createOptions, Value(Value::Dictionary{{"Options", innerOptions}}));
}

#ifdef VELTRA_MEMORY_CAN_BE_LIMITED
TEST_F(PairingCommands, theTicketIsCopiedOnceAndALackOfMemoryForItIsNoFailure) {
    constexpr std::size_t size = std::size_t{64} << 20;
    servicesDouble().pairing.tickets = {{std::string(size, 't')}};
    servicesDouble().updater.isDone = {true};
    const struct {
        std::size_t memory;
        bool created;
    } rows[] = {{size * 5 / 2, true}, {size / 2, false}}; // the double keeps a copy of its own
    for (const auto& row : rows) {
        inOwnProcess([&] {
            limitMemory(row.memory);
            EXPECT_EQ(pair().statusCode(), 0);
            EXPECT_EQ(servicesDouble().pairing.loadResults, std::vector<std::int32_t>{0});
            EXPECT_EQ(called("VanterUpdaterCreate Vanter"), row.created);
            EXPECT_EQ(linesBehind("updaterOptions failed to allocate").empty(), row.created);
        });
    }
}

TEST_F(PairingCommands, muchOutputOfTheCalibrationLoadTakesTwiceItsMemory) {
    constexpr long kilobytes = 16 << 10;
    root_.write(calibration, "#!/bin/sh\nexec head -c 16777216 /dev/zero | tr '\\0' x");
    inOwnProcess([&] {
        recordLog();
        rusage before = {}, after = {};
        ASSERT_EQ(::getrusage(RUSAGE_SELF, &before), 0);
        ZPOrloServices::q21isp_loadDAT();
        ASSERT_EQ(::getrusage(RUSAGE_SELF, &after), 0);
        EXPECT_LT(after.ru_maxrss - before.ru_maxrss, 2 * kilobytes + kilobytes / 4);
        EXPECT_GT(after.ru_maxrss - before.ru_maxrss, kilobytes);
        EXPECT_TRUE(recordedLog().back().ends_with("x... (16777216 bytes)"));
    });
}

#endif

TEST_F(PairingCommands, theCalibrationLoadOnlyLogs) {
    const struct {
        const char* script; // null: there is no program
        const char* output;
    } rows[] = {{nullptr, ""}, {"echo out; echo err >&2; exit 3", "out\nerr\n"}, {"printf half; kill -9 $$", "half"}};
    for (const auto& row : rows) {
        fs::remove(root_.host(calibration));
        if (row.script) {
            root_.write(calibration, std::string("#!/bin/sh\n") + row.script);
            fs::permissions(root_.host(calibration), fs::perms::owner_all);
        }
        recordLog();
        ZPOrloServices::q21isp_loadDAT();
        EXPECT_EQ(recordedLog().back(), "2 [ZPOrloServices] Output: " + std::string(row.output));
        const bool reported = std::ranges::any_of(recordedLog(), [](const auto& line) {
            return line.starts_with("2 [HSPipeUtil] posix_spawn /usr/local/bin/q21isp failed: ");
        });
        EXPECT_EQ(reported, !row.script);
    }
}

} // namespace
