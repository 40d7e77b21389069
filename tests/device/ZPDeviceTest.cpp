// What no command of the plug-in reaches; the rest stands in tests/plugin/transcripts.
#include "device/ZPDevice.h"

#include <algorithm>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "orlo/ZPOrlo.h"
#include "orlo/ZPOrloExport.h"
#include "platform/DeviceAnswers.h"
#include "tests/support/RecordedLog.h"
#include "tests/support/ScriptedServices.h"
#include "tests/support/TemporaryRoot.h"

namespace {

using Lines = std::vector<std::string>;

constexpr const char* url = "https://server.example/corvo";

class ZPDeviceTest : public testing::Test {
protected:
    ZPDeviceTest() {
        arrangeServices();
        root_.write("/ticket", "ticket");
        describe("{}");
    }

    void describe(const std::string& description) {
        root_.write("/etc/veltra/device.json", description);
        KACopyAnswer("", {}); // what is wrong with the description is said at the first query
        recordLog();
    }

    TemporaryRoot root_;
    ZPDevice& device_ = ZPDevice::sharedSingleton();
};

TEST_F(ZPDeviceTest, theDevicesOwnIdentityStopsAtTheFirstThingThatIsMissing) {
    const struct {
        const char* answers;
        Value expected;
        Lines log;
    } rows[] = {
        {R"("UniqueChipID": 7, "ChipID": 33041)", "33041:7", {}},
        {R"("ChipID": 33041)", {}, {"4 [ZPDevice] Failed to get the unique chip id"}},
        {R"("UniqueChipID": 7)", {}, {"4 [ZPDevice] Failed to get the chip id"}},
        {R"("UniqueChipID": ["x"])", {}, {R"(4 [ZPDevice] Could not get data instance string for identifier '["x"]')"}},
    };
    for (const auto& row : rows) {
        describe(std::string(R"({"answers": {)") + row.answers + "}}");
        EXPECT_EQ(ZPDevice::getUniqueChipId(), row.expected);
        EXPECT_EQ(recordedLog(), row.log);
    }
}

TEST_F(ZPDeviceTest, whatIsNotFoundLeavesTheOutValuesAsTheyWere) {
    describe(R"({"answers": {"HWModelStr": "a", "ChipID": 1}, "registry": [{"class": "TeskAuthI2CRelayInterface"}]})");
    EXPECT_EQ(ZPDevice::kaGetAnswerString("HWModelStr"), Value("a"));
    EXPECT_TRUE(ZPDevice::kaGetAnswerString("ChipID").isNothing());
    std::uint32_t handle = 99;
    EXPECT_EQ(device_.getService("", &handle), (Error{"TcrtErrorDomain", 400, "can't create matching dict"}));
    EXPECT_EQ(handle, 99U);
    EXPECT_EQ(recordedLog(), Lines{"4 [ZPDevice] can't create matching dict"});
    Value certificate = "before";
    EXPECT_TRUE(device_.getTcrtCertificate(&certificate));
    EXPECT_EQ(certificate, Value("before"));
    EXPECT_TRUE(device_.getCertificateSerialNumber({}).isNothing());
}

TEST_F(ZPDeviceTest, noPartOfAChallengeIsEverTheSame) {
    const Value one = device_.createChallenge(), other = device_.createChallenge();
    ASSERT_EQ(one.data()->size(), 32U);
    for (auto a = one.data()->begin(), b = other.data()->begin(); a != one.data()->end(); a += 4, b += 4)
        EXPECT_FALSE(std::equal(a, a + 4, b));
}

TEST_F(ZPDeviceTest, anAnswerOfTheDisplayThatComesTooLateIsTakenForNoOther) {
    for (const char* chip : {R"({"mode": "pass", "delayMs": 11000})", R"({"mode": "fail", "delayMs": 2000})"}) {
        describe(R"({"answers": {"HWModelStr": "M3"}, "componentAuth": )" + std::string(chip) + "}");
        EXPECT_FALSE(device_.authenticateDisplay()) << chip;
    }
}

TEST_F(ZPDeviceTest, availabilityThatComesAfterTheCallIsHarmlessAndForNoOther) {
    EXPECT_FALSE(device_.setupReverseProxy(url).isNothing());
    std::thread late([callback = availabilityCallback] { callback(1); });
    late.join();
    outcomes["RPRegistrationResume"].output = Value::Array{3};
    EXPECT_TRUE(device_.setupReverseProxy(url).isNothing());
}

TEST_F(ZPDeviceTest, availabilityThatComesWhileTheCallEndsCountsOrDoesNot) {
    outcomes["RPRegistrationResume"].output = Value::Array{3, 1};
    for (int round = 0; round < 50; ++round) {
        const bool isAvailable = !device_.setupReverseProxy(url).isNothing();
        EXPECT_EQ(recordedLog().back(),
                  isAvailable ? "2 [ZPDevice] Getting proxy info" : "2 [ZPDevice] Failed to get proxy info");
    }
}

using ZPOrloTest = ZPDeviceTest;

TEST_F(ZPOrloTest, theOptionsThatAreGivenStandInPlaceOfEqualDefaultsOrBesideThem) {
    const Value::Dictionary first = ZPOrlo::createDefaultOrloOptions(true, false);
    const struct {
        Value given;
        Value::Dictionary differences;
    } rows[] = {
        {Value::Dictionary{{"orlo2Data", 1}}, {{"DataVersion", 7}, {"UseSikDataInstance", true}, {"orlo2Data", 1}}},
        {Value::Dictionary{{"orlo2Data", false}}, {{"orlo2Data", false}}},
        {Value::Dictionary{{"HTTPTimeout", 60}, {"Mine", "x"}}, {{"HTTPTimeout", 60}, {"Mine", "x"}}},
        {Value::Dictionary{{"orlo2Data", true}, {"DataVersion", 3}},
         {{"DataVersion", 3}, {"UseSikDataInstance", true}, {"orlo2Data", true}}},
    };
    for (const auto& row : rows) {
        const ZPOrlo orlo = ZPOrlo::initWithOptions(row.given);
        Value::Dictionary expected = first;
        for (const auto& [key, value] : row.differences)
            expected[key] = value;
        EXPECT_EQ(Value(sessionOptions), Value(expected)) << row.given.description();
    }
    Value::Dictionary local = first;
    local["DataStore"] = "Local";
    EXPECT_EQ(Value(ZPOrlo::createDefaultOrloOptions(false, false)), Value(local));
}

TEST_F(ZPOrloTest, eachPutGrantsAndTrustsAnew) {
    ZPOrlo orlo = ZPOrlo::init();
    const auto put = [&orlo] {
        recordLog();
        EXPECT_EQ(orlo.orloPut("tcrt", "S1", {'d'}, nullptr), std::nullopt);
        return recordedLines();
    };
    EXPECT_EQ(put(), put());
}

TEST_F(ZPOrloTest, anExportWithoutDictionaryAsksNobody) {
    EXPECT_EQ(ZPOrloExport::orloExportCommandWithResponse({}, {}, nullptr),
              (Error{"OrloExport", 2002, "Orlo Export Failed Not being able to get data instances due to (null)"}));
    EXPECT_EQ(recordedLines(), Lines{"4 [ZPOrloExport] Could not generate data instances"});
}

} // namespace
