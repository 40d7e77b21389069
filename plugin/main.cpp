#include <cstdlib>

#include "Daemon/HSLog.h"
#include "platform/SystemLog.h"
#include "plugin/ZPOrloServices.h"

int main() {
    constexpr const char* serviceName = "com.tevari.VeltraOrloServices";
    constexpr LogSource mainLog{"main"};

    logInit(serviceName);
    mainLog.info("%@  - version %@", serviceName, pluginVersion());
    mainLog.info("Launching  Plugin - %@", serviceName);
    const auto server = ZPOrloServices::initWithServiceName(serviceName);
    if (!server)
        return EXIT_FAILURE;
    server->resume();
    consoleLog("Never here");
    return EXIT_SUCCESS;
}
