#include "platform/HardwareRegistry.h"

#include <gtest/gtest.h>

#include "tests/support/TemporaryRoot.h"

namespace {

using namespace HardwareRegistry;

constexpr char description[] = R"({"registry": [
  {"class": "Relay", "properties": {"Own": 1, "Lost": {"$file": "/missing", "as": "data"}},
   "children": [
     {"class": "Chip", "properties": {"Deep": {"$data": "c0de"}, "Lost": "found"},
      "children": [{"class": "Relay", "properties": {"Own": 2, "Deep": "deeper", "Deepest": true}}]},
     {"class": "Chip", "properties": {"Deep": "sibling", "Later": {"$file": "/later", "as": "text"}}}]},
  {"class": "Bare"}, {"class": 7}, 8, {"children": 9},
  {"class": {"$file": "/name", "as": "text"}, "properties": [], "children": [{"class": "Late", "properties": {"Own": 3}}]}
]})";

class HardwareRegistryTest : public testing::Test {
protected:
    HardwareRegistryTest() {
        root_.describe(description);
        root_.write("/name", "Second\n");
    }
    ~HardwareRegistryTest() override { EXPECT_EQ(heldServices(), 0U); }

    static Value propertyOf(std::string_view className, std::string_view key, std::uint32_t options,
                            std::string_view plane = servicePlane) {
        const Service service = getMatchingService(serviceMatching(className));
        EXPECT_NE(service, 0U) << className;
        Value found = searchProperty(service, plane, key, options);
        releaseService(service);
        return found;
    }

    TemporaryRoot root_;
};

TEST_F(HardwareRegistryTest, theFirstServiceOfAClassIsFoundAtAnyDepth) {
    EXPECT_EQ(propertyOf("Relay", "Own", 0), Value(1));
    EXPECT_EQ(propertyOf("Chip", "Lost", 0), Value("found"));
    EXPECT_EQ(propertyOf("Late", "Own", 0), Value(3));
    for (const char* missing : {"Rela", "relay", "7", "None"})
        EXPECT_EQ(getMatchingService(serviceMatching(missing)), 0U) << missing;
    EXPECT_TRUE(serviceMatching("").isNothing());
    EXPECT_EQ(getMatchingService({}), 0U);
}

TEST_F(HardwareRegistryTest, aPropertyIsSearchedOnTheServiceAndIfAskedForBelowIt) {
    root_.write("/later", "text\n");
    EXPECT_EQ(propertyOf("Relay", "Deep", searchRecursively), Value(Value::Data{0xC0, 0xDE}));
    EXPECT_EQ(propertyOf("Relay", "Own", searchRecursively), Value(1));
    EXPECT_EQ(propertyOf("Relay", "Deepest", searchRecursively), Value(true));
    EXPECT_EQ(propertyOf("Relay", "Later", searchRecursively), Value("text"));
    EXPECT_EQ(propertyOf("Relay", "Lost", searchRecursively), Value("found")); // the own one names a missing file
    EXPECT_TRUE(propertyOf("Relay", "Deep", 0).isNothing());
    EXPECT_TRUE(propertyOf("Relay", "Deep", searchRecursively, "OtherPlane").isNothing());
    EXPECT_EQ(propertyOf("Relay", "Own", searchRecursively, "OtherPlane"), Value(1));
    EXPECT_TRUE(propertyOf("Bare", "Own", searchRecursively).isNothing());
    EXPECT_EQ(propertyOf("Second", "Own", searchRecursively), Value(3));
}

TEST_F(HardwareRegistryTest, handlesAreCountedAndKeepTheirServiceUntilTheyAreReleased) {
    const Service first = getMatchingService(serviceMatching("Relay"));
    const Service second = getMatchingService(serviceMatching("Relay"));
    EXPECT_NE(first, second);
    EXPECT_EQ(heldServices(), 2U);
    root_.describe(R"({"registry": {"class": "Relay"}})");
    EXPECT_EQ(getMatchingService(serviceMatching("Relay")), 0U);
    EXPECT_EQ(searchProperty(first, servicePlane, "Own", 0), Value(1));
    releaseService(first);
    releaseService(first);
    EXPECT_EQ(heldServices(), 1U);
    EXPECT_TRUE(searchProperty(first, servicePlane, "Own", 0).isNothing());
    EXPECT_EQ(searchProperty(second, servicePlane, "Own", 0), Value(1));
    releaseService(second);
}

} // namespace
