// Writes the seed files of a fuzz target.
#ifndef VELTRA_FUZZ_SEED_FILE_H
#define VELTRA_FUZZ_SEED_FILE_H

#include <cstdint>
#include <fstream>
#include <iostream>
#include <string>
#include <vector>

// Writes `bytes` to the file `name` in `folder`, which exists. Returns false, with a line on standard error, when that
// fails.
inline bool writeSeed(const std::string& folder, const std::string& name, const std::vector<std::uint8_t>& bytes) {
    const std::string path = folder + "/" + name;
    std::ofstream file(path, std::ios::binary);
    file.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
    file.close();
    if (!file)
        std::cerr << "cannot write " << path << '\n';
    return static_cast<bool>(file);
}

#endif
