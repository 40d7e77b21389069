#include "platform/linux/system/DelayedCalls.h"

#include <utility>

DelayedCalls::~DelayedCalls() {
    stop();
    if (thread_.joinable())
        thread_.join();
}

void DelayedCalls::add(Clock::time_point due, Call call) {
    const std::lock_guard lock(mutex_);
    if (!thread_.joinable())
        thread_ = std::thread(&DelayedCalls::run, this);
    calls_.emplace(due, std::move(call));
    changed_.notify_one();
}

void DelayedCalls::run() {
    while (const Call call = next())
        call();
}

// Waits for the next call that is due; empty at the end.
DelayedCalls::Call DelayedCalls::next() {
    const std::stop_token stop = stopped_.get_token();
    std::unique_lock lock(mutex_);
    while (!stop.stop_requested()) {
        if (calls_.empty()) {
            changed_.wait(lock, stop, [this] { return !calls_.empty(); });
            continue;
        }
        const auto first = calls_.begin();
        const Clock::time_point due = first->first;
        if (due <= Clock::now())
            return calls_.extract(first).mapped();
        changed_.wait_until(lock, stop, due, [this, due] { return calls_.begin()->first < due; });
    }
    return {};
}
