#include "tests/platform/ServicesDouble.h"

#include <utility>

#include "platform/CertificateService.h"
#include "platform/DeviceAnswers.h"
#include "platform/Error.h"
#include "platform/HardwareRegistry.h"

namespace {

Value look(const std::map<std::string, Value, std::less<>>& answers, const char* operation, std::string_view key) {
    servicesDouble().calls.push_back(operation + std::string(" ") + std::string(key));
    const auto found = answers.find(key);
    return found == answers.end() ? Value() : found->second;
}

// What is prepared for these bytes, or null.
template <class Prepared>
const Prepared* lookUp(const std::vector<std::pair<Value::Data, Prepared>>& prepared, const Value::Data& bytes) {
    for (const auto& [key, value] : prepared)
        if (key == bytes)
            return &value;
    return nullptr;
}

} // namespace

ServicesDouble& servicesDouble() {
    static ServicesDouble instance;
    return instance;
}

constexpr std::string_view MiravelSNKey = "MiravelSNKey";
constexpr std::string_view CoverGlassSNKey = "CoverGlassSNKey";
constexpr std::string_view ALSSNKey = "ALSSNKey";
constexpr std::string_view FCAMModuleSNKey = "FCAMModuleSNKey";
constexpr std::string_view VanterChipIDKey = "VanterChipIDKey";
constexpr std::string_view VanterUIDKey = "VanterUIDKey";
constexpr std::string_view LoddenChipIDKey = "LoddenChipIDKey";
constexpr std::string_view LoddenUIDKey = "LoddenUIDKey";

Value KACopyAnswer(std::string_view key, const Value&) {
    return look(servicesDouble().answers, "KACopyAnswer", key);
}

Value KACopyAnswerWithError(std::string_view key, const Value&, Error*) {
    return look(servicesDouble().answers, "KACopyAnswerWithError", key);
}

Value TansuCopyValueWithError(std::string_view key, const Value&, Error*) {
    return look(servicesDouble().tansu, "TansuCopyValueWithError", key);
}

Value HardwareRegistry::serviceMatching(std::string_view className) {
    servicesDouble().calls.push_back("serviceMatching " + std::string(className));
    return servicesDouble().unmatchableClasses.contains(className) ? Value() : Value(className);
}

HardwareRegistry::Service HardwareRegistry::getMatchingService(Value matching) {
    ServicesDouble& services = servicesDouble();
    services.calls.push_back("getMatchingService " + *matching.text());
    if (!services.registry.contains(*matching.text()))
        return 0;
    const Service handle = services.heldServices.empty() ? 7 : services.heldServices.rbegin()->first + 1;
    services.heldServices[handle] = *matching.text();
    return handle;
}

Value HardwareRegistry::searchProperty(Service service, std::string_view plane, std::string_view key,
                                       std::uint32_t options) {
    ServicesDouble& services = servicesDouble();
    services.calls.push_back("searchProperty " + std::string(plane) + " " + std::string(key) + " " +
                             std::to_string(options));
    return services.registry.at(services.heldServices.at(service))[std::string(key)];
}

void HardwareRegistry::releaseService(Service service) {
    servicesDouble().heldServices.erase(service);
}

std::size_t HardwareRegistry::heldServices() {
    return servicesDouble().heldServices.size();
}

struct CertificateService::Certificate {
    Value::Data bytes;
};

std::optional<std::vector<CertificateService::CertificateRef>>
CertificateService::copyCertificatesFromCertsOnlyMessage(const Value::Data& message) {
    const auto* found = lookUp(servicesDouble().messages, message);
    if (!found)
        return std::nullopt;
    std::vector<CertificateRef> certificates;
    for (const Value::Data& bytes : *found)
        certificates.push_back(std::make_shared<const Certificate>(Certificate{bytes}));
    return certificates;
}

CertificateService::CertificateRef CertificateService::createCertificateWithBytes(const std::uint8_t* bytes,
                                                                                  std::size_t length) {
    Certificate certificate{{bytes, bytes + length}};
    if (!lookUp(servicesDouble().serialNumbers, certificate.bytes))
        return nullptr;
    return std::make_shared<const Certificate>(std::move(certificate));
}

std::optional<Value::Data> CertificateService::copySerialNumberData(const CertificateRef& certificate, Error*) {
    const auto* found = certificate ? lookUp(servicesDouble().serialNumbers, certificate->bytes) : nullptr;
    return found ? std::optional(*found) : std::nullopt;
}

ComponentAuthService& ComponentAuthService::sharedManager() {
    static ComponentAuthService shared;
    return shared;
}

void ComponentAuthService::authenticateTouchControllerWithChallenge(const Value& challenge, Completion completion) {
    servicesDouble().calls.push_back("authenticateTouchControllerWithChallenge");
    servicesDouble().authenticate(challenge, std::move(completion));
}
