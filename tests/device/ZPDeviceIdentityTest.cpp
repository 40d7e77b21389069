#include "device/ZPDevice.h"

#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "tests/platform/ServicesDouble.h"
#include "tests/support/RecordedLog.h"

namespace {

using Lines = std::vector<std::string>;

class ZPDeviceIdentity : public testing::Test {
protected:
    ZPDeviceIdentity() {
        servicesDouble() = {};
        recordLog();
    }

    ServicesDouble& services_ = servicesDouble();
    ZPDevice& device_ = ZPDevice::sharedSingleton();
};

enum Kind {
    AsAnswered,
    Converted,
    ConvertedSilently
};

// Each getter: where it asks, for what, what it makes of the answer, and the name in its line about a missing one.
struct Getter {
    Value (ZPDevice::*get)() const;
    const char* operation;
    const char* key;
    Kind kind;
    const char* identifier;
};

const Getter getters[] = {
    {&ZPDevice::getMiravelSerialNumber, "KACopyAnswer", "MiravelSNKey", AsAnswered, "Miravel SN"},
    {&ZPDevice::getCoverGlassSerialNumber, "KACopyAnswer", "CoverGlassSNKey", AsAnswered, "CoverGlass SN"},
    {&ZPDevice::getAmbientLightSensorSerialNumber, "KACopyAnswer", "ALSSNKey", AsAnswered, "ALS SN"},
    {&ZPDevice::getFCAMModuleSerialNumber, "KACopyAnswer", "FCAMModuleSNKey", AsAnswered, "FCAMModule SN"},
    {&ZPDevice::getProxSerialNumber, "TansuCopyValueWithError", "ProxSerialNumber", AsAnswered, "Prox Serial Number"},
    {&ZPDevice::getBackglassCompassSerialNumber, "TansuCopyValueWithError", "BackglassCompassSerialNumber", AsAnswered,
     "BG Serial Number"},
    {&ZPDevice::getScreenSerialNumber, "KACopyAnswer", "ScreenSerialNumber", AsAnswered, "Screen Serial Number"},
    {&ZPDevice::getVanterSerialNumber, "KACopyAnswer", "VanterSerialNumber", Converted, "Vanter Serial Number"},
    {&ZPDevice::getVanterChipId, "KACopyAnswer", "VanterChipIDKey", Converted, "Vanter Chip id"},
    {&ZPDevice::getVanterUID, "KACopyAnswer", "VanterUIDKey", Converted, "Vanter UID"},
    {&ZPDevice::getLoddenChipID, "KACopyAnswer", "LoddenChipIDKey", Converted, "Lodden Chip id"},
    {&ZPDevice::getLoddenUID, "KACopyAnswer", "LoddenUIDKey", Converted, "Lodden UID"},
    {&ZPDevice::getTopModuleChipID, "KACopyAnswer", "TopModuleAuthChipID", ConvertedSilently, "topModuleChipID"},
    {&ZPDevice::getHardwareModel, "KACopyAnswerWithError", "HWModelStr", AsAnswered, "HWModelStr"},
};

TEST_F(ZPDeviceIdentity, everyGetterAsksItsServiceForItsKeyAndReportsAMissingAnswer) {
    for (const Getter& getter : getters) {
        services_ = {};
        recordLog();
        EXPECT_TRUE((device_.*getter.get)().isNothing()) << getter.identifier;
        EXPECT_EQ(services_.calls, Lines{std::string(getter.operation) + " " + getter.key});
        EXPECT_EQ(recordedLog(), Lines{std::string("4 [ZPDevice] Could not get data instance string for identifier ") +
                                       getter.identifier});
    }
}

TEST_F(ZPDeviceIdentity, answersAreHandedBackAsTheyAreOrInTheStoresTextForm) {
    for (const Getter& getter : getters) {
        auto& answers = std::string(getter.operation).starts_with("Tansu") ? services_.tansu : services_.answers;
        for (const auto& [answer, text] : {std::pair<Value, Value>{Value::Data{0x0B, 0xAD}, "0bad"},
                                           {4660, "4660"},
                                           {"SN1", "SN1"},
                                           {true, {}},
                                           {"", {}}}) {
            answers[getter.key] = answer;
            recordLog();
            const Value expected = getter.kind == AsAnswered ? answer : text;
            EXPECT_EQ((device_.*getter.get)(), expected) << getter.identifier;
            EXPECT_EQ(recordedLog().size(), expected.isNothing() && getter.kind == Converted ? 1U : 0U)
                << getter.identifier;
        }
    }
}

TEST_F(ZPDeviceIdentity, theDevicesOwnIdentityStopsAtTheFirstThingThatIsMissing) {
    struct Row {
        std::map<std::string, Value, std::less<>> answers;
        Value expected;
        Lines log;
        std::size_t calls;
    };
    const Row rows[] = {
        {{{"UniqueChipID", 7}, {"ChipID", 33041}}, "33041:7", {}, 2},
        {{{"ChipID", 33041}}, {}, {"4 [ZPDevice] Failed to get the unique chip id"}, 1},
        {{{"UniqueChipID", 7}}, {}, {"4 [ZPDevice] Failed to get the chip id"}, 2},
        {{{"UniqueChipID", Value::Array{"x"}}, {"ChipID", 1}},
         {},
         {"4 [ZPDevice] Could not get data instance string for identifier '" + Value(Value::Array{"x"}).description() +
          "'"},
         1},
        {{{"UniqueChipID", 7}, {"ChipID", true}},
         {},
         {"4 [ZPDevice] Could not get data instance string for identifier '" + Value(true).description() + "'"},
         2},
    };
    for (const Row& row : rows) {
        services_ = {};
        services_.answers = row.answers;
        recordLog();
        EXPECT_EQ(ZPDevice::getUniqueChipId(), row.expected);
        EXPECT_EQ(recordedLog(), row.log);
        EXPECT_EQ(services_.calls.size(), row.calls);
    }
}

TEST_F(ZPDeviceIdentity, anAnswerStringIsATextOrNothingWithoutAWord) {
    services_.answers = {{"text", "a"}, {"number", 1}};
    EXPECT_EQ(ZPDevice::kaGetAnswerString("text"), Value("a"));
    EXPECT_TRUE(ZPDevice::kaGetAnswerString("number").isNothing());
    EXPECT_TRUE(ZPDevice::kaGetAnswerString("missing").isNothing());
    EXPECT_EQ(recordedLog(), Lines{});
}

TEST_F(ZPDeviceIdentity, theInstanceIsSharedAndItsDictionaryIsReadAndWrittenWhole) {
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

} // namespace
