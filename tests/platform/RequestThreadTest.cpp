#include "platform/linux/services/bus/RequestThread.h"

#include <functional>
#include <new>
#include <optional>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include <gtest/gtest.h>
#include <poll.h>

namespace {

using Lines = std::vector<std::string>;

// A plug-in server that does as the test says, and what the thread of the bus takes from it, as lines.
class RequestThreadTest : public testing::Test, protected VeltraPluginServerInterface, protected RequestReceiver {
protected:
    ~RequestThreadTest() override { thread.end(); }

    void handleMessage(const HSMessageRequest& request, const HSCompletion& completion) override {
        const auto serving = std::move(work); // the next request may come before this one is left
        serving(request.messageStr.description(), completion);
    }

    void receive(const RequestMessage& message) override {
        taken.push_back(std::to_string(message.level) + " " + message.source + ": " + message.text.substr(0, 20));
    }

    void receive(const RequestEnding& ending) override {
        if (refuses && ending.response && ending.response->value().statusCode() == 0)
            throw std::bad_alloc();
        try {
            if (ending.failure)
                std::rethrow_exception(ending.failure);
            const std::string status = std::to_string(ending.response->value().statusCode());
            taken.push_back((ending.completed ? "completed " : "not completed ") + status);
        } catch (const std::exception& failure) {
            taken.push_back(failure.what());
        }
        hasEnded = true;
    }

    // What comes of one request.
    Lines serve(bool wantsMessages, std::function<void(std::string, const HSCompletion&)> serving) {
        work = std::move(serving);
        taken.clear();
        hasEnded = false;
        thread.serve({"name", {}}, wantsMessages);
        while (!hasEnded) {
            pollfd wakeUp = {thread.wakeUp().get(), POLLIN, 0};
            ::poll(&wakeUp, 1, -1);
            thread.take(*this);
        }
        return taken;
    }

    static std::optional<HSMessageResponse> response(std::int64_t status) {
        return HSMessageResponse::initWithName("name", status);
    }

    std::function<void(std::string, const HSCompletion&)> work;
    Lines taken;
    bool hasEnded = false;
    bool refuses = false;
    RequestThread thread{*this};
};

TEST_F(RequestThreadTest, messagesAreBoundedAndComeBeforeTheEndingAndNoneBehindIt) {
    const std::string filling(RequestThread::maximumMessageOctets - 3 * RequestThread::octetsBesideText -
                                  std::string("ZPOrlofirstframeworkname").size(),
                              'x');
    const auto talk = [&](const std::string& name, const HSCompletion& completion) {
        thread.addMessage(2, "ZPOrlo", "first");
        std::thread([&] { thread.addMessage(4, "framework", name); }).join(); // as a callback of a service does
        thread.addMessage(2, "", filling);
        thread.addMessage(2, "", "");
        completion(true, response(0));
        thread.addMessage(2, "ZPOrlo", "late");
    };
    const Lines all = {"2 ZPOrlo: first", "4 framework: name", "2 : " + filling.substr(0, 20), "completed 0"};
    EXPECT_EQ(serve(true, talk), all);
    EXPECT_EQ(serve(false, talk), Lines{"completed 0"});
    EXPECT_EQ(serve(true, talk), all);
}

TEST_F(RequestThreadTest, everyRequestEndsOnceHoweverItsServingGoes) {
    refuses = true;
    EXPECT_EQ(serve(true,
                    [&](const std::string&, const HSCompletion& completion) {
                        EXPECT_THROW(completion(true, response(0)), std::bad_alloc);
                        thread.addMessage(4, "ZPOrlo", "still in hand");
                        completion(true, response(-1));
                        throw std::runtime_error("too late to matter");
                    }),
              (Lines{"4 ZPOrlo: still in hand", "completed -1"}));
    EXPECT_EQ(serve(false, [](const std::string&, const HSCompletion&) {}), Lines{"The request was not completed."});
    EXPECT_EQ(serve(false, [](const std::string&, const HSCompletion&) { throw std::runtime_error("broken"); }),
              Lines{"broken"});
}

} // namespace
