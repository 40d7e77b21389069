// The device: who it and its replaceable components are.
#ifndef VELTRA_DEVICE_ZPDEVICE_H
#define VELTRA_DEVICE_ZPDEVICE_H

#include <cstdint>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>

#include "platform/DataClasses.h"
#include "platform/Error.h"
#include "platform/Value.h"

// The one place through which the plug-in asks about the device. Nothing is read at construction and nothing is cached:
// every getter asks its service again, so a part that was swapped since the last call is seen. A missing identity is a
// level-4 log line and a result of nothing, never an exception; the caller decides what it means. All operations may be
// called from any thread.
class ZPDevice {
public:
    // The shared instance, made at the first call; also when several threads ask first.
    static ZPDevice& sharedSingleton();

    ZPDevice(const ZPDevice&) = delete;
    ZPDevice& operator=(const ZPDevice&) = delete;

    // The identity of a component; nothing for ComponentIdentity::None.
    Value get(ComponentIdentity identity) const;

    // Identities that are handed back as the service answers them.
    Value getMiravelSerialNumber() const { return get(ComponentIdentity::MiravelSerialNumber); }
    Value getCoverGlassSerialNumber() const { return get(ComponentIdentity::CoverGlassSerialNumber); }
    Value getAmbientLightSensorSerialNumber() const { return get(ComponentIdentity::AmbientLightSensorSerialNumber); }
    Value getFCAMModuleSerialNumber() const { return get(ComponentIdentity::FrontCameraModuleSerialNumber); }
    Value getProxSerialNumber() const { return get(ComponentIdentity::ProximitySensorSerialNumber); }
    Value getBackglassCompassSerialNumber() const { return get(ComponentIdentity::BackglassCompassSerialNumber); }
    Value getScreenSerialNumber() const { return get(ComponentIdentity::ScreenSerialNumber); }
    Value getHardwareModel() const;

    // Identities in the data store's text form (QDOrloCreateInstanceString).
    Value getVanterSerialNumber() const { return get(ComponentIdentity::VanterSerialNumber); }
    Value getVanterChipId() const { return get(ComponentIdentity::VanterChipID); }
    Value getVanterUID() const { return get(ComponentIdentity::VanterUID); }
    Value getLoddenChipID() const { return get(ComponentIdentity::LoddenChipID); }
    Value getLoddenUID() const { return get(ComponentIdentity::LoddenUID); }
    Value getTopModuleChipID() const { return get(ComponentIdentity::TopModuleChipID); }

    // The device's own identity, "<chip id>:<unique chip id>" in their text forms; nothing when either is missing.
    static Value getUniqueChipId();

    // The proxy settings through which the server at `url` is reached, or nothing. Waits for the reverse proxy to
    // become available, 5 seconds at most. Nothing means that it did not, or has no settings for this server; that is
    // no error here.
    Value setupReverseProxy(const std::string& url) const;

    // The answer for `key` when it is a text, nothing otherwise. Nothing is logged.
    static Value kaGetAnswerString(std::string_view key);

    // Whether the boot ticket entitles the device to use a swapped part: true only when the boolean property with the
    // four-character code `tag` (the first character in the most significant byte) in the ticket's "sepi" object is
    // true. A ticket that is missing or cannot be decoded, and a missing property, are a level-2 log line and false.
    bool getPostSwapEntitlement(std::uint32_t tag) const;

    // The hardware registry's first service of a class. On success *service is its handle, which the caller gives back
    // with HardwareRegistry::releaseService; on failure it stays as it was.
    std::optional<Error> getService(std::string_view className, std::uint32_t* service) const;

    // The top module's certificate as the hardware registry has it: a CMS certificates-only message or one certificate
    // in DER, unchecked and possibly empty. On success *certificate, when `certificate` is given, is that data; on
    // failure it stays as it was. A property of another kind than data counts as none.
    std::optional<Error> getTcrtCertificate(Value* certificate) const;

    // The serial number of a certificate, as getTcrtCertificate hands it out, or of the first one of several: its
    // content octets as lower-case hexadecimal text. Nothing, and a level-4 line, for what holds no certificate.
    Value getCertificateSerialNumber(const Value& certificate) const;

    // 32 bytes from the secure random source as data, other ones each time; nothing when that source is broken.
    Value createChallenge() const;

    // Whether the display's top module answers a challenge rightly, or is of a model that needs not. Blocks for at most
    // 10 seconds; a module that has not answered by then has failed, and what it answers later changes nothing.
    bool authenticateDisplay() const;

    // Four of the identities under the names of properties.
    Value coverGlassSerialNumber() const { return getCoverGlassSerialNumber(); }
    Value ambientLightSensorSerialNumber() const { return getAmbientLightSensorSerialNumber(); }
    Value frontFacingCameraModuleSerialNumber() const { return getFCAMModuleSerialNumber(); }
    Value miravelSerialNumber() const { return getMiravelSerialNumber(); }

    // A dictionary for the user of the class; nothing at first. Read and written atomically.
    Value syscfgDict() const;
    void setSyscfgDict(Value dictionary);

private:
    ZPDevice() = default;

    mutable std::mutex syscfgMutex_;
    Value syscfgDict_;
};

#endif
