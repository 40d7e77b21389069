#include "device/ZPDevice.h"

#include "Daemon/HSLog.h"
#include "img4/Img4.h"
#include "platform/Files.h"

namespace {

constexpr LogSource zplog{"ZPDevice"};

constexpr const char* ticketPath = "/System/Library/Caches/apticket.der";
constexpr std::uint32_t secureElementObject = Img4FourCC('s', 'e', 'p', 'i');

} // namespace

bool ZPDevice::getPostSwapEntitlement(std::uint32_t tag) const {
    const auto ticket = files::readWhole(ticketPath);
    if (!ticket) {
        zplog.info("failed to find apticket");
        return false;
    }
    Img4Record record = {};
    if (Img4DecodeInitManifest(ticket->data(), ticket->size(), &record) != DERSuccess) {
        zplog.info("failed to parse AP ticket as Img4 manifest");
        return false;
    }
    bool entitled = false;
    const DERReturn result = Img4DecodeGetObjectPropertyBoolean(&record, secureElementObject, tag, &entitled);
    if (result != DERSuccess) {
        zplog.info("the result of Img4 decode is %i", static_cast<std::int32_t>(result));
        return false;
    }
    if (entitled)
        zplog.info("success for %u", tag);
    return entitled;
}
