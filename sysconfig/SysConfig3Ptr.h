// Owning pointers over the records of SysConfig3.h, for C++ callers.
#ifndef VELTRA_SYSCONFIG_SYSCONFIG3PTR_H
#define VELTRA_SYSCONFIG_SYSCONFIG3PTR_H

#include <cstdlib>
#include <memory>

#include "sysconfig/SysConfig3.h"

namespace sysconfig {

struct Release {
    void operator()(__SysConfig3* object) const noexcept { deallocSysConfig3(object); }
    void operator()(__SysConfig3PayloadEntry* entry) const noexcept { deallocSysConfig3PayloadEntry(entry); }
    void operator()(__SysConfig3MetadataEntry* entry) const noexcept { deallocSysConfig3MetadataEntry(entry); }
    void operator()(__SysConfig3ManifestEntry* manifest) const noexcept { deallocSysConfig3Manifest(manifest); }
    void operator()(std::uint8_t* bytes) const noexcept { std::free(bytes); }
};

using SysConfig3Ptr = std::unique_ptr<__SysConfig3, Release>;
using PayloadEntryPtr = std::unique_ptr<__SysConfig3PayloadEntry, Release>;
using MetadataEntryPtr = std::unique_ptr<__SysConfig3MetadataEntry, Release>;
using ManifestPtr = std::unique_ptr<__SysConfig3ManifestEntry, Release>;

// The bytes of a SysConfigData that belongs to the caller: an encoded blob or a created HMAC.
using BytesPtr = std::unique_ptr<std::uint8_t[], Release>;

} // namespace sysconfig

#endif
