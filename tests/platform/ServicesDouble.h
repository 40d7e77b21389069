// A scripted double of the device's services: it records each call and hands out prepared answers. A test that links
// the library services-double gets it in place of the real services.
#ifndef VELTRA_TESTS_SERVICES_DOUBLE_H
#define VELTRA_TESTS_SERVICES_DOUBLE_H

#include <map>
#include <string>
#include <vector>

#include "platform/Value.h"

struct ServicesDouble {
    std::map<std::string, Value, std::less<>> answers; // of the device-answer service, by key
    std::map<std::string, Value, std::less<>> tansu;   // of the Tansu service, by key
    std::vector<std::string> calls;                    // "<operation> <argument>", in order
};

// The one that the services use. Assign a fresh one at the start of a test.
ServicesDouble& servicesDouble();

#endif
