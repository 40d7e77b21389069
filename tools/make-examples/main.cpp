// make-examples ROOT: writes the blobs, the boot ticket and the Img4 container of examples/device below a device root.
// The same octets come out every time.
#include <filesystem>
#include <initializer_list>
#include <iostream>
#include <stdexcept>
#include <string>

#include "sysconfig/SysConfig3Ptr.h"
#include "tools/makers/Img4Maker.h"

namespace {

using img4maker::Bytes;
using img4maker::fourCC;
using img4maker::writeFile;
using std::filesystem::path;

// The key of the examples' HMACs: the octets 00 to 1F. It protects nothing.
Bytes exampleKey() {
    Bytes key;
    for (std::uint8_t octet = 0; octet < 32; ++octet)
        key.push_back(octet);
    return key;
}

void require(bool done) {
    if (!done)
        throw std::runtime_error("an example cannot be made");
}

__SysConfig3PayloadEntry* data(std::string_view key, const char* comment, const Bytes& bytes) {
    return allocSysConfig3PayloadEntryWithData(fourCC(key), comment, bytes.data(),
                                               static_cast<std::uint32_t>(bytes.size()));
}

// Writes a blob with the entries, which it releases.
void writeBlob(const path& file, std::string_view magic, SysConfig3Version version,
               std::initializer_list<__SysConfig3PayloadEntry*> payload,
               std::initializer_list<__SysConfig3MetadataEntry*> metadata) {
    Bytes key = exampleKey();
    const SysConfigData hmacKey = {key.data(), static_cast<std::uint32_t>(key.size())};
    const sysconfig::SysConfig3Ptr object(sysConfig3HMACIsSupported(version)
                                              ? allocSysConfig3WithHMACKey(fourCC(magic), version, hmacKey)
                                              : allocSysConfig3(fourCC(magic), version));
    for (auto* entry : payload)
        require(sysConfig3AddPayloadEntry(object.get(), sysconfig::PayloadEntryPtr(entry).get()));
    for (auto* entry : metadata)
        require(sysConfig3AddMetadataEntry(object.get(), sysconfig::MetadataEntryPtr(entry).get()));
    SysConfigData out = {};
    require(encodeSysConfig3(object.get(), &out));
    const sysconfig::BytesPtr owner(out.data);
    writeFile(file, {out.data, out.data + out.length});
}

void writeExamples(const path& root) {
    const path blobs = root / "blobs";
    for (const char* magic : {"0Cfg", "appv", "bCfg", "dCfg", "eCfg", "fCfg", "mCfg", "seal", "tCfg"})
        for (SysConfig3Version version = 0x30001; version <= 0x30003; ++version)
            writeBlob(blobs / (magic + ("-3000" + std::to_string(version & 0xF)) + ".bin"), magic, version,
                      {data("ExDt", "example", {0x01, 0x02, 0x03, 0x04})},
                      {allocSysConfig3MetadataEntry("magic", nullptr, 0, magic)});
    const std::uint8_t date[] = {0x20, 0x26, 0x01, 0x31};
    writeBlob(blobs / "every-kind.bin", "bCfg", 0x30003,
              {data("ExDt", "data", Bytes(200, 0x5A)),
               allocSysConfig3PayloadEntryWithString(fourCC("ExSt"), "string", "EXAMPLE 1"),
               allocSysConfig3PayloadEntryDeleted(fourCC("OldK"), "deleted")},
              {allocSysConfig3MetadataEntry("calibrated", date, sizeof date, nullptr),
               allocSysConfig3MetadataEntry("station", nullptr, 0, "bench 7")});
    // "WCh0" in first place and another key behind it, so that replacing it shows.
    writeBlob(blobs / "holds-WCh0.bin", "bCfg", 0x30003,
              {data("WCh0", nullptr, Bytes(152, 0x00)), data("ExDt", "example", {0x01, 0x02, 0x03, 0x04})}, {});
    writeFile(blobs / "hmac-key.bin", exampleKey());
    writeFile(root / "System/Library/Caches/apticket.der", img4maker::exampleTicket());
    writeFile(root / "images/container.img4", img4maker::exampleContainer());
}

} // namespace

int main(int count, char** arguments) try {
    if (count != 2) {
        std::cerr << "usage: make-examples ROOT\n";
        return 2;
    }
    writeExamples(arguments[1]);
    return 0;
} catch (const std::exception& error) {
    std::cerr << "make-examples: " << error.what() << "\n";
    return 1;
}
