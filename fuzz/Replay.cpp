// The main program of a target where there is no fuzzer: `fuzz-<target> FOLDER` runs the target on every seed in the
// folder, on every prefix of it, and on all that one flipped bit makes of it. Of these it must take as many as the
// suffix of the seed's file says, unless that is "-", and none may have the seed's answer. Seeds with the suffix "x"
// are left out.
#include <filesystem>
#include <fstream>
#include <iterator>
#include <vector>

#include "fuzz/Fuzz.h"

namespace {

// Runs the target on a copy without spare capacity, so that the address sanitizer sees a read beyond it.
bool isTaken(const std::vector<std::uint8_t>& octets) {
    const std::vector<std::uint8_t> input(octets);
    fuzz::taken = false;
    LLVMFuzzerTestOneInput(input.data(), input.size());
    return fuzz::taken;
}

int takenFlips(std::vector<std::uint8_t> seed) {
    int count = 0;
    isTaken(seed);
    const std::uint64_t sound = fuzz::answer;
    for (std::uint8_t& octet : seed) {
        for (int bit = 0; bit < 8; ++bit) {
            octet = static_cast<std::uint8_t>(octet ^ 1 << bit);
            count += isTaken(seed) ? 1 : 0;
            FUZZ_REQUIRE(sound == 0 || fuzz::answer != sound);
            octet = static_cast<std::uint8_t>(octet ^ 1 << bit);
        }
    }
    return count;
}

} // namespace

int main(int, char** arguments) {
    int wrong = 0;
    int seeds = 0;
    for (const auto& file : std::filesystem::directory_iterator(arguments[1])) {
        const std::string expected = file.path().extension().string();
        if (expected == ".x")
            continue;
        std::ifstream stream(file.path(), std::ios::binary);
        const std::vector<std::uint8_t> seed(std::istreambuf_iterator<char>(stream), {});
        ++seeds;
        for (std::size_t length = 0; length <= seed.size(); ++length)
            isTaken({seed.begin(), seed.begin() + static_cast<std::ptrdiff_t>(length)});
        const std::string found = "." + std::to_string(takenFlips(seed));
        if (expected == ".-" || expected == found)
            continue;
        std::cerr << file.path() << ": takes " << found << " of what a flipped bit makes of it\n";
        ++wrong;
    }
    return seeds == 0 || wrong != 0;
}
