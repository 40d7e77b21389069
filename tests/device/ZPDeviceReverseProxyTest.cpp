#include "device/ZPDevice.h"

#include <chrono>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "tests/platform/ServicesDouble.h"
#include "tests/support/RecordedLog.h"

namespace {

using Lines = std::vector<std::string>;
using std::chrono::milliseconds;

constexpr const char* url = "https://server.example/corvo";

struct Row {
    const char* name;
    ReverseProxyDouble reverseProxy;
    bool available;
    bool waits = false; // until the limit
};

class ZPDeviceReverseProxy : public testing::Test {
protected:
    ZPDeviceReverseProxy() {
        servicesDouble() = {};
        recordLog();
    }

    // The result of the call, which waits until the limit or does not.
    static Value setUp(const Row& row) {
        servicesDouble() = {};
        servicesDouble().reverseProxy = row.reverseProxy;
        recordLog();
        const auto start = std::chrono::steady_clock::now();
        Value result = ZPDevice::sharedSingleton().setupReverseProxy(url);
        const auto took = std::chrono::steady_clock::now() - start;
        EXPECT_EQ(took >= std::chrono::seconds(5), row.waits) << row.name;
        return result;
    }

    static Lines log() {
        Lines lines = recordedLog();
        for (std::string& line : lines) // the number of the source line differs
            if (const std::size_t end = line.find_last_not_of("0123456789"); line[end] == ':')
                line.replace(end + 1, std::string::npos, "*");
        return lines;
    }
};

const Value proxy = Value::Dictionary{{"HTTPSEnable", 1}, {"HTTPSProxy", "127.0.0.1"}, {"HTTPSPort", 3128}};

const Row rows[] = {
    {"available at once", {.events = {{1}}, .proxy = proxy}, true},
    {"available after a while", {.events = {{1, milliseconds{50}}}, .proxy = proxy}, true},
    {"other statuses do not end the wait",
     {.events = {{0}, {2}, {4}, {-1}, {1, milliseconds{50}}}, .proxy = proxy},
     true},
    {"available without settings", {.events = {{1}}, .proxy = {}}, true},
    {"the end of waiting", {.events = {{3}}, .proxy = proxy}, false},
    {"the end of waiting is the end", {.events = {{3}, {1, milliseconds{60000}}}, .proxy = proxy}, false},
    {"available before the end of waiting", {.events = {{1}, {3}}, .proxy = proxy}, true},
    {"available at the last moment", {.events = {{3}}, .eventsAtInvalidation = {1}, .proxy = proxy}, true},
    {"only other statuses", {.events = {{0}, {2}, {4}, {-1}}, .proxy = proxy}, false, true},
    {"available after the limit", {.events = {}, .eventsAtInvalidation = {1}, .proxy = proxy}, true, true},
};

TEST_F(ZPDeviceReverseProxy, theFirstSignalOrTheLimitEndsTheWaitAndTheFlagDecides) {
    for (const Row& row : rows) {
        SCOPED_TRACE(row.name);
        EXPECT_EQ(setUp(row), row.available ? row.reverseProxy.proxy : Value());
        EXPECT_EQ(log(),
                  (Lines{"2 [ZPDevice] -[ZPDevice setupReverseProxy:]:*",
                         row.available ? "2 [ZPDevice] Getting proxy info" : "2 [ZPDevice] Failed to get proxy info"}));
        Lines calls{"RPRegisterForAvailability", "RPRegistrationResume", "RPRegistrationInvalidate"};
        if (row.available)
            calls.push_back("RPCopyProxyDictionaryWithOptions " + std::string(url) + " " +
                            Value(Value::Dictionary{{"TestReachability", false}}).description());
        calls.push_back("RPRelease");
        EXPECT_EQ(servicesDouble().calls, calls);
    }
}

TEST_F(ZPDeviceReverseProxy, withoutARegistrationThereIsNothingToWaitFor) {
    EXPECT_TRUE(setUp({"", {.refusesRegistration = true, .events = {{1}}, .proxy = proxy}, false}).isNothing());
    EXPECT_EQ(log(), (Lines{"2 [ZPDevice] -[ZPDevice setupReverseProxy:]:*",
                            "2 [ZPDevice] failed to register for reverse proxy availability"}));
    EXPECT_EQ(servicesDouble().calls, Lines{"RPRegisterForAvailability"});
}

TEST_F(ZPDeviceReverseProxy, aCallbackThatComesAfterTheCallIsHarmless) {
    EXPECT_EQ(setUp({"", {.events = {{1}}, .proxy = proxy}, true}), proxy);
    std::vector<std::thread> late;
    for (const std::int32_t status : {1, 3, 2})
        late.emplace_back([status, callback = servicesDouble().reverseProxy.callback] { callback(status); });
    for (std::thread& thread : late)
        thread.join();
    // Nor does it make the next call's proxy available.
    EXPECT_TRUE(setUp({"", {.events = {{3}}, .proxy = proxy}, false}).isNothing());
}

TEST_F(ZPDeviceReverseProxy, availabilityThatComesWhileTheCallEndsCountsOrDoesNot) {
    for (int round = 0; round < 50; ++round) {
        const Value result = setUp({"", {.events = {{3}, {1}}, .proxy = proxy}, false});
        EXPECT_TRUE(result.isNothing() || result == proxy);
        EXPECT_EQ(log().back(),
                  result.isNothing() ? "2 [ZPDevice] Failed to get proxy info" : "2 [ZPDevice] Getting proxy info");
    }
}

} // namespace
