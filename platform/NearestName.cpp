#include "platform/NearestName.h"

#include <algorithm>
#include <cstddef>
#include <numeric>
#include <utility>

namespace {

constexpr std::size_t longestName = 64;

// How many characters have to be put in, taken out or changed to make one name of the other (Levenshtein distance).
std::size_t distance(std::string_view from, std::string_view to) {
    std::vector<std::size_t> row(to.size() + 1);
    std::iota(row.begin(), row.end(), std::size_t{0});
    for (std::size_t i = 0; i < from.size(); ++i) {
        std::size_t diagonal = std::exchange(row[0], i + 1);
        for (std::size_t j = 0; j < to.size(); ++j) {
            const std::size_t changed = diagonal + (from[i] != to[j] ? 1 : 0);
            diagonal = row[j + 1];
            row[j + 1] = std::min({changed, row[j] + 1, diagonal + 1});
        }
    }
    return row.back();
}

} // namespace

std::string_view nearestName(std::string_view name, const std::vector<std::string_view>& known) {
    if (name.size() > longestName)
        return {};
    std::string_view best;
    std::size_t least = name.npos;
    for (const std::string_view candidate : known)
        if (const std::size_t changes = distance(name, candidate); changes < least) {
            best = candidate;
            least = changes;
        }
    return least > best.size() / 3 ? std::string_view() : best;
}
