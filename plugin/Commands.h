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

// "OrloExport": exports the identities of the device's components, of the classes in the array "ExportList" or, when
// the request has none and the model is neither of the M8 nor of the M9 family, of seven default ones. The error is
// that of the export, or one of "OrloExport" 2002 that says which identity could not be gathered.
HSMessageResponse OrloExport(const HSMessageRequest& request, const Value& hardwareModel);

// "getTCRT": answers with the top module's certificate as hexadecimal text under "CertData" (left out when it is empty)
// and its serial number under "CertSerialNumber", "DummyCertificateSerialNumber" when that cannot be read. A model
// whose top module has no certificate is a failure without error; otherwise the error is that of the hardware registry.
HSMessageResponse getTCRT(const HSMessageRequest& request, const Value& hardwareModel);

// "putTCRT": has the display authenticated and then stores the top module's certificate as the "tcrt" record of the
// screen and the top module's chip. The error is "TcrtAuthErrorDomain" 401 for a display that fails, or that of the
// hardware registry or of the data store.
HSMessageResponse putTCRT(const HSMessageRequest& request, const Value& hardwareModel);

// "putPSD2": stores the contents of the file named by "psd2DataPath" as the secure face sensor's "psd2" record. A
// failure has a reason under "psd2 put error".
HSMessageResponse putPSD2(const HSMessageRequest& request, const Value& hardwareModel);

// "getPSD2": writes the secure face sensor's "psd2" record to the file named by "psd2V4DataPath", in place of what is
// there; the file has mode 0600. Without a record the file stays as it is, and the reason is under "psd2 get error".
HSMessageResponse getPSD2(const HSMessageRequest& request, const Value& hardwareModel);

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
// an empty result, and a result that cannot be written leaves none: an earlier one is removed, unless what stands there
// is no regular file.
HSMessageResponse setGlobalbCfg(const HSMessageRequest& request, const Value& hardwareModel);

// Removes the result of an earlier "setGlobalbCfg", after one for which memory does not suffice.
void removeGlobalbCfg() noexcept;

// Whether a hardware model names a device of the family `prefix`. A model of nothing belongs to none.
bool modelContains(const Value& hardwareModel, std::string_view prefix);

#endif
