// The thread that serves the host's requests, one at a time, while the thread of the bus goes on.
//
// The bus belongs to one thread alone, so what a request has for it lies here until that thread takes it.
#ifndef VELTRA_PLATFORM_LINUX_REQUEST_THREAD_H
#define VELTRA_PLATFORM_LINUX_REQUEST_THREAD_H

#include <condition_variable>
#include <cstddef>
#include <exception>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "platform/FileDescriptor.h"
#include "platform/HostFramework.h"

// A line that the request in hand has logged.
struct RequestMessage {
    int level;
    std::string source;
    std::string text;
};

// How a request has ended: what the plug-in server completed it with, or, without a response, what it failed with.
struct RequestEnding {
    bool completed = false;
    const std::optional<HSMessageResponse>* response = nullptr;
    std::exception_ptr failure;
};

// What the thread of the bus does with what it takes.
class RequestReceiver {
public:
    virtual void receive(const RequestMessage& message) = 0;

    // May call serve. The completion raises what this raises, and the request is then still in hand; only for one that
    // has failed this raises nothing.
    virtual void receive(const RequestEnding& ending) = 0;

protected:
    ~RequestReceiver() = default;
};

class RequestThread {
public:
    // How many octets of messages one request may have. What comes beyond is left out, so that a receiver which takes
    // nothing costs no more than that.
    static constexpr std::size_t maximumMessageOctets = std::size_t{8} << 20;
    static constexpr std::size_t octetsBesideText = 256; // what a message on its way takes beyond its text

    // Raises std::system_error when there can be no thread.
    explicit RequestThread(VeltraPluginServerInterface& server);

    RequestThread(const RequestThread&) = delete;
    RequestThread& operator=(const RequestThread&) = delete;

    // Has the thread serve `request`, once the one before it has ended, and keep its messages when they are wanted.
    void serve(HSMessageRequest request, bool wantsMessages);

    // Ends the thread. The request in hand must have ended.
    void end();

    // Can be read as long as there is something to take.
    const FileDescriptor& wakeUp() const { return wakeUp_; }

    // Hands over what there is, in its order; at most one ending, behind all its messages.
    void take(RequestReceiver& receiver);

    // Keeps a message of the request in hand, if that wants them. Any thread, also one that serves no request.
    void addMessage(int level, std::string_view source, std::string_view text) noexcept;

private:
    struct Request {
        HSMessageRequest message;
        bool wantsMessages;
    };

    void run();
    void serveOne(const HSMessageRequest& request);
    void complete(const RequestEnding& ending);
    void wake();

    VeltraPluginServerInterface& server_;
    const FileDescriptor wakeUp_;

    std::mutex mutex_; // guards what follows
    std::condition_variable changed_;
    std::optional<Request> next_;
    bool isOver_ = false;
    bool wantsMessages_ = false;
    std::size_t messageOctets_ = 0;
    std::vector<RequestMessage> messages_;
    const RequestEnding* ending_ = nullptr; // until it is taken
    std::exception_ptr refusal_;            // what the receiver of the last ending raised

    std::thread thread_; // last, so that it finds all the others
};

#endif
