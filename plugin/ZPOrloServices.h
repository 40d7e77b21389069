// The plug-in server: takes the host's requests and runs the command that each names.
#ifndef VELTRA_PLUGIN_ZPORLOSERVICES_H
#define VELTRA_PLUGIN_ZPORLOSERVICES_H

#include <memory>
#include <string>
#include <string_view>

#include "platform/HostFramework.h"

// Holds no state: every request is handled from scratch.
class ZPOrloServices : public VeltraPluginServer {
public:
    // A server that is registered with the host under `serviceName`, or none.
    static std::unique_ptr<ZPOrloServices> initWithServiceName(std::string_view serviceName);

    // Logs the request, runs its command and completes it with the command's response; with no response object when the
    // command is unknown or absent. A command that memory does not suffice for is completed all the same: as a failure
    // without reason, or, where the command knows no failure, with its plainest success. Some commands block the
    // calling thread for long.
    void handleMessage(const HSMessageRequest& request, const HSCompletion& completion) override;

    // Logs the plug-in version.
    void printPluginVersion() const;

    // Runs the device's image-signal-processor tool, which loads its calibration data, and waits for it to end, however
    // long that takes. What it writes and how it fails is only logged.
    static void q21isp_loadDAT();
};

// "<short version>.<version>" from the bundle's information list, read afresh.
std::string pluginVersion();

#endif
