// One seed for each type at the top of a request, and some that nest.
#include "fuzz/Seeds.h"

int main(int argc, char** argv) {
    std::vector<std::string> seeds(21);
    for (std::size_t type = 0; type < seeds.size(); ++type)
        for (char depth = 0; depth < 6; ++depth)
            seeds[type] += std::string{'\1', depth, static_cast<char>(type)} + "\1\2\3\4\5\6\7\10" + '\2';
    return writeSeeds(argc, argv, seeds);
}
