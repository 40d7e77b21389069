// The data classes of the Orlo store: the kinds of component records, and what the instance of each is made of.
#ifndef VELTRA_PLATFORM_DATA_CLASSES_H
#define VELTRA_PLATFORM_DATA_CLASSES_H

#include <cstddef>
#include <string>
#include <string_view>

enum class ComponentIdentity {
    None,
    MiravelSerialNumber,
    CoverGlassSerialNumber,
    AmbientLightSensorSerialNumber,
    BackglassCompassSerialNumber,
    VanterSerialNumber,
    VanterChipID,
    VanterUID,
    LoddenChipID,
    LoddenUID,
    ProximitySensorSerialNumber,
    FrontCameraModuleSerialNumber,
    TopModuleChipID,
    ScreenSerialNumber,
};

// The names that their values have in the device description, in the order of the enumeration.
inline constexpr std::string_view identityNames[] = {
    "",
    "MiravelSerialNumber",
    "CoverGlassSerialNumber",
    "AmbientLightSensorSerialNumber",
    "BackglassCompassSerialNumber",
    "VanterSerialNumber",
    "VanterChipID",
    "VanterUID",
    "LoddenChipID",
    "LoddenUID",
    "ProxSerialNumber",
    "FrontCameraModuleSerialNumber",
    "TopModuleAuthChipID",
    "ScreenSerialNumber",
};

struct DataClass {
    std::string_view name; // four characters
    // The instance is the first identity, or both with a dash between them.
    ComponentIdentity first;
    ComponentIdentity second = ComponentIdentity::None;
    bool mayMissOne = false;        // whether an instance is made with "(null)" for an identity that is missing
    bool secondIsReadFirst = false; // otherwise the identities are read in the order in which they stand

    // What the instance is made of, for people.
    std::string composition() const {
        const auto nameOf = [](ComponentIdentity identity) {
            return std::string(identityNames[static_cast<std::size_t>(identity)]);
        };
        return second == ComponentIdentity::None ? nameOf(first) : nameOf(first) + "-" + nameOf(second);
    }
};

inline constexpr DataClass dataClasses[] = {
    {"pfcl", ComponentIdentity::MiravelSerialNumber},
    {"HmCl", ComponentIdentity::CoverGlassSerialNumber, ComponentIdentity::AmbientLightSensorSerialNumber},
    {"IfCl", ComponentIdentity::AmbientLightSensorSerialNumber},
    {"CtCl", ComponentIdentity::CoverGlassSerialNumber},
    {"GpC2", ComponentIdentity::CoverGlassSerialNumber},
    {"tcrt", ComponentIdentity::ScreenSerialNumber, ComponentIdentity::TopModuleChipID, true, true},
    {"dCfg", ComponentIdentity::CoverGlassSerialNumber},
    {"bCfg", ComponentIdentity::BackglassCompassSerialNumber},
    {"pcic", ComponentIdentity::VanterSerialNumber},
    {"pcii", ComponentIdentity::VanterSerialNumber},
    {"pcvc", ComponentIdentity::VanterSerialNumber},
    {"pcvi", ComponentIdentity::VanterSerialNumber},
    {"pcve", ComponentIdentity::VanterSerialNumber},
    {"pbas", ComponentIdentity::VanterSerialNumber},
    {"pmpc", ComponentIdentity::VanterSerialNumber},
    {"pdcl", ComponentIdentity::VanterSerialNumber},
    {"prf1", ComponentIdentity::VanterSerialNumber},
    {"prf2", ComponentIdentity::VanterSerialNumber},
    {"psd1", ComponentIdentity::VanterSerialNumber},
    {"psd2", ComponentIdentity::VanterSerialNumber},
    {"pwcl", ComponentIdentity::VanterSerialNumber},
    {"psnv", ComponentIdentity::VanterSerialNumber},
    {"psdt", ComponentIdentity::VanterSerialNumber},
    {"preg", ComponentIdentity::VanterSerialNumber},
    {"ycrt", ComponentIdentity::LoddenChipID, ComponentIdentity::LoddenUID, true},
    {"AlsH", ComponentIdentity::CoverGlassSerialNumber, ComponentIdentity::AmbientLightSensorSerialNumber, true},
    {"PxTC", ComponentIdentity::CoverGlassSerialNumber, ComponentIdentity::ProximitySensorSerialNumber},
    {"pspc", ComponentIdentity::VanterChipID, ComponentIdentity::VanterUID},
    {"FCCl", ComponentIdentity::FrontCameraModuleSerialNumber},
};

#endif
