#include "tests/platform/ServicesDouble.h"

#include <condition_variable>
#include <mutex>
#include <thread>
#include <utility>

#include "platform/CertificateService.h"
#include "platform/DeviceAnswers.h"
#include "platform/Error.h"
#include "platform/HardwareRegistry.h"
#include "platform/HostFramework.h"
#include "platform/Pairing.h"
#include "platform/Pause.h"
#include "platform/ReverseProxy.h"
#include "platform/VanterUpdater.h"

namespace {

// Raises nothing, since releases are recorded too.
void record(std::string_view call) try { servicesDouble().calls.emplace_back(call); } catch (const std::bad_alloc&) {
    return;
}

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

Value KACopyAnswerWithError(std::string_view key, const Value&, std::optional<Error>*) {
    return look(servicesDouble().answers, "KACopyAnswerWithError", key);
}

Value TansuCopyValueWithError(std::string_view key, const Value&, std::optional<Error>*) {
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

std::optional<Value::Data> CertificateService::copySerialNumberData(const CertificateRef& certificate,
                                                                    std::optional<Error>*) {
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

class RPRegistration {
public:
    explicit RPRegistration(RPAvailabilityCallback callback) : callback_(std::move(callback)) {}
    ~RPRegistration() {
        if (deliverer_.joinable())
            deliverer_.join();
    }

    void resume() {
        deliverer_ = std::thread([this, events = servicesDouble().reverseProxy.events] {
            const auto start = std::chrono::steady_clock::now();
            for (const auto& event : events) {
                std::unique_lock lock(mutex_);
                if (changed_.wait_until(lock, start + event.after, [this] { return invalid_; }))
                    return;
                lock.unlock();
                callback_(event.status);
            }
        });
    }

    void invalidate() {
        {
            const std::lock_guard lock(mutex_);
            invalid_ = true;
            changed_.notify_all();
        }
        for (const std::int32_t status : servicesDouble().reverseProxy.eventsAtInvalidation)
            callback_(status);
    }

private:
    const RPAvailabilityCallback callback_;
    std::mutex mutex_;
    std::condition_variable changed_;
    bool invalid_ = false;
    std::thread deliverer_;
};

RPRegistration* RPRegisterForAvailability(RPAvailabilityCallback callback) {
    record("RPRegisterForAvailability");
    servicesDouble().reverseProxy.callback = callback;
    return servicesDouble().reverseProxy.refusesRegistration ? nullptr : new RPRegistration(std::move(callback));
}

void RPRegistrationResume(RPRegistration* registration) {
    record("RPRegistrationResume");
    registration->resume();
}

void RPRegistrationInvalidate(RPRegistration* registration) {
    record("RPRegistrationInvalidate");
    registration->invalidate();
}

void RPRelease(RPRegistration* registration) {
    record("RPRelease");
    delete registration;
}

Value RPCopyProxyDictionaryWithOptions(const std::string& url, const Value& options) {
    record("RPCopyProxyDictionaryWithOptions " + url + " " + options.description());
    return servicesDouble().reverseProxy.proxy;
}

SystemLog* getLogHandle(int number) {
    return number == 1 ? systemLogCreate("host", "framework") : nullptr;
}

void pauseFor(std::chrono::milliseconds duration) {
    record("pauseFor " + std::to_string(duration.count()));
}

namespace {

bool answer(const PairingDouble& pairing, std::optional<Error>* error) {
    *error = pairing.error;
    return pairing.result;
}

bool answer(const UpdaterStep& step, Value* output, std::optional<Error>* error) {
    if (output)
        *output = step.output;
    *error = step.error;
    return step.result;
}

} // namespace

bool BWCProvisionCorvoWithProxy(const std::string& url, const Value& proxy, std::optional<Error>* error) {
    record("BWCProvisionCorvoWithProxy " + url + " " + proxy.description());
    return answer(servicesDouble().pairing, error);
}

bool BWCPairCorvoWithProxy(const std::string& url, const Value& proxy, std::optional<Error>* error,
                           const BWCPatchLoad& loadPatch) {
    record("BWCPairCorvoWithProxy " + url + " " + proxy.description());
    PairingDouble& pairing = servicesDouble().pairing;
    for (const PairingDouble::Ticket& ticket : pairing.tickets)
        pairing.loadResults.push_back(loadPatch(reinterpret_cast<const std::uint8_t*>(ticket.bytes.data()),
                                                ticket.length.value_or(ticket.bytes.size())));
    return answer(pairing, error);
}

class VanterUpdater {};

VanterUpdater* VanterUpdaterCreate(const Value& options, VanterUpdaterLog log, std::string_view name,
                                   std::optional<Error>* error) {
    record("VanterUpdaterCreate " + std::string(name));
    UpdaterDouble& updater = servicesDouble().updater;
    updater.createOptions = options;
    log("first", "second");
    return answer(updater.create, nullptr, error) ? new VanterUpdater : nullptr;
}

bool VanterUpdaterIsDone(VanterUpdater*, std::optional<Error>* error) {
    record("VanterUpdaterIsDone");
    return answer(servicesDouble().updater.isDone, nullptr, error);
}

bool VanterUpdaterExecCommand(VanterUpdater*, std::string_view step, const Value& options, Value* output,
                              std::optional<Error>* error) {
    record("VanterUpdaterExecCommand " + std::string(step));
    UpdaterDouble& updater = servicesDouble().updater;
    if (step == "queryInfo")
        return answer(updater.queryInfo, output, error);
    updater.nextStageOptions = options;
    return answer(updater.performNextStage, output, error);
}

void VanterUpdaterRelease(VanterUpdater* updater) {
    record("VanterUpdaterRelease");
    delete updater;
}

struct VeltraPluginServer::Connection {};

VeltraPluginServer::~VeltraPluginServer() = default;

bool VeltraPluginServer::initWithServiceName(std::string_view serviceName) {
    record("initWithServiceName " + std::string(serviceName));
    return true;
}

void VeltraPluginServer::resume() {
    record("resume");
}
