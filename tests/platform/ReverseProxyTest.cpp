#include "platform/ReverseProxy.h"

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "tests/support/TemporaryRoot.h"

namespace {

using namespace std::chrono_literals;
using Clock = std::chrono::steady_clock;
using Statuses = std::vector<std::int32_t>;
using RegistrationPtr = std::unique_ptr<RPRegistration, decltype(&RPRelease)>;

// What a registration delivers, and on which thread.
class Deliveries {
public:
    RPAvailabilityCallback callback() {
        return [this, caller = std::this_thread::get_id()](std::int32_t status) {
            EXPECT_NE(std::this_thread::get_id(), caller);
            const std::lock_guard lock(mutex_);
            statuses_.push_back(status);
            changed_.notify_all();
        };
    }

    // Waits until `count` have come.
    Statuses waitFor(std::size_t count) {
        std::unique_lock lock(mutex_);
        EXPECT_TRUE(changed_.wait_for(lock, 1min, [&] { return statuses_.size() >= count; }));
        return statuses_;
    }

private:
    std::mutex mutex_;
    std::condition_variable changed_;
    Statuses statuses_;
};

class ReverseProxy : public testing::Test {
protected:
    void describe(const std::string& reverseProxy) const {
        root_.write("/etc/veltra/device.json", R"({"reverseProxy": )" + reverseProxy + "}");
    }

    static RegistrationPtr registration(Deliveries& deliveries) {
        return {RPRegisterForAvailability(deliveries.callback()), RPRelease};
    }

    TemporaryRoot root_;
};

TEST_F(ReverseProxy, aDeviceWithoutOneRefusesRegistrationAndHasNoSettings) {
    Deliveries none;
    EXPECT_EQ(registration(none), nullptr); // there is no description at all
    for (const char* described : {"null", "7", "[]", "\"proxy\""}) {
        describe(described);
        EXPECT_EQ(registration(none), nullptr) << described;
        EXPECT_TRUE(RPCopyProxyDictionaryWithOptions("http://a", {}).isNothing()) << described;
    }
    root_.write("/etc/veltra/device.json", R"({"reverseProxy": {)");
    EXPECT_EQ(registration(none), nullptr);
}

TEST_F(ReverseProxy, eventsComeInTheirOrderWhenTheyAreDueAndMalformedOnesAreLeftOut) {
    std::vector<std::pair<std::string, Statuses>> rows = {
        {R"([{"status": 7, "afterMs": 40}, {"status": 1, "afterMs": 10}, {"status": 3}])", {7, 1, 3}},
        {R"([{"status": -2147483648}, {"status": 2147483647}])", {INT32_MIN, INT32_MAX}},
        {R"([{"status": 1, "afterMs": -5}, {"status": true, "afterMs": "soon"}])", {1, 1}},
        {R"([{"status": 1, "afterMs": -9223372036854775808}])", {1}},
        {"7", {}},
        {"{}", {}},
        {"null", {}},
    };
    for (const char* odd : {"null", "1", "\"1\"", "[1]", "{}", R"({"status": null})", R"({"status": "1"})",
                            R"({"status": 1.0})", R"({"status": 4294967297})", R"({"status": -2147483649})",
                            R"({"status": 2147483648})", R"({"status": 18446744073709551617})"})
        rows.push_back({"[" + std::string(odd) + R"(, {"status": 2}])", {2}});
    for (const auto& [events, statuses] : rows) {
        describe(R"({"events": )" + events + "}");
        Deliveries deliveries;
        const RegistrationPtr proxy = registration(deliveries);
        ASSERT_NE(proxy, nullptr) << events;
        const Clock::time_point start = Clock::now();
        RPRegistrationResume(proxy.get());
        EXPECT_EQ(deliveries.waitFor(statuses.size()), statuses) << events;
        EXPECT_GE(Clock::now() - start, events == rows.front().first ? 40ms : 0ms);
    }
}

TEST_F(ReverseProxy, nothingIsDeliveredBeforeResumeNorAfterInvalidation) {
    describe(R"({"events": [{"status": 1, "afterMs": 10}]})");
    Deliveries first, second;
    RegistrationPtr idle = registration(first), resumed = registration(second);
    ASSERT_NE(idle, nullptr);
    ASSERT_NE(resumed, nullptr);
    RPRegistrationResume(resumed.get());
    EXPECT_EQ(second.waitFor(1), Statuses{1});
    EXPECT_EQ(first.waitFor(0), Statuses{});
    RPRegistrationInvalidate(idle.get());
    RPRegistrationResume(idle.get());
    idle.reset(); // the thread that delivers has ended
    EXPECT_EQ(first.waitFor(0), Statuses{});
}

TEST_F(ReverseProxy, anEventThatIsMinutesAwayHoldsUpNeitherInvalidationNorRelease) {
    describe(R"({"events": [{"status": 7}, {"status": 1, "afterMs": 600000}]})");
    for (const bool invalidated : {true, false}) {
        Deliveries deliveries;
        RegistrationPtr proxy = registration(deliveries);
        ASSERT_NE(proxy, nullptr);
        RPRegistrationResume(proxy.get());
        EXPECT_EQ(deliveries.waitFor(1), Statuses{7});
        const Clock::time_point start = Clock::now();
        if (invalidated)
            RPRegistrationInvalidate(proxy.get());
        proxy.reset();
        EXPECT_LT(Clock::now() - start, 1min);
        EXPECT_EQ(deliveries.waitFor(1), Statuses{7});
    }
}

TEST_F(ReverseProxy, theSettingsAreReadAtEachQuery) {
    describe(R"({"proxy": {"HTTPSEnable": 1, "HTTPSProxy": {"$file": "/host", "as": "text"}}})");
    for (const char* host : {"127.0.0.1", "::1"}) {
        root_.write("/host", host);
        EXPECT_EQ(RPCopyProxyDictionaryWithOptions("https://a", {}),
                  Value(Value::Dictionary{{"HTTPSEnable", 1}, {"HTTPSProxy", host}}));
    }
}

} // namespace
