// A counting semaphore with a timed wait, to wait for a callback that may never come.
#ifndef VELTRA_PLATFORM_SEMAPHORE_H
#define VELTRA_PLATFORM_SEMAPHORE_H

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <mutex>

// What a thread writes before it signals is seen by the thread whose wait that signal ends. (The standard library's own
// semaphore can miss a wake-up in the releases of GCC that this builds with.)
class CountingSemaphore {
public:
    void signal() {
        const std::lock_guard lock(mutex_);
        ++count_;
        signalled_.notify_one();
    }

    // Waits for a signal at most `limit`, by a clock that nobody can set. False when none came.
    bool waitFor(std::chrono::milliseconds limit) {
        std::unique_lock lock(mutex_);
        if (!signalled_.wait_for(lock, limit, [this] { return count_ > 0; }))
            return false;
        --count_;
        return true;
    }

private:
    std::mutex mutex_;
    std::condition_variable signalled_;
    std::size_t count_ = 0;
};

#endif
