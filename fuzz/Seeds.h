// Writes the seed files of a fuzz target.
#ifndef VELTRA_FUZZ_SEEDS_H
#define VELTRA_FUZZ_SEEDS_H

#include <cstdint>
#include <fstream>
#include <iostream>
#include <string>
#include <vector>

// Writes each seed to a file of its own in the folder that exists and is the program's one argument. The exit status of
// the program; a failure has a line on standard error.
template <class Bytes = std::vector<std::uint8_t>>
int writeSeeds(int count, char** arguments, const std::vector<Bytes>& seeds) {
    if (count != 2)
        return 2;
    for (std::size_t i = 0; i < seeds.size(); ++i) {
        const std::string path = std::string(arguments[1]) + "/seed" + std::to_string(i);
        std::ofstream file(path, std::ios::binary);
        file.write(reinterpret_cast<const char*>(seeds[i].data()), static_cast<std::streamsize>(seeds[i].size()));
        file.close();
        if (!file) {
            std::cerr << "cannot write " << path << '\n';
            return 1;
        }
    }
    return 0;
}

#endif
