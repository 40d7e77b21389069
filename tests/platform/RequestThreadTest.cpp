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

using Response = std::optional<HSMessageResponse>;

// A plug-in server that does as the test says, and what the thread of the bus takes from it, as lines.
class RequestThreadTest : public testing::Test, protected VeltraPluginServerInterface, protected RequestReceiver {
protected:
    ~RequestThreadTest() override { thread.end(); }

    void handleMessage(const HSMessageRequest& request, const HSCompletion& completion) override {
        const auto serving = std::move(work); // the next request may come before this one is left
        serving(request.messageStr.description(), completion);
    }

    void receive(const RequestMessage& message) override {
        taken.push_back(std::to_string(message.level) + " " + message.source + ": " + message.text);
    }

    void receive(const RequestEnding& ending) override {
        if (refuses && ending.response && ending.response->value().statusCode() == 0)
            throw std::bad_alloc();
        std::string how = ending.completed ? "completed" : "not completed";
        try {
            if (ending.failure)
                std::rethrow_exception(ending.failure);
            how += " " + std::to_string(ending.response->value().statusCode());
        } catch (const std::exception& failure) {
            how = failure.what();
        }
        taken.push_back(how);
        hasEnded = true;
    }

    // What comes of one request.
    std::vector<std::string> serve(bool wantsMessages, std::function<void(std::string, const HSCompletion&)> serving) {
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

    static Response response(std::int64_t status) { return HSMessageResponse::initWithName("name", status); }

    std::function<void(std::string, const HSCompletion&)> work;
    std::vector<std::string> taken;
    bool hasEnded = false;
    bool refuses = false;
    RequestThread thread{*this};
};

using Lines = std::vector<std::string>;

TEST_F(RequestThreadTest, messagesComeBeforeTheEndingAndNoneBehindIt) {
    const auto talk = [&](const std::string& name, const HSCompletion& completion) {
        thread.addMessage(2, "ZPOrlo", "first");
        std::thread([&] { thread.addMessage(4, "framework", name); }).join(); // as a callback of a service does
        completion(true, response(0));
        thread.addMessage(2, "ZPOrlo", "late");
    };
    const Lines all = {"2 ZPOrlo: first", "4 framework: name", "completed 0"};
    EXPECT_EQ(serve(true, talk), all);
    EXPECT_EQ(serve(false, talk), Lines{"completed 0"});
    EXPECT_EQ(serve(true, talk), all);
}

TEST_F(RequestThreadTest, messagesAreBoundedForEachRequest) {
    for (int i = 0; i < 2; ++i) {
        serve(true, [&](const std::string&, const HSCompletion& completion) {
            const std::string half(RequestThread::maximumMessageOctets / 2, 'x');
            for (int line = 0; line < 3; ++line)
                thread.addMessage(2, "", half);
            completion(true, response(0));
        });
        EXPECT_EQ(taken.size(), 3u); // two messages, and the ending
    }
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
