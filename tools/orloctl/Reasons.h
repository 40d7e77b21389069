// Which of the messages of a failed request say why it failed.
#ifndef VELTRA_ORLOCTL_REASONS_H
#define VELTRA_ORLOCTL_REASONS_H

#include <cstdint>
#include <string_view>

// Whether a message of the level and text may be a reason for the failure of `command`: an error that tells of a
// failure, and the last message of a command that logs everything as progress.
bool isReason(std::string_view command, std::int32_t level, std::string_view text, bool isLast);

#endif
