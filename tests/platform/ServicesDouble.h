// A scripted double of the device's services: it records each call and hands out prepared answers. A test that links
// the library services-double gets it in place of the real services.
#ifndef VELTRA_TESTS_SERVICES_DOUBLE_H
#define VELTRA_TESTS_SERVICES_DOUBLE_H

#include <cstdint>
#include <functional>
#include <map>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "platform/ComponentAuth.h"
#include "platform/Value.h"

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

    std::vector<std::string> calls; // "<operation> <argument>", in order
};

// The one that the services use. Assign a fresh one at the start of a test.
ServicesDouble& servicesDouble();

#endif
