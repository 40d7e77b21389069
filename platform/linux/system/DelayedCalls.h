#ifndef VELTRA_PLATFORM_LINUX_DELAYED_CALLS_H
#define VELTRA_PLATFORM_LINUX_DELAYED_CALLS_H

#include <chrono>
#include <condition_variable>
#include <functional>
#include <map>
#include <mutex>
#include <thread>

// One thread that makes each call when it is due, and of calls that are due at once the one that was added first. A
// call must not raise. At the end, calls that are not due are dropped and one that is under way is waited for.
class DelayedCalls {
public:
    using Clock = std::chrono::steady_clock;
    using Call = std::function<void()>;

    DelayedCalls() = default;
    DelayedCalls(const DelayedCalls&) = delete;
    DelayedCalls& operator=(const DelayedCalls&) = delete;
    ~DelayedCalls();

    // Raises std::system_error when there can be no thread.
    void add(Clock::time_point due, Call call);

    // Makes no further calls. One that is under way is not waited for.
    void stop() { stopped_.request_stop(); }

private:
    void run();
    Call next();

    std::mutex mutex_;
    std::condition_variable_any changed_;
    std::multimap<Clock::time_point, Call> calls_;
    std::stop_source stopped_;
    std::thread thread_;
};

#endif
