#include "platform/linux/services/bus/RequestThread.h"

#include <cerrno>
#include <stdexcept>
#include <system_error>
#include <utility>

#include <sys/eventfd.h>

namespace {

FileDescriptor makeWakeUp() {
    FileDescriptor made(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
    if (!made)
        throw std::system_error(errno, std::generic_category());
    return made;
}

} // namespace

RequestThread::RequestThread(VeltraPluginServerInterface& server)
    : server_(server), wakeUp_(makeWakeUp()), thread_(&RequestThread::run, this) {}

void RequestThread::end() {
    {
        const std::lock_guard lock(mutex_);
        isOver_ = true;
    }
    changed_.notify_all();
    thread_.join();
}

void RequestThread::serve(HSMessageRequest request, bool wantsMessages) {
    {
        const std::lock_guard lock(mutex_);
        next_.emplace(Request{std::move(request), wantsMessages});
    }
    changed_.notify_all();
}

void RequestThread::take(RequestReceiver& receiver) {
    eventfd_t count = 0;
    ::eventfd_read(wakeUp_.get(), &count);
    std::unique_lock lock(mutex_);
    const std::vector<RequestMessage> messages = std::exchange(messages_, {});
    const RequestEnding* const ending = ending_;
    lock.unlock();
    for (const RequestMessage& message : messages)
        receiver.receive(message);
    if (!ending)
        return;
    std::exception_ptr refusal;
    try {
        receiver.receive(*ending);
    } catch (...) {
        refusal = std::current_exception();
    }
    lock.lock();
    if (!refusal) { // what was added meanwhile comes too late
        wantsMessages_ = false;
        messages_.clear();
    }
    refusal_ = refusal;
    ending_ = nullptr;
    lock.unlock();
    changed_.notify_all();
}

void RequestThread::addMessage(int level, std::string_view source, std::string_view text) noexcept try {
    const std::size_t octets = octetsBesideText + source.size() + text.size();
    const std::lock_guard lock(mutex_);
    if (!wantsMessages_ || octets > maximumMessageOctets - messageOctets_)
        return;
    messages_.push_back({level, std::string(source), std::string(text)});
    messageOctets_ += octets;
    wake();
} catch (const std::exception&) {
    return; // one that memory does not suffice for is left out, as in the log
}

void RequestThread::run() {
    std::unique_lock lock(mutex_);
    while (true) {
        changed_.wait(lock, [this] { return next_ || isOver_; });
        if (!next_)
            return;
        const Request request = std::move(*next_);
        next_.reset();
        wantsMessages_ = request.wantsMessages;
        messageOctets_ = 0;
        lock.unlock();
        serveOne(request.message);
        lock.lock();
    }
}

void RequestThread::serveOne(const HSMessageRequest& request) {
    bool hasEnded = false;
    RequestEnding failed;
    try {
        server_.handleMessage(request, [&](bool completed, const std::optional<HSMessageResponse>& response) {
            complete({completed, &response, {}});
            hasEnded = true;
        });
        failed.failure = std::make_exception_ptr(std::runtime_error("The request was not completed."));
    } catch (...) {
        failed.failure = std::current_exception();
    }
    if (!hasEnded)
        complete(failed);
}

// Waits until the ending is taken, the response from where it lies.
void RequestThread::complete(const RequestEnding& ending) {
    std::unique_lock lock(mutex_);
    ending_ = &ending;
    lock.unlock(); // the thread of the bus, which wakes up at once, is not to wait for it
    wake();
    lock.lock();
    changed_.wait(lock, [this] { return !ending_; });
    if (refusal_)
        std::rethrow_exception(std::exchange(refusal_, {}));
}

void RequestThread::wake() {
    ::eventfd_write(wakeUp_.get(), 1);
}
