// Which of the names that there are was meant by one that there is not.
#ifndef VELTRA_PLATFORM_NEAREST_NAME_H
#define VELTRA_PLATFORM_NEAREST_NAME_H

#include <string_view>
#include <vector>

// The first of the `known` names of which `name` is made with the fewest characters put in, taken out or changed; empty
// when even that changes more than a third of it, or `name` is longer than 64 characters.
std::string_view nearestName(std::string_view name, const std::vector<std::string_view>& known);

#endif
