// Where memory or a disk ends; what commands say and do stands in transcripts.
#include <csignal>
#include <string>
#include <string_view>
#include <vector>

#include <gtest/gtest.h>
#include <sys/resource.h>

#include "plugin/ZPOrloServices.h"
#include "tests/support/FailingAllocation.h"
#include "tests/support/OwnProcess.h"
#include "tests/support/RecordedLog.h"
#include "tests/support/ScriptedServices.h"
#include "tests/support/TemporaryRoot.h"

namespace {

class ZPOrloServicesTest : public testing::Test {
protected:
    ZPOrloServicesTest() {
        std::filesystem::copy(VELTRA_EXAMPLE_DEVICE, root_.host("/"), std::filesystem::copy_options::recursive);
        root_.write("/ticket", "ticket");
        root_.write("/psd2", "record");
        root_.write("/var/mobile/Vanter.BE-Prod.fw", "patch");
        arrangeServices();
        recordLog();
    }

    static HSMessageResponse request(const char* command, const Value::Dictionary& arguments) {
        std::optional<HSMessageResponse> answer;
        ZPOrloServices().handleMessage({command, arguments}, [&](bool, const auto& response) { answer = response; });
        return answer.value();
    }

    TemporaryRoot root_;
};

TEST_F(ZPOrloServicesTest, aRequestIsCompletedOnceWhereverMemoryEnds) {
    // What is answered where nothing more can be said for want of memory.
    const struct {
        const char* command;
        std::int64_t status;
        Value response = {};
    } commands[] = {
        {"OrloExport", -1},   {"getTCRT", -1},
        {"putTCRT", -1},      {"putPSD2", -1},
        {"getPSD2", -1},      {"corvoSCProv", -1},
        {"corvoSCPair", -1},  {"checkCorvoPostSwapEntitlement", 0, Value::Dictionary{{"IsPostSwapEntitled", false}}},
        {"setGlobalbCfg", 0}, {"unknown", 1}};
    const Value::Dictionary arguments = {
        {"psd2DataPath", "/psd2"}, {"psd2V4DataPath", "/out"}, {"waftonUrl", "http://host"}, {"bcfgDataPath", "/psd2"}};
    for (const auto& row : commands) {
        const HSMessageRequest message{row.command, arguments};
        bool failed = true, sawFailure = false;
        for (int count = 1; failed; count += 1 + count / 40) {
            root_.write("/tmp/new_bCfg", "earlier");
            recordLog();
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
            EXPECT_EQ(liveSessions, 0);
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

TEST_F(ZPOrloServicesTest, anAnswerThatMemoryDoesNotSufficeForIsReplacedByTheFailureOnce) {
    std::vector<std::int64_t> statuses;
    const HSCompletion tooLarge = [&](bool, const std::optional<HSMessageResponse>& answer) {
        statuses.push_back(answer ? answer->statusCode() : 1);
        if (statuses.size() != 2)
            throw std::bad_alloc();
    };
    ZPOrloServices server;
    server.handleMessage({"getTCRT", {}}, tooLarge);
    EXPECT_EQ(statuses, (std::vector<std::int64_t>{0, -1}));
    EXPECT_THROW(server.handleMessage({"unknown", {}}, tooLarge), std::bad_alloc);
    EXPECT_EQ(statuses.size(), 3U);
}

TEST_F(ZPOrloServicesTest, aFileThatCannotBeWrittenIsNamedInTheAnswerAndNoEarlierBlobIsTakenForTheResult) {
    inOwnProcess([this] {
        root_.write("/tmp/new_bCfg", "earlier");
        root_.write("/out", "before");
        outcomes["QDOrloDataCopy"].output = Value::Data(1 << 20);
        std::signal(SIGXFSZ, SIG_IGN);
        const rlimit full = {64, 64};
        ASSERT_EQ(::setrlimit(RLIMIT_FSIZE, &full), 0);
        const HSMessageResponse response = request("getPSD2", {{"psd2V4DataPath", "/out"}});
        EXPECT_EQ(recordedLog().back(), "2 [ZPOrloServices] Failed to write psd2 to file");
        EXPECT_EQ(response.statusCode(), -1);
        EXPECT_EQ(response.response(), Value());
        EXPECT_TRUE(response.error() && !response.error()->text.empty());
        EXPECT_EQ(root_.read("/out"), "before");
        EXPECT_EQ(request("setGlobalbCfg", {{"bcfgDataPath", "/blobs/every-kind.bin"}}).statusCode(), 0);
        EXPECT_EQ(root_.read("/tmp/new_bCfg"), "(missing)");
    });
}

} // namespace
