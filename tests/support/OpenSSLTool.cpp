#include "tests/support/OpenSSLTool.h"

#include <cstdio>
#include <filesystem>
#include <fstream>

#include <unistd.h>

std::string asn1parse(const std::vector<std::uint8_t>& bytes) {
    const std::string input =
        (std::filesystem::temp_directory_path() / ("veltra-asn1parse." + std::to_string(getpid()))).string();
    std::ofstream(input, std::ios::binary)
        .write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
    std::FILE* const tool = popen((OPENSSL_TOOL " asn1parse -inform DER -in '" + input + "'").c_str(), "r");
    std::string text;
    for (int octet = tool ? std::fgetc(tool) : EOF; octet != EOF; octet = std::fgetc(tool))
        text += static_cast<char>(octet);
    std::filesystem::remove(input);
    return tool && pclose(tool) == 0 ? text : std::string();
}
