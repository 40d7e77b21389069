// The service on D-Bus: one request to the plug-in, and what the service says of itself.
#ifndef VELTRA_TOOLS_ORLOCTL_CLIENT_H
#define VELTRA_TOOLS_ORLOCTL_CLIENT_H

#include <chrono>
#include <optional>
#include <string>

#include <sys/types.h>

#include "platform/Value.h"
#include "tools/orloctl/Report.h"

struct Answer {
    Report report = {};  // with what the plug-in sent under "response"; that is empty unless it answered
    Value response = {}; // the same
    // The user whom the bus names as the one who runs the service that answered; none when it has left meanwhile.
    std::optional<uid_t> serviceUser = {};
    std::string reasons = {}; // a sentence that says where the service has said why it answered so
};

struct ServiceAddress {
    std::string bus = "system"; // "system", "session" or a D-Bus address
    std::chrono::seconds timeout{600};
    std::chrono::steady_clock::time_point start = std::chrono::steady_clock::now();
    bool json = false;    // whether one JSON object is all that is printed
    bool verbose = false; // whether each message of the request is printed

    std::chrono::steady_clock::time_point deadline() const { return start + timeout; }
};

// A message of a request as a line; what the text has of line ends is indented, so that it cannot pass for another
// line.
std::string messageLine(const std::string& source, const std::string& text);

// Why a wait ended without an answer, the beginning of a sentence: an interruption, or else that time is up.
std::string noAnswerReason(const ServiceAddress& address);

// Sends `command` with `arguments` and waits for the answer. The report has the messages of the request that may be the
// reasons of a failure, or all with `verbose`, which has them printed on standard error as they come. On a terminal,
// standard error shows the last one and the time that has passed, or which request is still ahead. When the time is up,
// and at SIGINT, SIGTERM or SIGHUP, the problem says whether the service goes on with the request.
Answer sendRequest(const ServiceAddress& address, const std::string& command, const Value::Dictionary& arguments);

// Whether the service runs, and what it says of itself. It is not started for that.
Report askStatus(const ServiceAddress& address);

#endif
