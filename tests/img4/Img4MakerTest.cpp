// The maker's files are DER to another reader too.
#include "tests/support/Img4Maker.h"

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <string>

#include <gtest/gtest.h>
#include <unistd.h>

namespace {

// The output of `openssl asn1parse` on the file that holds `bytes`; empty when it fails.
std::string asn1parse(const img4maker::Bytes& bytes) {
    const std::filesystem::path file =
        std::filesystem::temp_directory_path() / ("img4-maker-test." + std::to_string(getpid()));
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

TEST(Img4Maker, openSSLReadsWhatItMakes) {
    const std::string ticket = asn1parse(img4maker::exampleTicket());
    EXPECT_NE(ticket.find("IA5STRING         :IM4M"), std::string::npos) << ticket;
    EXPECT_NE(ticket.find("IA5STRING         :eksp"), std::string::npos);
    EXPECT_NE(ticket.find("priv [ " + std::to_string(img4maker::fourCC("sepi")) + " ]"), std::string::npos);

    const std::string container = asn1parse(img4maker::exampleContainer());
    EXPECT_NE(container.find("IA5STRING         :IMG4"), std::string::npos) << container;
    EXPECT_NE(container.find("IA5STRING         :PAYP"), std::string::npos);
    EXPECT_NE(container.find("IA5STRING         :IM4R"), std::string::npos);
    EXPECT_NE(container.find("INTEGER           :0100000000"), std::string::npos);
}

} // namespace
