// The commands that move records: their own lines, with their levels, and their responses.
#include <algorithm>
#include <csignal>
#include <string>
#include <string_view>
#include <vector>

#include <gtest/gtest.h>
#include <sys/resource.h>

#include "plugin/ZPOrloServices.h"
#include "tests/platform/DataStoreDouble.h"
#include "tests/platform/ServicesDouble.h"
#include "tests/support/FailingAllocation.h"
#include "tests/support/OwnProcess.h"
#include "tests/support/RecordedLog.h"
#include "tests/support/TemporaryRoot.h"
#include "tests/sysconfig/Blob.h"

namespace {

using Lines = std::vector<std::string>;

constexpr std::string_view source = " [ZPOrloServices] ";
constexpr const char* relay = "TeskAuthI2CRelayInterface";

const Error storeError{"QDOrloErrorDomain", 5, "the disk is full"};
const Value::Data certificate = {0x30, 0x00};

class RecordCommands : public testing::Test {
protected:
    RecordCommands() { arrange(); }

    // A device, a store and files with which every command succeeds.
    void arrange() {
        servicesDouble() = {};
        servicesDouble().answers = {{"HWModelStr", "M12x"},
                                    {"VanterSerialNumber", "VAN"},
                                    {"CoverGlassSNKey", "CVG"},
                                    {"ScreenSerialNumber", "SCR"},
                                    {"TopModuleAuthChipID", "TMA"},
                                    {"MiravelSNKey", "MIR"},
                                    {"ALSSNKey", "ALS"}};
        servicesDouble().registry[relay]["AccessoryCertificate"] = certificate;
        dataStoreDouble() = {};
        dataStoreDouble().record = Value::Data{'r'};
        root_.write("/ticket", "ticket");
        root_.write("/psd2", "record");
        root_.makeDirectory("/folder");
    }

    static HSMessageResponse request(const char* command, const Value& messageDict) {
        recordLog();
        ZPOrloServices server;
        std::vector<HSMessageResponse> responses;
        server.handleMessage({command, messageDict},
                             [&](bool, const auto& response) { responses.push_back(response.value()); });
        EXPECT_EQ(responses.size(), 1U);
        return responses.front();
    }

    // The command's own lines as "<level> <message>"; the four before them are those of every request.
    static Lines lines() {
        Lines own;
        for (const std::string& line : recordedLog())
            if (line.compare(1, source.size(), source) == 0)
                own.push_back(line.substr(0, 2) + line.substr(1 + source.size()));
        own.erase(own.begin(), own.begin() + std::min<std::ptrdiff_t>(4, std::ssize(own)));
        for (std::string& line : own)
            if (const std::size_t at = line.find(" - Received "); at != std::string::npos)
                line.erase(2, at + 1);
        return own;
    }

