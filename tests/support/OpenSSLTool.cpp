#include "tests/support/OpenSSLTool.h"

#include <cstdio>
#include <filesystem>
#include <fstream>

#include <unistd.h>

std::string asn1parse(const std::vector<std::uint8_t>& bytes) {
    const std::filesystem::path file =
        std::filesystem::temp_directory_path() / ("veltra-asn1parse." + std::to_string(getpid()));
    std::ofstream(file, std::ios::binary)
        .write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
    const std::string command = OPENSSL_TOOL " asn1parse -inform DER -in " + file.string() + " 2>&1";
    FILE* pipe = popen(command.c_str(), "r");
    if (pipe == nullptr)
        return "";
    std::string output;
    char chunk[4096];
    std::size_t count = 0;
    while ((count = std::fread(chunk, 1, sizeof chunk, pipe)) > 0)
        output.append(chunk, count);
    const int status = pclose(pipe);
    std::filesystem::remove(file);
    return status == 0 ? output : "";
}
