// Authentication of hardware components by challenge and response.
//
// On Linux the object "componentAuth" of the device description says what the touch controller's chip does:
//   "mode"     "key": it signs the challenge with its private key, and the signature is verified with the public key of
//              the certificate in the hardware registry, as the property "AccessoryCertificate" of the top module's
//              service. "pass" and "fail": the outcome without a signature. "silent": it never answers.
//   "key"      the device path of the private key, an unencrypted PEM file
//   "delayMs"  how long it takes, in milliseconds, at most an hour; 0 when missing
// A device that describes no mode, or an unknown one, does not pass.
#ifndef VELTRA_PLATFORM_COMPONENT_AUTH_H
#define VELTRA_PLATFORM_COMPONENT_AUTH_H

#include <cstdint>
#include <functional>

#include "platform/Value.h"

class ComponentAuthService {
public:
    // What became of an authentication.
    enum Status : std::int32_t {
        Answered = 0,     // the chip answered; `passed` says whether rightly
        NoChallenge = 1,  // there was nothing to sign
        NoSignature = 2,  // the chip has no key, or one that does not sign
        NoCertificate = 3 // the module has no certificate to verify the signature with
    };

    // Whether the component passed, its signature, the certificate bytes that the signature was verified with (nothing
    // each when there is none), whether the outcome rests on a signature, and a Status.
    using Completion = std::function<void(bool passed, const Value& signature, const Value& certificate,
                                          bool isVerified, std::int32_t status)>;

    // The shared instance, made at the first call. Its thread ends with the process; what is not completed by then
    // never is.
    static ComponentAuthService& sharedManager();

    // Starts the authentication of the display's touch controller and returns at once. `completion` is called once,
    // later, on a thread of the service, and must not raise; it may come after the caller has stopped waiting, so what
    // it writes to has to be its own or shared. It is dropped uncalled when the chip never answers. `challenge` is data
    // and is copied. May be called from any thread.
    void authenticateTouchControllerWithChallenge(const Value& challenge, Completion completion);

    ComponentAuthService(const ComponentAuthService&) = delete;
    ComponentAuthService& operator=(const ComponentAuthService&) = delete;

private:
    ComponentAuthService() = default;
    ~ComponentAuthService() = default;
};

#endif
