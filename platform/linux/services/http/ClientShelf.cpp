#include "platform/linux/services/http/ClientShelf.h"

#include <exception>
#include <utility>

namespace http {

ClientShelf::ClientShelf(Clock::duration longestIdle, Clock::duration longestLife)
    : longestIdle_(longestIdle), longestLife_(longestLife) {
    prepare(); // so that what the libraries do at the end of the process comes after the end of a static shelf
}

ClientShelf::Loan ClientShelf::take(Way way) {
    Loan taken;
    {
        const std::lock_guard lock(mutex_);
        taken = std::move(kept_);
    }
    if (taken.client && taken.client->way() == way)
        return taken;
    return {std::make_unique<Client>(std::move(way)), Clock::now()};
}

void ClientShelf::put(Loan loan) noexcept try {
    const Clock::time_point now = Clock::now();
    if (!loan.client->isSound() || now >= loan.made + longestLife_)
        return;
    const std::lock_guard lock(mutex_);
    if (!isWatched_)
        watchUntil(now + longestIdle_);
    std::swap(kept_, loan);
    left_ = now;
} catch (const std::exception&) {
    return; // it is closed, since nothing would close it later
}

void ClientShelf::watchUntil(Clock::time_point due) {
    calls_.add(due, [this] { closeIdle(); });
    isWatched_ = true;
}

void ClientShelf::closeIdle() noexcept {
    Loan idle;
    const std::lock_guard lock(mutex_);
    isWatched_ = false;
    try {
        if (kept_.client && Clock::now() < left_ + longestIdle_)
            return watchUntil(left_ + longestIdle_);
    } catch (const std::exception&) {
        // It is closed early, since nothing would close it later.
    }
    idle = std::move(kept_);
}

} // namespace http
