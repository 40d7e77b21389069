// What no command of the plug-in reaches; the rest stands in tests/plugin/transcripts.
#include "device/ZPDevice.h"

#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

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

TEST_F(ZPDeviceTest, answersAreHandedBackAsTheyAreOrInTheStoresTextForm) {
    enum Kind {
        AsAnswered,
        Converted,
        ConvertedSilently
    };
    const struct {
        Value (ZPDevice::*get)() const;
        std::string key;
        Kind kind;
    } getters[] = {
        {&ZPDevice::getMiravelSerialNumber, "MiravelSerialNumber", AsAnswered},
        {&ZPDevice::miravelSerialNumber, "MiravelSerialNumber", AsAnswered},
        {&ZPDevice::getCoverGlassSerialNumber, "CoverGlassSerialNumber", AsAnswered},
        {&ZPDevice::coverGlassSerialNumber, "CoverGlassSerialNumber", AsAnswered},
        {&ZPDevice::getAmbientLightSensorSerialNumber, "AmbientLightSensorSerialNumber", AsAnswered},
        {&ZPDevice::ambientLightSensorSerialNumber, "AmbientLightSensorSerialNumber", AsAnswered},
        {&ZPDevice::getFCAMModuleSerialNumber, "FrontCameraModuleSerialNumber", AsAnswered},
        {&ZPDevice::frontFacingCameraModuleSerialNumber, "FrontCameraModuleSerialNumber", AsAnswered},
        {&ZPDevice::getProxSerialNumber, "ProxSerialNumber", AsAnswered},
        {&ZPDevice::getBackglassCompassSerialNumber, "BackglassCompassSerialNumber", AsAnswered},
        {&ZPDevice::getScreenSerialNumber, "ScreenSerialNumber", AsAnswered},
        {&ZPDevice::getVanterSerialNumber, "VanterSerialNumber", Converted},
        {&ZPDevice::getVanterChipId, "VanterChipID", Converted},
        {&ZPDevice::getVanterUID, "VanterUID", Converted},
        {&ZPDevice::getLoddenChipID, "LoddenChipID", Converted},
        {&ZPDevice::getLoddenUID, "LoddenUID", Converted},
        {&ZPDevice::getTopModuleChipID, "TopModuleAuthChipID", ConvertedSilently},
        {&ZPDevice::getHardwareModel, "HWModelStr", AsAnswered},
    };
    const struct {
        std::string json;
        Value answer;
        Value text;
    } rows[] = {{R"({"$data": "0bad"})", Value::Data{0x0B, 0xAD}, "0bad"},
                {"4660", 4660, "4660"},
                {"true", true, {}},
                {R"("")", "", {}}};
    for (const auto& getter : getters) {
        for (const auto& row : rows) {
            const bool isTansu = getter.key.starts_with("Prox") || getter.key.starts_with("Backglass");
            describe("{\"" + std::string(isTansu ? "tansu" : "answers") + "\": {\"" + getter.key + "\": " + row.json +
                     "}}");
            const Value expected = getter.kind == AsAnswered ? row.answer : row.text;
            EXPECT_EQ((device_.*getter.get)(), expected) << getter.key;
            EXPECT_EQ(recordedLog().size(), expected.isNothing() && getter.kind == Converted ? 1U : 0U) << getter.key;
        }
    }
}

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

TEST_F(ZPDeviceTest, theInstanceIsSharedAndItsDictionaryIsReadAndWrittenWhole) {
    std::vector<std::thread> threads;
    std::vector<ZPDevice*> seen(8);
    for (ZPDevice*& place : seen)
        threads.emplace_back([&place] {
            place = &ZPDevice::sharedSingleton();
            place->setSyscfgDict(Value::Dictionary{{"a", 1}, {"b", 2}});
            EXPECT_EQ(place->syscfgDict(), Value(Value::Dictionary{{"a", 1}, {"b", 2}}));
        });
    for (std::thread& thread : threads)
        thread.join();
    EXPECT_EQ(seen, std::vector<ZPDevice*>(8, &device_));
}

TEST_F(ZPDeviceTest, whatIsNotFoundLeavesTheOutValuesAsTheyWere) {
    describe(R"({"answers": {"HWModelStr": "a", "ChipID": 1}, "registry": [{"class": "TeskAuthI2CRelayInterface"}]})");
    EXPECT_EQ(ZPDevice::kaGetAnswerString("HWModelStr"), Value("a"));
    EXPECT_TRUE(ZPDevice::kaGetAnswerString("ChipID").isNothing());
    EXPECT_TRUE(ZPDevice::kaGetAnswerString("missing").isNothing());
    std::uint32_t handle = 99;
    EXPECT_EQ(device_.getService("", &handle), (Error{"TcrtErrorDomain", 400, "can't create matching dict"}));
    EXPECT_EQ(device_.getService("Other", &handle), (Error{"TcrtErrorDomain", 400, "cannot get service"}));
    EXPECT_EQ(handle, 99U);
    EXPECT_EQ(recordedLog(), (Lines{"4 [ZPDevice] can't create matching dict", "4 [ZPDevice] cannot get service"}));
    Value certificate = "before";
    EXPECT_TRUE(device_.getTcrtCertificate(&certificate));
    EXPECT_EQ(certificate, Value("before"));
    EXPECT_TRUE(device_.getCertificateSerialNumber({}).isNothing());
}

TEST_F(ZPDeviceTest, aChallengeHas32BytesAndIsNeverTheSame) {
    const Value first = device_.createChallenge();
    ASSERT_TRUE(first.data());
    EXPECT_EQ(first.data()->size(), 32U);
    EXPECT_NE(device_.createChallenge(), first);
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

} // namespace
