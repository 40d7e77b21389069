#include "platform/ComponentAuth.h"

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <exception>
#include <limits>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <system_error>
#include <thread>
#include <utility>

#include <openssl/bio.h>
#include <openssl/crypto.h>
#include <openssl/evp.h>
#include <openssl/pem.h>

#include "platform/Files.h"
#include "platform/HardwareRegistry.h"
#include "platform/SystemLog.h"
#include "platform/linux/services/DeviceDescription.h"
#include "platform/linux/services/X509Certificate.h"

namespace {

using openssl::Owner;
using Clock = std::chrono::steady_clock;
using Status = ComponentAuthService::Status;

constexpr std::chrono::milliseconds longestDelay = std::chrono::hours(1);

// One thread that runs each task when it is due. Tasks that are not due when the process ends are dropped.
class TaskThread {
public:
    using Task = std::function<void()>;

    // The cryptographic library is set up first, so that it is torn down after the thread has ended. Without an option
    // it would put that off until its first use, on the thread.
    TaskThread() { OPENSSL_init_crypto(OPENSSL_INIT_LOAD_CRYPTO_STRINGS, nullptr); }

    void runAt(Clock::time_point due, Task task) {
        const std::lock_guard lock(mutex_);
        if (!thread_.joinable())
            thread_ = std::jthread([this](const std::stop_token& stop) { run(stop); });
        tasks_.emplace(due, std::move(task));
        changed_.notify_one();
    }

private:
    void run(const std::stop_token& stop) {
        while (const Task task = next(stop)) {
            try {
                task();
            } catch (const std::exception& failure) {
                consoleLog(std::string("Component authentication was given up: ") + failure.what());
            }
        }
    }

    // Waits for the next task that is due; empty at the end.
    Task next(const std::stop_token& stop) {
        std::unique_lock lock(mutex_);
        while (!stop.stop_requested()) {
            if (tasks_.empty()) {
                changed_.wait(lock, stop, [this] { return !tasks_.empty(); });
                continue;
            }
            const auto first = tasks_.begin();
            const Clock::time_point due = first->first;
            if (due <= Clock::now())
                return tasks_.extract(first).mapped();
            changed_.wait_until(lock, stop, due, [this, due] { return tasks_.begin()->first < due; });
        }
        return {};
    }

    std::mutex mutex_;
    std::condition_variable_any changed_;
    std::multimap<Clock::time_point, Task> tasks_;
    std::jthread thread_; // last, so that it ends before what it uses
};

TaskThread& serviceThread() {
    static TaskThread shared;
    return shared;
}

using Key = Owner<EVP_PKEY, EVP_PKEY_free>;
using DigestContext = Owner<EVP_MD_CTX, EVP_MD_CTX_free>;

int noPassphrase(char*, int, int, void*) {
    return -1;
}

// The chip's key, or null.
Key readKey(const Value& path) {
    const auto pem = path.text() ? files::readWhole(*path.text()) : std::nullopt;
    if (!pem || pem->size() > static_cast<std::size_t>(std::numeric_limits<int>::max()))
        return nullptr;
    const Owner<BIO, BIO_free_all> reader(BIO_new_mem_buf(pem->data(), static_cast<int>(pem->size())));
    return Key(reader ? PEM_read_bio_PrivateKey(reader.get(), nullptr, noPassphrase, nullptr) : nullptr);
}

// The chip's signature over the challenge, with the digest that is usual for the kind of its key; nothing when the key
// does not sign.
std::optional<Value::Data> sign(EVP_PKEY* key, const Value::Data& challenge) {
    const DigestContext context(EVP_MD_CTX_new());
    std::size_t length = 0;
    if (!context || EVP_DigestSignInit_ex(context.get(), nullptr, nullptr, nullptr, nullptr, key, nullptr) != 1 ||
        EVP_DigestSign(context.get(), nullptr, &length, challenge.data(), challenge.size()) != 1)
        return std::nullopt;
    Value::Data signature(length);
    if (EVP_DigestSign(context.get(), signature.data(), &length, challenge.data(), challenge.size()) != 1)
        return std::nullopt;
    signature.resize(length);
    return signature;
}

bool verify(EVP_PKEY* key, const Value::Data& challenge, const Value::Data& signature) {
    const DigestContext context(EVP_MD_CTX_new());
    return context && EVP_DigestVerifyInit_ex(context.get(), nullptr, nullptr, nullptr, nullptr, key, nullptr) == 1 &&
           EVP_DigestVerify(context.get(), signature.data(), signature.size(), challenge.data(), challenge.size()) == 1;
}

// A service of the hardware registry, held until the end.
struct HeldService {
    explicit HeldService(std::string_view className)
        : handle(HardwareRegistry::getMatchingService(HardwareRegistry::serviceMatching(className))) {}
    ~HeldService() { HardwareRegistry::releaseService(handle); }
    HeldService(const HeldService&) = delete;
    HeldService& operator=(const HeldService&) = delete;

