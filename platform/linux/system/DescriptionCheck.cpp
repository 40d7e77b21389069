#include "platform/linux/system/DescriptionCheck.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <string_view>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>

#include "platform/DeviceRoot.h"
#include "platform/NearestName.h"
#include "platform/Utf8.h"
#include "platform/linux/system/DescribedValue.h"

namespace {

constexpr std::size_t mostFaults = 20;
constexpr std::size_t longestName = 64;

// Lists are texts: "one, two or three".
constexpr std::string_view identity = "text or integer or data"; // what is made an instance of a data class
constexpr std::string_view number = "integer or boolean";
constexpr std::string_view nothing = "null or a number that is no integer of 64 bits";
constexpr std::string_view aFile = "path of a file that has to be there";

// A key that somebody reads.
struct Key {
    std::string_view section;    // the object that has it
    std::string_view name;       // empty for any name
    std::string_view kinds;      // a list
    std::string_view inner = {}; // the section of the object, or of each object of the array; or aFile
    std::string_view words = {}; // a list of the texts that it may be; empty for any
};

constexpr Key keys[] = {
    {"", "answers", "object", "answers"},
    {"answers", "HWModelStr", "text"},
    {"answers", "ScreenSerialNumber", "text"},
    {"answers", "VanterSerialNumber", identity},
    {"answers", "MiravelSerialNumber", "text"},
    {"answers", "CoverGlassSerialNumber", "text"},
    {"answers", "AmbientLightSensorSerialNumber", "text"},
    {"answers", "FrontCameraModuleSerialNumber", "text"},
    {"answers", "VanterChipID", identity},
    {"answers", "VanterUID", identity},
    {"answers", "LoddenChipID", identity},
    {"answers", "LoddenUID", identity},
    {"answers", "TopModuleAuthChipID", identity},
    {"answers", "UniqueChipID", identity},
    {"answers", "ChipID", identity},

    {"", "tansu", "object", "tansu"},
    {"tansu", "ProxSerialNumber", "text"},
    {"tansu", "BackglassCompassSerialNumber", "text"},

    {"", "registry", "array", "service"},
    {"service", "class", "text"},
    {"service", "properties", "object", "properties"},
    {"service", "children", "array", "service"},
    {"properties", "AccessoryCertificate", "data"},

    {"", "componentAuth", "object", "componentAuth"},
    {"componentAuth", "mode", "text", "", "key, pass, fail or silent"},
    {"componentAuth", "key", "text", aFile},
    {"componentAuth", "delayMs", "integer"},

    {"", "reverseProxy", "object", "reverseProxy"},
    {"reverseProxy", "events", "array", "event"},
    {"event", "status", "integer"},
    {"event", "afterMs", "integer"},
    {"reverseProxy", "proxy", "object", "proxy"},
    {"proxy", "HTTPEnable", number},
    {"proxy", "HTTPProxy", "text"},
    {"proxy", "HTTPPort", "integer"},
    {"proxy", "HTTPSEnable", number},
    {"proxy", "HTTPSProxy", "text"},
    {"proxy", "HTTPSPort", "integer"},

    {"", "vanter", "object", "vanter"},
    {"vanter", "done", number},
    {"vanter", "firmware", "text"},
    {"vanter", "fail", "text", "", "create, isDone, queryInfo or performNextStage"},

    {"", "store", "object", "store"},
    {"store", "backend", "text", "", "embedded or remote"},
    {"store", "path", "text"},
    {"store", "dataVersion", "integer"},
    {"store", "caFile", "text", aFile},
    {"store", "connectTo", "object", "connectTo"},
    {"connectTo", "", "text"},
    {"store", "s3", "object", "s3"},
    {"s3", "region", "text"},
    {"s3", "bucket", "text"},
    {"s3", "accessKeyFile", "text", aFile},
    {"s3", "conditional", "boolean"},
};

bool isListed(std::string_view word, std::string_view list) {
    for (std::size_t start = 0, end = 0; end < list.size(); start = list.find_first_not_of(", ", end)) {
        end = std::min(list.find_first_of(", ", start), list.size());
        if (list.substr(start, end - start) == word)
            return word != "or";
    }
    return false;
}

std::string_view kindOf(const Value& value) {
    return value.text()         ? "text"
           : value.isBoolean()  ? "boolean"
           : value.isNumber()   ? "integer"
           : value.data()       ? "data"
           : value.array()      ? "array"
           : value.dictionary() ? "object"
                                : nothing;
}

class Check {
public:
    void checkObject(const Value& value, std::string_view section, const std::string& place) {
        for (const auto& [name, entry] : *value.dictionary()) {
            const std::string inner = (place.empty() ? place : place + ".") + shown(name);
            const Key* const key = std::ranges::find_if(keys, [&name = name, section](const Key& known) {
                return known.section == section && (known.name.empty() || known.name == name);
            });
            if (key != std::end(keys))
                checkValue(entry, *key, inner);
            else
                add("nobody reads " + inner + nearest(name, section));
        }
    }