    TemporaryRoot root_;
};

const Value::Dictionary paths = {{"psd2DataPath", "/psd2"}, {"psd2V4DataPath", "/out"}};

Value reason(const char* key, const char* text) {
    return Value::Dictionary{{key, text}};
}

Value exportOf(const char* dataClass) {
    return Value::Dictionary{{"ExportList", Value::Array{dataClass}}};
}

struct Row {
    const char* command;
    std::function<void()> arrange;
    Value messageDict;
    Lines lines;
    std::int64_t status;
    Value response;
    std::optional<Error> error;
};

const std::vector<Row> rows = {
    {"putPSD2",
     [] {},
     paths,
     {"2 Received putPSD2", "2 psd2- : VAN", "2 psd2 data: <7265636f7264>", "2 psd2 put was successful"},
     0,
     {},
     {}},
    {"putPSD2", [] {}, {}, {"2 Received putPSD2"}, -1, reason("psd2 put error", "psd2 path in request is wrong"), {}},
    {"putPSD2",
     [] {},
     Value::Dictionary{{"psd2DataPath", "/folder"}},
     {"2 Received putPSD2"},
     -1,
     reason("psd2 put error", "psd2 data not found in request"),
     {}},
    {"putPSD2",
     [] {
         servicesDouble().answers.erase("VanterSerialNumber");
         dataStoreDouble().puts = false;
     },
     paths,
     {"2 Received putPSD2", "2 psd2- : (null)", "2 psd2 data: <7265636f7264>", "2 psd2 put returned an error"},
     -1,
     reason("psd2 put error", "Could not put in Orlo"),
     Error{"Orlo Error Domain", 1011, "Unable to upload data error"}},

    {"getPSD2",
     [] {},
     paths,
     {"2 Received getPSD2", "2 psd2 instance : VAN", "2 psd2 get was successful", "2 psd2 data successfully writen"},
     0,
     {},
     {}},
    {"getPSD2",
     [] {},
     {},
     {"2 Received getPSD2", "2 psd2 instance : VAN", "2 psd2 get was successful", "2 Failed to open psd2 file handler"},
     -1,
     {},
     {}},
    {"getPSD2",
     [] {
         dataStoreDouble().record = {};
         dataStoreDouble().getError = storeError;
     },
     paths,
     {"2 Received getPSD2", "2 psd2 instance : VAN", "2 psd2 get returned an error"},
     -1,
     reason("psd2 get error", "Could not get from Orlo"),
     storeError},

    {"OrloExport",
     [] {},
     {},
     {"2 Adding ExportList for overlays before M8xM9y",
      "2 Export Dict : " + Value(Value::Dictionary{{"CtCl", "CVG"},
                                                   {"GpC2", "CVG"},
                                                   {"HmCl", "CVG-ALS"},
                                                   {"IfCl", "ALS"},
                                                   {"dCfg", "CVG"},
                                                   {"pfcl", "MIR"},
                                                   {"tcrt", "SCR-TMA"}})
                               .description(),
      "2 Orlo Services Plugin - Response : (null)"},
     0,
     {},
     {}},
    {"OrloExport",
     [] { servicesDouble().answers.erase("MiravelSNKey"); },
     {},
     {"2 Adding ExportList for overlays before M8xM9y", "2 Export Dict : (null)",
      "4 Key doesn't exist or Error reading IDs"},
     -1,
     {},
     Error{"OrloExport", 2002, "Orlo Export Failed due to - Error Reading Miravel SN"}},
    {"OrloExport", [] { servicesDouble().answers["HWModelStr"] = "xM9y"; }, {}, {"4 Expected a list"}, -1, {}, {}},
    {"OrloExport", [] {}, Value::Dictionary{{"ExportList", "pfcl"}}, {"4 Expected a list"}, -1, {}, {}},
    {"OrloExport",
     [] { servicesDouble().answers["HWModelStr"] = "xM9y"; },
     exportOf("CtCl"),
     {"2 Export Dict : {\"CtCl\": \"CVG\"}", "2 Orlo Services Plugin - Response : (null)",
      "2 Orlo Services Plugin - Response : (null)"},
     0,
     {},
     {}},
    {"OrloExport",
     [] { dataStoreDouble().makesSessions = false; },
     exportOf("CtCl"),
     {"2 Export Dict : {\"CtCl\": \"CVG\"}", "2 Orlo Services Plugin - Response : (null)",
      "2 Orlo Services Plugin - Response : (null)"},
     -1,
     {},
     Error{"OrloExport", 2006, "ZephyrineExport Upload Failed due to - Orlo Object Create Error"}},
    {"OrloExport",
     [] {},
     exportOf("ctcl"),
     {"2 Export Dict : (null)", "4 Orlo Export Failed due to - Key doesn't exist - ctcl",
      "2 Orlo Services Plugin - Response : (null)"},
     -1,
     {},
     Error{"OrloExport", 2002, "Orlo Export Failed due to - Key doesn't exist - ctcl"}},

    {"getTCRT",
     [] {},
     {},
     {"2 Received getTCRT"},
     0,
     Value::Dictionary{{"CertData", "3000"}, {"CertSerialNumber", "DummyCertificateSerialNumber"}},
     {}},
    {"getTCRT", [] { servicesDouble().answers["HWModelStr"] = "M7"; }, {}, {"2 Received getTCRT"}, -1, {}, {}},
    {"putTCRT", [] {}, {}, {"2 tcrt- : SCR-TMA"}, 0, {}, {}},
    {"putTCRT",
     [] { servicesDouble().answers["ScreenSerialNumber"] = Value::Data(65, 0x11); },
     {},
     {"2 tcrt- : <" + std::string(130, '1') + ">-TMA"},
     0,
     {},
     {}},
    {"putTCRT",
     [] {
         servicesDouble().answers["HWModelStr"] = "M3x";
         servicesDouble().authenticate = [](const Value&, const auto& completion) {
             completion(false, Value(), Value(), false, 0);
         };
     },
     {},
     {"4 Top Module Authentication Failed. Failing the test"},
     -1,
     {},
     Error{"TcrtAuthErrorDomain", 401, "Top Module Tesk Authentication Failed"}},
};

TEST_F(RecordCommands, logTheirStepsAndAnswer) {
    for (const Row& row : rows) {
        SCOPED_TRACE(row.command + row.messageDict.description());
        arrange();
        row.arrange();
        const HSMessageResponse response = request(row.command, row.messageDict);
        EXPECT_EQ(lines(), row.lines);
        EXPECT_EQ(response.statusCode(), row.status);
        EXPECT_EQ(response.response(), row.response);
        EXPECT_EQ(response.error(), row.error);
    }
}

TEST_F(RecordCommands, aRequestIsCompletedOnceWhereverMemoryEnds) {
    const Value nothingElse = Value::Dictionary{{"IsPostSwapEntitled", false}};
    const struct {
        const char* command;
        std::int64_t status;
        Value response = {};
    } commands[] = {{"OrloExport", -1},   {"getTCRT", -1},
                    {"putTCRT", -1},      {"putPSD2", -1},
                    {"getPSD2", -1},      {"corvoSCProv", -1},
                    {"corvoSCPair", -1},  {"checkCorvoPostSwapEntitlement", 0, nothingElse},
                    {"setGlobalbCfg", 0}, {"unknown", 1}};
    Value::Dictionary arguments = paths;
    arguments.insert({{"waftonUrl", "http://host"}, {"bcfgDataPath", "/psd2"}});
    for (const auto& row : commands) {
        const HSMessageRequest message{row.command, arguments};
        bool failed = true, sawFailure = false;
        for (int count = 1; failed; count += 1 + count / 40) {
            arrange();
            root_.write("/tmp/new_bCfg", "earlier");
            servicesDouble().reverseProxy.events = {{1}};
            servicesDouble().pairing.tickets = {{"tick"}};
            servicesDouble().updater.queryInfo.output = Value::Dictionary{{"Digest", certificate}};
            ZPOrloServices server;
            int completions = 0;
            std::optional<HSMessageResponse> answer;
            const HSCompletion completion = [&](bool completed, const std::optional<HSMessageResponse>& response) {
                failed = allocationHasFailed();
                failAllocation(0);
                completions += completed ? 1 : 10;
                answer = response;
            };
            failAllocation(count);
            server.handleMessage(message, completion);
            ASSERT_EQ(completions, 1) << row.command << count;
            ASSERT_EQ(answer.has_value(), row.status < 1) << row.command << count;
            if (!answer)
                continue;
            EXPECT_EQ(answer->name(), Value(row.command));
            EXPECT_EQ(root_.read("/tmp/new_bCfg") == "earlier", std::string_view(row.command) != "setGlobalbCfg")
                << count;
            if (answer->statusCode() == row.status && answer->response() == row.response && !answer->error())
                sawFailure = true;
            else
                EXPECT_TRUE(answer->statusCode() == 0 || answer->error() || !answer->response().isNothing());
        }
        EXPECT_EQ(sawFailure, row.status < 1) << row.command;
    }
}

TEST_F(RecordCommands, aFileThatCannotBeWrittenIsNamedInTheAnswerAndNoEarlierBlobIsTakenForTheResult) {
    inOwnProcess([this] {
        const Bytes blob = BlobParts{}.whole();
        root_.write("/blob", std::string(blob.begin(), blob.end()));
        root_.write("/tmp/new_bCfg", "earlier");
        root_.write("/out", "before");
        dataStoreDouble().record = Value::Data(1 << 20);
        std::signal(SIGXFSZ, SIG_IGN);
        const rlimit full = {64, 64};
        ASSERT_EQ(::setrlimit(RLIMIT_FSIZE, &full), 0);
        const HSMessageResponse response = request("getPSD2", paths);
        EXPECT_EQ(lines().back(), "2 Failed to write psd2 to file");
        EXPECT_EQ(response.statusCode(), -1);
        EXPECT_EQ(response.response(), Value());
        EXPECT_TRUE(response.error() && !response.error()->text.empty());
        EXPECT_EQ(root_.read("/out"), "before");
        EXPECT_EQ(request("setGlobalbCfg", Value::Dictionary{{"bcfgDataPath", "/blob"}}).statusCode(), 0);
        EXPECT_EQ(root_.read("/tmp/new_bCfg"), "(missing)");
    });
}

} // namespace