    const HardwareRegistry::Service handle;
};

// The bytes of the certificate in the hardware registry, or nothing.
Value moduleCertificate() {
    for (const char* className : {"TeskAuthI2CRelayInterface", "TevariAuthCPAID"})
        if (const HeldService service(className); service.handle != 0)
            return HardwareRegistry::searchProperty(service.handle, HardwareRegistry::servicePlane,
                                                    "AccessoryCertificate", HardwareRegistry::searchRecursively);
    return {};
}

CertificateService::CertificateRef parseCertificate(const Value::Data& bytes) {
    const auto list = CertificateService::copyCertificatesFromCertsOnlyMessage(bytes);
    return list && !list->empty() ? list->front()
                                  : CertificateService::createCertificateWithBytes(bytes.data(), bytes.size());
}

struct Outcome {
    bool passed = false;
    Value signature = {};
    Value certificate = {};
    bool isVerified = false;
    Status status = Status::Answered;
};

Outcome challengeChip(const Value& keyPath, const Value::Data& challenge) {
    const openssl::QuietErrors quiet;
    const Key key = readKey(keyPath);
    std::optional<Value::Data> signature;
    if (key)
        signature = sign(key.get(), challenge);
    if (!signature)
        return {.status = Status::NoSignature};
    Outcome outcome{.signature = *signature, .certificate = moduleCertificate()};
    CertificateService::CertificateRef certificate;
    if (const Value::Data* bytes = outcome.certificate.data())
        certificate = parseCertificate(*bytes);
    EVP_PKEY* const publicKey = certificate ? X509_get0_pubkey(certificate->x509.get()) : nullptr;
    if (!publicKey) {
        outcome.status = Status::NoCertificate;
        return outcome;
    }
    outcome.isVerified = true;
    outcome.passed = verify(publicKey, challenge, *signature);
    return outcome;
}

Outcome authenticate(const Value& chip, const Value& challenge) {
    if (!challenge.data() || challenge.data()->empty())
        return {.status = Status::NoChallenge};
    const Value& mode = chip["mode"];
    if (mode == Value("key"))
        return challengeChip(chip["key"], *challenge.data());
    if (mode != Value("pass") && mode != Value("fail"))
        return {.status = Status::NoSignature};
    return {.passed = mode == Value("pass")};
}

std::chrono::milliseconds delayOf(const Value& chip) {
    const std::int64_t given = chip["delayMs"].integer().value_or(0);
    return std::chrono::milliseconds(std::clamp<std::int64_t>(given, 0, longestDelay.count()));
}

} // namespace

ComponentAuthService& ComponentAuthService::sharedManager() {
    static ComponentAuthService shared;
    return shared;
}

void ComponentAuthService::authenticateTouchControllerWithChallenge(const Value& challenge, Completion completion) {
    Value chip = resolveDescribed(deviceDescription()["componentAuth"]);
    if (chip["mode"] == Value("silent"))
        return;
    const Clock::time_point due = Clock::now() + delayOf(chip);
    try {
        serviceThread().runAt(due, [chip = std::move(chip), challenge, completion = std::move(completion)] {
            const Outcome outcome = authenticate(chip, challenge);
            completion(outcome.passed, outcome.signature, outcome.certificate, outcome.isVerified, outcome.status);
        });
    } catch (const std::system_error& failure) { // no thread: as a chip that never answers
        consoleLog(std::string("Component authentication cannot start: ") + failure.what());
    }
}
