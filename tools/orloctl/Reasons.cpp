#include "tools/orloctl/Reasons.h"

#include <algorithm>

bool isReason(std::string_view command, std::int32_t level, std::string_view text, bool isLast) {
    constexpr std::int32_t error = 4;
    constexpr std::string_view harmlessErrors[] = {"updaterOptions created successfully",
                                                   "value of ticket is:", "added ticket"};
    if (level == error)
        return std::ranges::none_of(harmlessErrors, [text](auto harmless) { return text.starts_with(harmless); });
    return isLast && (command == "putPSD2" || command == "getPSD2");
}
