// The host plug-in framework: delivers requests to the plug-in and takes its responses.
#ifndef VELTRA_PLATFORM_HOST_FRAMEWORK_H
#define VELTRA_PLATFORM_HOST_FRAMEWORK_H

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "platform/Error.h"
#include "platform/SystemLog.h"
#include "platform/Value.h"

// A request as the host sent it. Read only.
struct HSMessageRequest {
    Value messageStr;  // the command name; nothing when the host sent none
    Value messageDict; // the command's arguments, a dictionary; nothing when the host sent none

    // Command and dictionary on one line, for the log.
    std::string description() const {
        return Value::descriptionOf({{"messageDict", &messageDict}, {"messageStr", &messageStr}});
    }
};

// A response. Its name is that of the request; statusCode is 0 or -1; response is a dictionary or nothing.
class HSMessageResponse {
public:
    static HSMessageResponse initWithName(Value name, std::int64_t statusCode, Value response = {},
                                          std::optional<Error> error = {}) {
        return {std::move(name), statusCode, std::move(response), std::move(error)};
    }

    const Value& name() const { return name_; }
    std::int64_t statusCode() const { return statusCode_; }
    const Value& response() const { return response_; }
    const std::optional<Error>& error() const { return error_; }

private:
    HSMessageResponse(Value name, std::int64_t statusCode, Value response, std::optional<Error> error)
        : name_(std::move(name)), statusCode_(statusCode), response_(std::move(response)), error_(std::move(error)) {}

    Value name_;
    std::int64_t statusCode_;
    Value response_;
    std::optional<Error> error_;
};

// Completes a request: whether it was completed, and the response object, if there is one. Once it raises
// std::bad_alloc the request is not completed and may be, with a smaller response.
using HSCompletion = std::function<void(bool completed, const std::optional<HSMessageResponse>& response)>;

// The framework's own handle of the system log, for lines that do not belong in the plug-in's log. It has one handle,
// number 1; null for every other number. Any thread.
SystemLog* getLogHandle(int number);

// What a plug-in server offers to the framework.
class VeltraPluginServerInterface {
public:
    virtual ~VeltraPluginServerInterface() = default;

    // Serves one request. Calls `completion` exactly once, before it returns, on the calling thread.
    virtual void handleMessage(const HSMessageRequest& request, const HSCompletion& completion) = 0;
};

// Base of a plug-in server. On Linux the framework is a D-Bus service, as platform/linux/services/bus/HostFramework.cpp
// says.
class VeltraPluginServer : public VeltraPluginServerInterface {
public:
    VeltraPluginServer() = default;
    VeltraPluginServer(const VeltraPluginServer&) = delete;
    VeltraPluginServer& operator=(const VeltraPluginServer&) = delete;
    ~VeltraPluginServer() override;

    // Serves requests, one at a time and in order, on a thread of the framework's own, while the calling thread answers
    // what the host asks about the service. Ends the process after the request in hand: with status 0 when SIGTERM or
    // SIGINT arrives, and with status 1 and a line on standard error when the host is lost.
    void resume();

protected:
    // Registers the server, of this version, with the host under `serviceName`, and sets up for its requests what they
    // would otherwise set up at their first use. False, after a line on standard error, when there is no device root,
    // no host to reach, the name is taken, or cryptography is not to be had.
    bool initWithServiceName(std::string_view serviceName, std::string_view version);

private:
    struct Connection;
    [[maybe_unused]] Connection* connection_ = nullptr; // not used in a program that brings its own host
};

#endif
