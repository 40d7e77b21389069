#include <cstdio>
#include <cstdlib>
#include <string>
#include <string_view>

#include "Daemon/HSLog.h"
#include "platform/Processes.h"
#include "platform/SystemLog.h"
#include "plugin/ZPOrloServices.h"

namespace {

constexpr const char* help = R"(Usage: VeltraOrloServices [--help | --version]

Serves the requests of the host on D-Bus until SIGTERM or SIGINT ends it. orloctl sends requests.

Environment:
  VELTRA_BUS          the bus: "system" (the default), "session" or a D-Bus address
  VELTRA_DEVICE_ROOT  the folder below which every path of the device lies (default /)

VeltraOrloServices(8) says more.)";

// The exit status: 2 when the text is lost, on a full disk for one.
int print(const std::string& text) {
    return std::puts(text.c_str()) < 0 || std::fflush(stdout) != 0 ? 2 : 0;
}

// Answers a start with arguments, which serves no request.
int answer(std::string_view argument, bool isOnlyOne) {
    if (isOnlyOne && argument == "--help")
        return print(help);
    if (isOnlyOne && argument == "--version")
        return print("VeltraOrloServices " + pluginVersion());
    consoleLog("VeltraOrloServices takes no arguments but --help or --version");
    return 2;
}

} // namespace

int main(int argc, char** argv) {
    if (argc > 1)
        return answer(argv[1], argc == 2);
    processes::openStandardDescriptors();
    processes::catchBrokenPipe(); // a reader of standard error that is gone must not end the service

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
