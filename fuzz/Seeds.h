#ifndef VELTRA_FUZZ_SEEDS_H
#define VELTRA_FUZZ_SEEDS_H

#include <cstddef>
#include <fstream>
#include <string>
#include <vector>

// Writes each seed to a file of its own in `folder`, which must exist. The exit status of a seed program.
template <class Bytes>
int writeSeeds(const std::string& folder, const std::vector<Bytes>& seeds) {
    for (std::size_t i = 0; i < seeds.size(); ++i) {
        std::ofstream file(folder + "/seed" + std::to_string(i), std::ios::binary);
        file.write(reinterpret_cast<const char*>(seeds[i].data()), static_cast<std::streamsize>(seeds[i].size()));
        file.close();
        if (!file)
            return 1;
    }
    return 0;
}

#endif
