// A scripted double of the device's services: it records each call and hands out prepared answers. A test that links
// the library services-double gets it in place of the real services.
#ifndef VELTRA_TESTS_SERVICES_DOUBLE_H
#define VELTRA_TESTS_SERVICES_DOUBLE_H

#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "platform/ComponentAuth.h"
#include "platform/Error.h"
#include "platform/Value.h"

// The reverse proxy. `events` are delivered on a thread of their own from resume on, the others while the registration
// is being invalidated.
struct ReverseProxyDouble {
    struct Event {
        std::int32_t status;
        std::chrono::milliseconds after{0}; // resume
    };
    bool refusesRegistration = false;
    std::vector<Event> events = {};
    std::vector<std::int32_t> eventsAtInvalidation = {};
    Value proxy = {};
    std::function<void(std::int32_t)> callback = {}; // the one registered last, to be called at any later time
};

// What a step of the updater answers.
struct UpdaterStep {
    bool result = true;
    Value output = {};
    std::optional<Error> error = {};
};

// The updater. It answers as scripted; a step that takes options keeps them.
struct UpdaterDouble {
    UpdaterStep create, isDone{.result = false}, queryInfo, performNextStage;
    Value createOptions, nextStageOptions;
};

// The pairing library. Pairing calls the callback once for each ticket and keeps the results.
struct PairingDouble {
    struct Ticket {
        std::string bytes;
        std::optional<std::size_t> length = {}; // of the bytes unless it says otherwise
    };
    bool result = true;
    std::optional<Error> error = {};
    std::vector<Ticket> tickets = {};
    std::vector<std::int32_t> loadResults = {};
};

struct ServicesDouble {
    std::map<std::string, Value, std::less<>> answers; // of the device-answer service, by key
    std::map<std::string, Value, std::less<>> tansu;   // of the Tansu service, by key

    // Of the hardware registry: the properties of its services, by class; the classes that nothing can match; and the
    // classes of the services that are held, by handle.
    std::map<std::string, std::map<std::string, Value, std::less<>>, std::less<>> registry;
    std::set<std::string, std::less<>> unmatchableClasses;
    std::map<std::uint32_t, std::string> heldServices;

    // Of the certificate service: the certificates of each certificates-only message, and what is a certificate with
    // which serial number.
    std::vector<std::pair<Value::Data, std::vector<Value::Data>>> messages;
    std::vector<std::pair<Value::Data, Value::Data>> serialNumbers;

    // Of the component authentication service: what it does with a challenge and the completion.
    std::function<void(const Value& challenge, ComponentAuthService::Completion completion)> authenticate;

    ReverseProxyDouble reverseProxy;
    UpdaterDouble updater;
    PairingDouble pairing;
    std::vector<std::string> calls; // "<operation> <argument>", in order
};

// The one that the services use. Assign a fresh one at the start of a test.
ServicesDouble& servicesDouble();

#endif