    std::vector<std::string> take() {
        if (found_ > mostFaults)
            faults_.push_back("and " + std::to_string(found_ - mostFaults) + " more");
        return std::move(faults_);
    }

private:
    void checkValue(const Value& value, const Key& key, const std::string& place) {
        const std::string_view kind =
            value["$data"].isNothing() && value["$file"].isNothing() ? kindOf(value) : checkDescribed(value, place);
        if (kind.empty())
            return;
        if (!isListed(kind, key.kinds))
            return add(place + " is " + std::string(kind) + " and has to be " + std::string(key.kinds));
        if (kind == "array")
            for (std::size_t i = 0; i < value.array()->size(); ++i)
                checkValue((*value.array())[i], {"", "", "object", key.inner}, place + "[" + std::to_string(i) + "]");
        else if (kind == "object")
            checkObject(value, key.inner, place);
        if (!value.text())
            return;
        if (key.inner == aFile)
            checkFile(*value.text(), place);
        if (!key.words.empty() && !isListed(*value.text(), key.words))
            add(place + " is " + shown(*value.text()) + " and has to be " + std::string(key.words));
    }

    // The kind of the value that a described value stands for; none, once that is said, when it is malformed.
    std::string_view checkDescribed(const Value& value, const std::string& place) {
        if (!value["$data"].isNothing()) {
            if (!resolveDescribed(value).isNothing())
                return "data";
            add(place + " has a $data that is not pairs of hexadecimal digits alone");
            return {};
        }
        const Value &path = value["$file"], &as = value["as"];
        const bool asText = as == Value("text");
        if (!path.text() || !(asText || as.isNothing() || as == Value("data")) ||
            value.dictionary()->size() != 1 + value.dictionary()->count("as")) {
            add(place + R"( has a $file that is no path with nothing beside it but "as": "data" or "as": "text")");
            return {};
        }
        checkFile(*path.text(), place);
        return asText ? "text" : "data";
    }

    void checkFile(const std::string& path, const std::string& place) {
        struct stat status = {};
        const FileDescriptor found = openInRoot(path, O_PATH);
        if (!found || ::fstat(found.get(), &status) != 0)
            add("the file " + shown(path) + " of " + place +
                (errno == ENOENT ? " is missing" : std::string(" cannot be looked at: ") + std::strerror(errno)));
        else if (!S_ISREG(status.st_mode))
            add("the file " + shown(path) + " of " + place + " is no regular file");
    }

    static std::string nearest(std::string_view name, std::string_view section) {
        std::vector<std::string_view> known;
        for (const Key& key : keys)
            if (key.section == section)
                known.push_back(key.name);
        const std::string_view meant = nearestName(name, known);
        return meant.empty() ? "" : "; is " + std::string(meant) + " meant?";
    }

    static std::string shown(std::string_view name) {
        return utf8::escaped(utf8::beginning(name, longestName)) + (name.size() > longestName ? "..." : "");
    }

    // Beyond the most that are said they are only counted.
    void add(std::string fault) {
        if (++found_ <= mostFaults)
            faults_.push_back(std::move(fault));
    }

    std::vector<std::string> faults_;
    std::size_t found_ = 0;
};

} // namespace

std::vector<std::string> descriptionFaults(const Value& description) {
    Check check;
    if (description.dictionary())
        check.checkObject(description, "", "");
    return check.take();
}
