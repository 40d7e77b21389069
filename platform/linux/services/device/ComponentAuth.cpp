#include "platform/ComponentAuth.h"

#include <algorithm>
#include <chrono>
#include <exception>
#include <limits>
#include <optional>
#include <string>
#include <string_view>
#include <system_error>
#include <utility>

#include <openssl/bio.h>
#include <openssl/crypto.h>
#include <openssl/evp.h>
#include <openssl/pem.h>

#include "platform/Files.h"
#include "platform/HardwareRegistry.h"
#include "platform/SystemLog.h"
#include "platform/linux/services/device/DeviceDescription.h"
#include "platform/linux/services/device/X509Certificate.h"
#include "platform/linux/system/DelayedCalls.h"

namespace {

using openssl::Owner;
using Status = ComponentAuthService::Status;

constexpr std::chrono::milliseconds longestDelay = std::chrono::hours(1);

DelayedCalls& serviceThread() {
    // The cryptographic library is set up first, so that it is torn down after the thread has ended. Without an option
    // it would put that off until its first use, on the thread.
    static const auto shared = [] {
        OPENSSL_init_crypto(OPENSSL_INIT_LOAD_CRYPTO_STRINGS, nullptr);
        return std::make_unique<DelayedCalls>();
    }();
    return *shared;
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

// The chip's signature over the challenge, with the default digest of the kind of its key; nothing when the key
// does not sign.
std::optional<Value::Data> sign(EVP_PKEY* key, const Value::Data& challenge) {
    const DigestContext context(EVP_MD_CTX_new());
    Value::Data signature(static_cast<std::size_t>(EVP_PKEY_get_size(key))); // of the longest
    std::size_t length = signature.size();
    if (!context || EVP_DigestSignInit_ex(context.get(), nullptr, nullptr, nullptr, nullptr, key, nullptr) != 1 ||
        EVP_DigestSign(context.get(), signature.data(), &length, challenge.data(), challenge.size()) != 1)
        return std::nullopt;
    signature.resize(length);
    return signature;
}

bool verify(EVP_PKEY* key, const Value::Data& challenge, const Value::Data& signature) {
    const DigestContext context(EVP_MD_CTX_new());
    return context && EVP_DigestVerifyInit_ex(context.get(), nullptr, nullptr, nullptr, nullptr, key, nullptr) == 1 &&
           EVP_DigestVerify(context.get(), signature.data(), signature.size(), challenge.data(), challenge.size()) == 1;
}

// The bytes of the certificate in the hardware registry, or nothing.
Value moduleCertificate() {
    using namespace HardwareRegistry;
    for (const char* className : {"TeskAuthI2CRelayInterface", "TevariAuthCPAID"})
        if (const HeldService service(getMatchingService(serviceMatching(className))); service.handle != 0)
            return searchProperty(service.handle, servicePlane, "AccessoryCertificate", searchRecursively);
    return {};
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
        certificate = CertificateService::copyFirstCertificate(*bytes);
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
    const DelayedCalls::Clock::time_point due = DelayedCalls::Clock::now() + delayOf(chip);
    try {
        serviceThread().add(due, [chip = std::move(chip), challenge, completion = std::move(completion)] {
            try {
                const Outcome outcome = authenticate(chip, challenge);
                completion(outcome.passed, outcome.signature, outcome.certificate, outcome.isVerified, outcome.status);
            } catch (const std::exception& failure) {
                consoleLog(std::string("Component authentication was given up: ") + failure.what());
            }
        });
    } catch (const std::system_error& failure) { // no thread: as a chip that never answers
        consoleLog(std::string("Component authentication cannot start: ") + failure.what());
    }
}
