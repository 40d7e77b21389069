// Where an HTTP client is between two users, so that the next one finds its connections.
#ifndef VELTRA_PLATFORM_LINUX_CLIENT_SHELF_H
#define VELTRA_PLATFORM_LINUX_CLIENT_SHELF_H

#include <chrono>
#include <memory>
#include <mutex>

#include "platform/linux/services/http/Http.h"
#include "platform/linux/system/DelayedCalls.h"

namespace http {

// Keeps one client. Any thread.
class ClientShelf {
public:
    using Clock = DelayedCalls::Clock;

    struct Loan {
        std::unique_ptr<Client> client;
        Clock::time_point made;
    };

    // A client that nobody takes is closed after `longestIdle`, by a thread of the shelf's own. One that was made
    // `longestLife` ago is kept no more, so that servers are looked up, and their certificates verified, anew.
    ClientShelf(Clock::duration longestIdle, Clock::duration longestLife);

    // The client that is kept, if it goes this way, else a new one; one that goes another way is closed.
    Loan take(Way way);

    // Keeps the client in place of another one, unless its last exchange failed or there can be no thread.
    void put(Loan loan) noexcept;

private:
    void watchUntil(Clock::time_point due);
    void closeIdle() noexcept;

    const Clock::duration longestIdle_, longestLife_;
    std::mutex mutex_; // guards what follows
    Loan kept_;
    Clock::time_point left_;
    bool isWatched_ = false;

    DelayedCalls calls_; // last, so that it ends before what it uses
};

} // namespace http

#endif
