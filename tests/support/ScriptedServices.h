// The device's services that a test cannot have for real, scripted: data store, pairing library, updater, reverse
// proxy, pause and host. Each operation is recorded (RecordedLog.h) and does what its outcome says. A test that links
// scripted-services gets them in place of the real ones, and the other services of the device as they are, on a device
// root of the test's own.
#ifndef VELTRA_TESTS_SCRIPTED_SERVICES_H
#define VELTRA_TESTS_SCRIPTED_SERVICES_H

#include <functional>
#include <map>
#include <optional>
#include <string>

#include "platform/Error.h"
#include "platform/ReverseProxy.h"
#include "platform/Value.h"

struct Outcome {
    bool result = true;
    std::optional<Error> error = {};
    Value output = {};       // what it hands out; the statuses that come at a resume or an invalidation; the tickets of
                             // a pairing, of which a number is the length that the library claims
    bool memoryEnds = false; // the next allocation after it fails (FailingAllocation.h)
};

// What each operation does; "queryInfo" and "performNextStage" are those of the updater. One that is missing succeeds
// and hands out nothing.
extern std::map<std::string, Outcome, std::less<>> outcomes;

// Begins anew, with outcomes with which every command succeeds.
void arrangeServices();

// The options of the session that was made last, as they are now, and how many sessions are not released.
extern Value::Dictionary sessionOptions;
extern int liveSessions;

// The callback that was registered last, to be called at any later time.
extern RPAvailabilityCallback availabilityCallback;

#endif
