// Bytes that claim to be a certificate or a certificates-only message are refused or read; a serial number that comes
// out stands in them as the content of an INTEGER, octet by octet, and what is one certificate is no message.
#include <algorithm>

#include "fuzz/Fuzz.h"
#include "platform/CertificateService.h"

namespace {

using CertificateService::CertificateRef;

// The serial number stands in the bytes as it is, and has no octet that an INTEGER does not need (X.690 8.3.2).
void requireInside(const CertificateRef& certificate, const Value::Data& bytes) {
    const auto octets = CertificateService::copySerialNumberData(certificate, nullptr);
    FUZZ_REQUIRE(octets && !octets->empty());
    FUZZ_REQUIRE(std::search(bytes.begin(), bytes.end(), octets->begin(), octets->end()) != bytes.end());
    const bool isPadded = octets->size() > 1 && (((*octets)[0] == 0x00 && (*octets)[1] < 0x80) ||
                                                 ((*octets)[0] == 0xFF && (*octets)[1] >= 0x80));
    FUZZ_REQUIRE(!isPadded);
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const Value::Data bytes(data, data + size);
    const auto list = CertificateService::copyCertificatesFromCertsOnlyMessage(bytes);
    const CertificateRef single = CertificateService::createCertificateWithBytes(data, size);
    FUZZ_REQUIRE(!list || !single);
    if (single)
        requireInside(single, bytes);
    if (list)
        for (const CertificateRef& certificate : *list)
            requireInside(certificate, bytes);
    return 0;
}
