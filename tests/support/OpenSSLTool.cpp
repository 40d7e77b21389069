#include "tests/support/OpenSSLTool.h"

#include <filesystem>
#include <fstream>
#include <iterator>

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

// Runs openssl with its output in the file `output`. False unless it ends with success.
bool runOpenSSL(const std::vector<std::string>& arguments, const std::string& output) {
    std::vector<char*> words = {const_cast<char*>(OPENSSL_TOOL)};
    for (const std::string& argument : arguments)
        words.push_back(const_cast<char*>(argument.c_str()));
    words.push_back(nullptr);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, output.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
    pid_t child = 0;
    const int failure = posix_spawn(&child, OPENSSL_TOOL, &actions, nullptr, words.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    int status = 0;
    return failure == 0 && waitpid(child, &status, 0) == child && WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

} // namespace

std::string asn1parse(const std::vector<std::uint8_t>& bytes) {
    const std::string stem =
        (std::filesystem::temp_directory_path() / ("veltra-asn1parse." + std::to_string(getpid()))).string();
    const std::string input = stem + ".der";
    const std::string output = stem + ".txt";
    std::ofstream(input, std::ios::binary)
        .write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
    std::string text;
    if (runOpenSSL({"asn1parse", "-inform", "DER", "-in", input}, output)) {
        std::ifstream file(output);
        text.assign(std::istreambuf_iterator<char>(file), {});
    }
    std::filesystem::remove(input);
    std::filesystem::remove(output);
    return text;
}
