// The device: who it and its replaceable components are.
#ifndef VELTRA_DEVICE_ZPDEVICE_H
#define VELTRA_DEVICE_ZPDEVICE_H

#include "platform/Value.h"

// The one place through which the plug-in asks about the device. Nothing is read at construction and nothing is cached:
// every getter asks its service again. A missing answer is a level-4 log line and a result of nothing, never an
// exception. All operations may be called from any thread.
class ZPDevice {
public:
    // The shared instance, made at the first call; also when several threads ask first.
    static ZPDevice& sharedSingleton();

    // The hardware model, a text such as "M12x".
    Value getHardwareModel() const;

private:
    ZPDevice() = default;
};

#endif
