#include <algorithm>
#include <optional>
#include <string_view>

#include "Daemon/Conversions.h"
#include "device/ZPDevice.h"
#include "orlo/OrloSession.h"
#include "orlo/ZPOrlo.h"
#include "plugin/Commands.h"

namespace {

constexpr const char* dataClass = "tcrt";
constexpr const char* unreadableSerialNumber = "DummyCertificateSerialNumber";

constexpr std::string_view modelsWithCertificate[] = {"M3", "M8", "M9", "M4", "M11", "M12"};

bool hasCertificate(const Value& hardwareModel) {
    return std::any_of(std::begin(modelsWithCertificate), std::end(modelsWithCertificate),
                       [&](std::string_view prefix) { return modelContains(hardwareModel, prefix); });
}

HSMessageResponse failure(const HSMessageRequest& request, std::optional<Error> error) {
    return HSMessageResponse::initWithName(request.messageStr, -1, {}, std::move(error));
}

// What "getTCRT" answers about a certificate.
Value::Dictionary describeCertificate(const Value& certificate) {
    Value::Dictionary description;
    if (Value text = DatatoHexString(certificate); !text.isNothing())
        description["CertData"] = std::move(text);
    Value serialNumber = ZPDevice::sharedSingleton().getCertificateSerialNumber(certificate);
    description["CertSerialNumber"] = serialNumber.isNothing() ? unreadableSerialNumber : std::move(serialNumber);
    return description;
}

} // namespace

HSMessageResponse getTCRT(const HSMessageRequest& request, const Value& hardwareModel) {
    serviceLog.info("%s:%d - Received getTCRT", handlerName, __LINE__);
    if (!hasCertificate(hardwareModel))
        return HSMessageResponse::initWithName(request.messageStr, -1);
    Value certificate;
    if (auto error = ZPDevice::sharedSingleton().getTcrtCertificate(&certificate))
        return failure(request, std::move(error));
    return HSMessageResponse::initWithName(request.messageStr, 0, describeCertificate(certificate));
}

HSMessageResponse putTCRT(const HSMessageRequest& request, const Value&) {
    const ZPDevice& device = ZPDevice::sharedSingleton();
    if (!device.authenticateDisplay()) {
        serviceLog.error("Top Module Authentication Failed. Failing the test");
        return failure(request, Error{"TcrtAuthErrorDomain", 401, "Top Module Tesk Authentication Failed"});
    }
    Value certificate;
    if (auto error = device.getTcrtCertificate(&certificate))
        return failure(request, std::move(error));

    ZPOrlo orlo = ZPOrlo::init();
    const Value screen = device.getScreenSerialNumber();
    const Value chip = device.getTopModuleChipID();
    const Value instance = joinedInstance(screen, chip);
    serviceLog.info("tcrt- : %@", instance);
    if (auto error = orlo.orloPut(dataClass, instance, *certificate.data(), nullptr))
        return failure(request, std::move(error));
    return HSMessageResponse::initWithName(request.messageStr, 0, {});
}
