// The end of the service's log.
#ifndef VELTRA_TOOLS_ORLOCTL_LOG_TAIL_H
#define VELTRA_TOOLS_ORLOCTL_LOG_TAIL_H

#include <cstddef>
#include <functional>
#include <string_view>

// The path on the device.
constexpr const char* logPath = "/private/var/log/com.tevari.VeltraOrloServices.log";

// Hands the last `lines` lines of the log to `take`, without their line ends, one after another. When it is to be
// followed, waits for those that are added, also to a new file in place of one that was rotated away, until `take`
// returns false. Raises UsageError when there is no log or it cannot be read.
void readLog(std::size_t lines, bool isFollowed, const std::function<bool(std::string_view line)>& take);

#endif
