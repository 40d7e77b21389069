// The commands of the plug-in, one function each. A command carries out one request and builds its one response; it
// never raises for what the device, a file or a server does.
#ifndef VELTRA_PLUGIN_COMMANDS_H
#define VELTRA_PLUGIN_COMMANDS_H

#include "Daemon/HSLog.h"
#include "platform/HostFramework.h"

constexpr LogSource serviceLog{"ZPOrloServices"};

// The name under which commands announce themselves in the log.
constexpr const char* handlerName = "-[ZPOrloServices handleMessage:completion:]";

// `hardwareModel` is the device's answer to "HWModelStr" at the start of the request, or nothing.
using Command = HSMessageResponse (*)(const HSMessageRequest& request, const Value& hardwareModel);

// "corvoSCProv" and "corvoSCPair": provision and pair the secure face sensor with the pairing server at the URL under
// "waftonUrl", through the reverse proxy. Pairing loads the Vanter chip's firmware patch, which takes at least 10
// seconds, and then runs the ISP calibration load. Both block for the whole exchange.
HSMessageResponse corvoSCProv(const HSMessageRequest& request, const Value& hardwareModel);
HSMessageResponse corvoSCPair(const HSMessageRequest& request, const Value& hardwareModel);

// "checkCorvoPostSwapEntitlement": answers under "IsPostSwapEntitled" whether the boot ticket holds the entitlement
// "eksp". Always succeeds; a ticket that cannot be read or decoded holds none.
HSMessageResponse checkCorvoPostSwapEntitlement(const HSMessageRequest& request, const Value& hardwareModel);

// "setGlobalbCfg": puts the model's "WCh0" entry and the "MiGB" entry into the configuration blob in the file named by
// "bcfgDataPath" and writes the result to /tmp/new_bCfg. Always succeeds; a blob that cannot be read or decoded leaves
// an empty result.
HSMessageResponse setGlobalbCfg(const HSMessageRequest& request, const Value& hardwareModel);

// Whether a hardware model names a device of the family `prefix`. A model of nothing belongs to none.
bool modelContains(const Value& hardwareModel, std::string_view prefix);

#endif
