#include "device/ZPDevice.h"

#include <chrono>
#include <cstring>
#include <memory>
#include <string>
#include <utility>

#include "Daemon/Conversions.h"
#include "Daemon/HSLog.h"
#include "platform/CertificateService.h"
#include "platform/ComponentAuth.h"
#include "platform/Crypto.h"
#include "platform/DeviceAnswers.h"
#include "platform/HardwareRegistry.h"
#include "platform/Semaphore.h"

namespace {

constexpr LogSource zplog{"ZPDevice"};

// The classes of the services that carry a top module's certificate, in the order in which they are tried.
constexpr std::string_view relayClass = "TeskAuthI2CRelayInterface";
constexpr std::string_view authenticatorClass = "TevariAuthCPAID";
constexpr std::string_view certificateKey = "AccessoryCertificate";

constexpr std::chrono::seconds authenticationLimit(10);

// A line about an operation on the system console log.
void trace(const char* operation, const char* message, FormatArgument argument = "", int line = __builtin_LINE()) {
    consoleLine("%s:%d - %s%@", {operation, line, message, argument});
}

Error certificateError(const char* description) {
    return {"TcrtErrorDomain", 400, description};
}

// What an authentication's completion writes. The completion shares it, since it may come when nobody waits any more.
struct Authentication {
    bool passed = false; // written before the signal, read after it or not at all
    CountingSemaphore done;
};

// Has the platform authenticate the touch controller; false also when that takes too long.
bool authenticateTouchController(const Value& challenge) {
    const auto authentication = std::make_shared<Authentication>();
    ComponentAuthService::sharedManager().authenticateTouchControllerWithChallenge(
        challenge, [authentication](bool passed, const Value&, const Value&, bool, std::int32_t) {
            authentication->passed = passed;
            authentication->done.signal();
        });
    if (authentication->done.waitFor(authenticationLimit))
        return authentication->passed;
    zplog.info("Display Auth not completed within %d secs. Timeout has occurred", authenticationLimit.count());
    return false;
}

} // namespace

std::optional<Error> ZPDevice::getService(std::string_view className, std::uint32_t* service) const {
    trace("-[ZPDevice getService:service:]", "Entering for service ", className);
    Value matching = HardwareRegistry::serviceMatching(className);
    if (matching.isNothing()) {
        const Error error = certificateError("can't create matching dict");
        zplog.error("%@", error.text);
        return error;
    }
    const HardwareRegistry::Service found = HardwareRegistry::getMatchingService(std::move(matching));
    if (found == 0) {
        zplog.error("cannot get service");
        return certificateError("cannot get service");
    }
    *service = found;
    return std::nullopt;
}

std::optional<Error> ZPDevice::getTcrtCertificate(Value* certificate) const {
    constexpr const char* operation = "-[ZPDevice getTcrtCertificate:]";
    trace(operation, "Entering");
    HardwareRegistry::HeldService service;
    if (getService(relayClass, &service.handle)) {
        if (auto error = getService(authenticatorClass, &service.handle)) {
            zplog.error("cannot get service. Giving up.");
            return error;
        }
    }
    trace(operation, "IO Service Found ");
    Value property = HardwareRegistry::searchProperty(service.handle, HardwareRegistry::servicePlane, certificateKey,
                                                      HardwareRegistry::searchRecursively);
    if (!property.data()) {
        zplog.error("tcrt is NULL in IOReg");
        return certificateError("tcrt is NULL in IOReg");
    }
    trace(operation, "tcrt Found in IOReg");
    if (certificate)
        *certificate = std::move(property);
    return std::nullopt;
}

Value ZPDevice::getCertificateSerialNumber(const Value& certificate) const {
    const Value::Data* bytes = certificate.data();
    std::optional<Value::Data> serialNumber;
    if (bytes)
        serialNumber =
            CertificateService::copySerialNumberData(CertificateService::copyFirstCertificate(*bytes), nullptr);
    if (!serialNumber) {
        zplog.error("Unable to read Certificate Serial Number");
        return {};
    }
    const Value octets = std::move(*serialNumber);
    zplog.info("Serial Number : %@", octets);
    Value text = DatatoHexString(octets);
    zplog.info("Hex Serial Number : %@", text);
    return text;
}

Value ZPDevice::createChallenge() const {
    constexpr std::size_t draws = 8;
    Value::Data bytes(draws * sizeof(std::uint32_t));
    for (std::size_t i = 0; i < draws; ++i) {
        std::uint32_t random = 0;
        if (!crypto::randomBytes(&random, sizeof random))
            return {};
        std::memcpy(&bytes[i * sizeof random], &random, sizeof random);
    }
    Value challenge = std::move(bytes);
    zplog.info("Challenge : %@", challenge);
    return challenge;
}

bool ZPDevice::authenticateDisplay() const {
    const Value challenge = createChallenge();
    const Value model = KACopyAnswerWithError("HWModelStr", {}, nullptr);
    zplog.info("Hardware Model : %@", model);
    if (!model.text() || model.text()->find("M3") == std::string::npos) {
        zplog.info("Not Applicable. Auth Passsed : %d", 1);
        return true;
    }
    zplog.info("Starting Top Module Auth : %@", model);
    const bool passed = authenticateTouchController(challenge);
    zplog.info("Top Module Auth Passsed : %d", passed ? 1 : 0);
    return passed;
}
