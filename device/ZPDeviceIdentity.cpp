#include "device/ZPDevice.h"

#include "Daemon/HSLog.h"
#include "platform/DeviceAnswers.h"

namespace {

constexpr LogSource zplog{"ZPDevice"};

} // namespace

ZPDevice& ZPDevice::sharedSingleton() {
    static ZPDevice shared;
    return shared;
}

Value ZPDevice::getHardwareModel() const {
    Value model = KACopyAnswerWithError("HWModelStr", {}, nullptr);
    if (model.isNothing())
        zplog.error("Could not get data instance string for identifier HWModelStr");
    return model;
}
