// make-examples FOLDER: writes the example blobs of examples/device/blobs into a folder that exists. The same octets
// come out every time.
#include <fstream>
#include <iostream>
#include <string>
#include <vector>

#include "sysconfig/SysConfig3Ptr.h"

namespace {

using sysconfig::BytesPtr;
using sysconfig::MetadataEntryPtr;
using sysconfig::PayloadEntryPtr;
using sysconfig::SysConfig3Ptr;
using Bytes = std::vector<std::uint8_t>;

// The key of the examples' HMACs: the octets 00 to 1F. It protects nothing.
Bytes exampleKey() {
    Bytes key;
    for (std::uint8_t octet = 0; octet < 32; ++octet)
        key.push_back(octet);
    return key;
}

constexpr std::uint32_t fourCharacterCode(const char (&characters)[5]) {
    std::uint32_t code = 0;
    for (int i = 0; i < 4; ++i)
        code = code << 8 | static_cast<unsigned char>(characters[i]);
    return code;
}

SysConfig3Ptr newObject(SysConfig3Magic magic, SysConfig3Version version) {
    if (!sysConfig3HMACIsSupported(version))
        return SysConfig3Ptr(allocSysConfig3(magic, version));
    Bytes key = exampleKey();
    return SysConfig3Ptr(
        allocSysConfig3WithHMACKey(magic, version, {key.data(), static_cast<std::uint32_t>(key.size())}));
}

bool add(const SysConfig3Ptr& object, __SysConfig3PayloadEntry* entry) {
    const PayloadEntryPtr owner(entry);
    return sysConfig3AddPayloadEntry(object.get(), entry);
}

bool add(const SysConfig3Ptr& object, __SysConfig3MetadataEntry* entry) {
    const MetadataEntryPtr owner(entry);
    return sysConfig3AddMetadataEntry(object.get(), entry);
}

bool addData(const SysConfig3Ptr& object, std::uint32_t key, const char* comment, const Bytes& data) {
    return add(object,
               allocSysConfig3PayloadEntryWithData(key, comment, data.data(), static_cast<std::uint32_t>(data.size())));
}

bool write(const std::string& path, const std::uint8_t* data, std::size_t length) {
    std::ofstream file(path, std::ios::binary);
    file.write(reinterpret_cast<const char*>(data), static_cast<std::streamsize>(length));
    file.close();
    if (!file)
        std::cerr << "make-examples: cannot write " << path << "\n";
    return static_cast<bool>(file);
}

bool writeBlob(const std::string& path, const SysConfig3Ptr& object) {
    SysConfigData out = {};
    if (!encodeSysConfig3(object.get(), &out)) {
        std::cerr << "make-examples: cannot encode " << path << "\n";
        return false;
    }
    const BytesPtr owner(out.data);
    return write(path, out.data, out.length);
}

// One blob for each magic and version, all with the same two entries.
bool writeEveryMagicAndVersion(const std::string& folder) {
    constexpr char magics[][5] = {"0Cfg", "appv", "bCfg", "dCfg", "eCfg", "fCfg", "mCfg", "seal", "tCfg"};
    const struct {
        SysConfig3Version number;
        const char* name;
    } versions[] = {{0x30001, "30001"}, {0x30002, "30002"}, {0x30003, "30003"}};
    for (const auto& magic : magics) {
        for (const auto& version : versions) {
            const SysConfig3Ptr object = newObject(fourCharacterCode(magic), version.number);
            if (!addData(object, fourCharacterCode("ExDt"), "example", {0x01, 0x02, 0x03, 0x04}) ||
                !add(object, allocSysConfig3MetadataEntry("magic", nullptr, 0, magic)) ||
                !writeBlob(folder + "/" + magic + "-" + version.name + ".bin", object))
                return false;
        }
    }
    return true;
}

// Every kind of value that an entry may have.
bool writeEveryKind(const std::string& folder) {
    const SysConfig3Ptr object = newObject(fourCharacterCode("bCfg"), 0x30003);
    const std::uint8_t date[] = {0x20, 0x26, 0x01, 0x31};
    return addData(object, fourCharacterCode("ExDt"), "data", Bytes(200, 0x5A)) &&
           add(object, allocSysConfig3PayloadEntryWithString(fourCharacterCode("ExSt"), "string", "EXAMPLE 1")) &&
           add(object, allocSysConfig3PayloadEntryDeleted(fourCharacterCode("OldK"), "deleted")) &&
           add(object, allocSysConfig3MetadataEntry("calibrated", date, sizeof date, nullptr)) &&
           add(object, allocSysConfig3MetadataEntry("station", nullptr, 0, "bench 7")) &&
           writeBlob(folder + "/every-kind.bin", object);
}

// "WCh0" in first place and another key behind it, so that replacing it shows.
bool writeHoldsWCh0(const std::string& folder) {
    const SysConfig3Ptr object = newObject(fourCharacterCode("bCfg"), 0x30003);
    return addData(object, fourCharacterCode("WCh0"), nullptr, Bytes(152, 0x00)) &&
           addData(object, fourCharacterCode("ExDt"), "example", {0x01, 0x02, 0x03, 0x04}) &&
           writeBlob(folder + "/holds-WCh0.bin", object);
}

} // namespace

int main(int argc, char** argv) {
    if (argc != 2) {
        std::cerr << "usage: make-examples FOLDER\n";
        return 2;
    }
    const std::string folder = argv[1];
    const Bytes key = exampleKey();
    const bool written = writeEveryMagicAndVersion(folder) && writeEveryKind(folder) && writeHoldsWCh0(folder) &&
                         write(folder + "/hmac-key.bin", key.data(), key.size());
    return written ? 0 : 1;
}
