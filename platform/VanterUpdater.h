// The updater library of the Vanter chip.
//
// On Linux the device description stands for the chip: "vanter" has "firmware", the device path of the file that is its
// installed firmware, "done", whether it needs no step, and "fail", the name of a step that is to report an Error. A
// device whose description has no such entry has no chip, and no updater can be created.
//
// The chip is done when its description says so, and for as long as the file at that path is what this process
// installed there last, whichever updater did it. A part that is swapped in has another firmware and starts anew. The
// operations may be called from any thread.
#ifndef VELTRA_PLATFORM_VANTER_UPDATER_H
#define VELTRA_PLATFORM_VANTER_UPDATER_H

#include <optional>
#include <string>
#include <string_view>

#include "platform/Error.h"
#include "platform/Value.h"

class VanterUpdater;

// Receives what the library has to say, as two texts; here who says it, and what.
using VanterUpdaterLog = void (*)(const std::string& context, const std::string& message);

// An updater for the chip `name`, or null. The caller releases it. *error is filled when the library has a reason to
// give; here as in all the operations below.
VanterUpdater* VanterUpdaterCreate(const Value& options, VanterUpdaterLog log, std::string_view name,
                                   std::optional<Error>* error);

// Whether the chip needs no further step; false with an Error when it cannot be told.
bool VanterUpdaterIsDone(VanterUpdater* updater, std::optional<Error>* error);

// Runs one step and returns true on success, with its output, a dictionary or nothing:
//   "queryInfo"         "Digest" is the SHA-384 of the installed firmware; without firmware the dictionary is empty
//   "performNextStage"  installs the data under "FirmwareData" in `options`; the chip is then done
bool VanterUpdaterExecCommand(VanterUpdater* updater, std::string_view step, const Value& options, Value* output,
                              std::optional<Error>* error);

// Releases an updater; null is allowed.
void VanterUpdaterRelease(VanterUpdater* updater);

#endif
