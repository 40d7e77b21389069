#include "tools/orloctl/Arguments.h"

#include <cerrno>
#include <cstring>
#include <fstream>
#include <iterator>
#include <string_view>
#include <utility>

#include "platform/Files.h"
#include "tools/orloctl/Json.h"

namespace {

Value parseJson(const std::string& key, const std::string& json) {
    try {
        return valueFromJson(json);
    } catch (const JsonFailure& failure) {
        throw UsageError(key + ":= " + failure.what());
    }
}

// Splits at the first "=": what stands before it tells how the rest is read.
std::pair<std::string, Value> parseWord(const std::string& word) {
    const std::size_t equals = word.find('=');
    if (equals == std::string::npos || equals == 0)
        throw UsageError("\"" + word + "\" is none of KEY=TEXT, KEY:=JSON and KEY@=FILE");
    const std::string rest = word.substr(equals + 1);
    const char form = word[equals - 1];
    if (form != ':' && form != '@')
        return {word.substr(0, equals), rest};
    const std::string key = word.substr(0, equals - 1);
    if (key.empty())
        throw UsageError("\"" + word + "\" has no key");
    return {key, form == ':' ? parseJson(key, rest) : Value(readLocalFile(rest))};
}

} // namespace

Value::Dictionary parseArguments(const std::vector<std::string>& words) {
    Value::Dictionary arguments;
    for (const std::string& word : words) {
        auto [key, value] = parseWord(word);
        if (!arguments.emplace(key, std::move(value)).second)
            throw UsageError("The key \"" + key + "\" is given twice");
    }
    return arguments;
}

Value::Data readLocalFile(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    Value::Data contents;
    char piece[65536];
    while (file.read(piece, sizeof piece) || file.gcount() > 0) {
        contents.insert(contents.end(), piece, piece + file.gcount());
        if (contents.size() > files::maximumSize)
            throw UsageError(path + " is larger than 256 MiB");
    }
    if (!file.eof())
        throw UsageError("Cannot read " + path + ": " + std::strerror(errno));
    return contents;
}

void writeLocalFile(const std::string& path, const Value::Data& contents) {
    std::ofstream file(path, std::ios::binary | std::ios::trunc);
    file.write(reinterpret_cast<const char*>(contents.data()), static_cast<std::streamsize>(contents.size()));
    file.close();
    if (!file)
        throw UsageError("Cannot write " + path + ": " + std::strerror(errno));
}
