#include "platform/ReverseProxy.h"

#include <chrono>
#include <cstdint>
#include <memory>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "platform/Semaphore.h"
#include "tests/support/TemporaryRoot.h"

namespace {

using namespace std::chrono_literals;
using Clock = std::chrono::steady_clock;
using Statuses = std::vector<std::int32_t>;

class ReverseProxy : public testing::Test {
protected:
    void describe(const std::string& reverseProxy) const {
        root_.describe(R"({"reverseProxy": )" + reverseProxy + "}");
    }

    // Registers anew.
    bool registers() {
        proxy_.reset(RPRegisterForAvailability([this, caller = std::this_thread::get_id()](std::int32_t status) {
            EXPECT_NE(std::this_thread::get_id(), caller);
            delivered_.push_back(status);
            came_.signal();
        }));
        return proxy_ != nullptr;
    }

    // Waits until `count` have come, and ends the thread that delivers.
    Statuses deliveries(std::size_t count) {
        for (std::size_t i = 0; i < count; ++i)
            EXPECT_TRUE(came_.waitFor(1min));
        proxy_.reset();
        return std::exchange(delivered_, {});
    }

    TemporaryRoot root_;
    Statuses delivered_;
    CountingSemaphore came_;
    std::unique_ptr<RPRegistration, decltype(&RPRelease)> proxy_{nullptr, RPRelease};
};

TEST_F(ReverseProxy, hasTheSettingsThatAreDescribedAndWithoutAnyRefusesRegistration) {
    EXPECT_FALSE(registers()); // there is no description at all
    for (const char* described : {"null", "7", "[]", "{"}) {
        describe(described);
        EXPECT_FALSE(registers()) << described;
        EXPECT_TRUE(RPCopyProxyDictionaryWithOptions("http://a", {}).isNothing()) << described;
    }
    describe(R"({"proxy": {"HTTPSProxy": {"$file": "/host", "as": "text"}}})");
    root_.write("/host", "::1");
    EXPECT_EQ(RPCopyProxyDictionaryWithOptions("http://a", {}), Value(Value::Dictionary{{"HTTPSProxy", "::1"}}));
    EXPECT_TRUE(registers());
}

TEST_F(ReverseProxy, eventsComeInTheirOrderWhenTheyAreDueAndMalformedOnesAreLeftOut) {
    const std::pair<const char*, Statuses> rows[] = {
        {R"([{"status": 7, "afterMs": 40}, {"status": 1, "afterMs": 10}, {"status": 3}])", {7, 1, 3}},
        {R"([{"status": -2147483648}, {"status": 2147483647}])", {INT32_MIN, INT32_MAX}},
        {R"([{"status": 1, "afterMs": -9223372036854775808}, {"status": true, "afterMs": "soon"}])", {1, 1}},
        {R"([null, 1, [1], {}, {"status": "1"}, {"status": 1.0}, {"status": 2}])", {2}},
        {R"([{"status": 4294967297}, {"status": -2147483649}, {"status": 2147483648}, {"status": 2}])", {2}},
        {"7", {}},
    };
    for (const auto& [events, statuses] : rows) {
        describe(R"({"events": )" + std::string(events) + "}");
        ASSERT_TRUE(registers()) << events;
        const Clock::time_point start = Clock::now();
        RPRegistrationResume(proxy_.get());
        EXPECT_EQ(deliveries(statuses.size()), statuses) << events;
        EXPECT_GE(Clock::now() - start, events == rows[0].first ? 40ms : 0ms);
    }
}

TEST_F(ReverseProxy, anEventThatIsMinutesAwayHoldsUpNeitherInvalidationNorRelease) {
    describe(R"({"events": [{"status": 7}, {"status": 1, "afterMs": 600000}]})");
    const Clock::time_point start = Clock::now();
    for (const bool invalidated : {true, false}) {
        ASSERT_TRUE(registers());
        RPRegistrationResume(proxy_.get());
        ASSERT_TRUE(came_.waitFor(1min));
        if (invalidated)
            RPRegistrationInvalidate(proxy_.get());
        EXPECT_EQ(deliveries(0), Statuses{7});
    }
    ASSERT_TRUE(registers());
    RPRegistrationInvalidate(proxy_.get());
    RPRegistrationResume(proxy_.get());
    EXPECT_EQ(deliveries(0), Statuses{});
    EXPECT_LT(Clock::now() - start, 1min);
}

} // namespace
