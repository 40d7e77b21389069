#include "fuzz/Seeds.h"
#include "sysconfig/SysConfig3Ptr.h"

namespace {

using sysconfig::MetadataEntryPtr;
using sysconfig::PayloadEntryPtr;
using sysconfig::SysConfig3Ptr;
using Bytes = std::vector<std::uint8_t>;

std::uint8_t keyBytes[] = {'k', 'e', 'y'};

SysConfig3Ptr newObject(SysConfig3Version version) {
    constexpr SysConfig3Magic bCfg = 0x62436667;
    if (sysConfig3HMACIsSupported(version))
        return SysConfig3Ptr(allocSysConfig3WithHMACKey(bCfg, version, {keyBytes, sizeof keyBytes}));
    return SysConfig3Ptr(allocSysConfig3(bCfg, version));
}

SysConfig3Ptr filledObject(SysConfig3Version version) {
    SysConfig3Ptr object = newObject(version);
    const std::uint8_t data[] = {1, 2, 3};
    const std::string longText(200, 'x');
    for (auto* entry : {allocSysConfig3PayloadEntryWithData(0x57436830, nullptr, data, sizeof data),
                        allocSysConfig3PayloadEntryWithString(0x4D694742, "note", longText.c_str()),
                        allocSysConfig3PayloadEntryDeleted(0x01020304, nullptr)})
        sysConfig3AddPayloadEntry(object.get(), PayloadEntryPtr(entry).get());
    for (auto* entry : {allocSysConfig3MetadataEntry("name", nullptr, 0, "value"),
                        allocSysConfig3MetadataEntry(longText.c_str(), data, sizeof data, nullptr)})
        sysConfig3AddMetadataEntry(object.get(), MetadataEntryPtr(entry).get());
    return object;
}

// The blob of the object and octets behind it, which tell the target what to change.
Bytes seed(const SysConfig3Ptr& object, const Bytes& script) {
    SysConfigData out = {};
    if (!encodeSysConfig3(object.get(), &out))
        return {};
    const sysconfig::BytesPtr owner(out.data);
    Bytes bytes(out.data, out.data + out.length);
    bytes.insert(bytes.end(), script.begin(), script.end());
    return bytes;
}

} // namespace

int main(int argc, char** argv) {
    const Bytes script = {0, 0, 5, 1, 0,   2,   'a', 'b', 0, 4,   1, 0, 0, 0,
                          1, 1, 3, 3, 'k', 'e', 'y', 0,   1, 'v', 1, 0, 3, 0};
    std::vector<Bytes> seeds;
    for (const SysConfig3Version version : {0x30001U, 0x30002U, 0x30003U}) {
        seeds.push_back(seed(newObject(version), {}));
        seeds.push_back(seed(filledObject(version), {}));
        seeds.push_back(seed(filledObject(version), script));
    }
    return writeSeeds(argc, argv, seeds);
}
