#include "platform/linux/system/DescriptionCheck.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <numeric>
#include <span>
#include <string_view>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>

#include "platform/DeviceRoot.h"
#include "platform/Utf8.h"
#include "platform/linux/system/DescribedValue.h"

namespace {

constexpr std::size_t mostFaults = 20;
constexpr std::size_t longestName = 64;

enum Kinds : unsigned {
    none = 0,
    text = 1,
    integer = 2,
    boolean = 4,
    data = 8,
    array = 16,
    object = 32,
    identity = text | integer | data, // what is made a text: an instance of a data class, or a part of one
    file = text | 64,                 // the path of a file that has to be there
};

constexpr std::pair<unsigned, std::string_view> kindNames[] = {
    {text, "text"}, {integer, "integer"}, {boolean, "boolean"}, {data, "data"}, {array, "array"}, {object, "object"}};

struct Section;

struct Key {
    std::string_view name; // empty for any name
    unsigned kinds;
    const Section* section = nullptr;             // of the object, or of each object of the array
    std::span<const std::string_view> words = {}; // the texts that it may be; none for any
};

struct Section {
    std::span<const Key> keys;
};

// What the readers of each section look up.
constexpr Key answerKeys[] = {
    {"HWModelStr", text},
    {"ScreenSerialNumber", text},
    {"VanterSerialNumber", identity},
    {"MiravelSerialNumber", text},
    {"CoverGlassSerialNumber", text},
    {"AmbientLightSensorSerialNumber", text},
    {"FrontCameraModuleSerialNumber", text},
    {"VanterChipID", identity},
    {"VanterUID", identity},
    {"LoddenChipID", identity},
    {"LoddenUID", identity},
    {"TopModuleAuthChipID", identity},
    {"UniqueChipID", identity},
    {"ChipID", identity},
};
constexpr Section answers{answerKeys};

constexpr Key tansuKeys[] = {{"ProxSerialNumber", text}, {"BackglassCompassSerialNumber", text}};
constexpr Section tansu{tansuKeys};

constexpr Key propertyKeys[] = {{"AccessoryCertificate", data}};
constexpr Section properties{propertyKeys};

extern const Section service;
constexpr Key serviceKeys[] = {{"class", text}, {"properties", object, &properties}, {"children", array, &service}};
constexpr Section service{serviceKeys};

constexpr std::string_view authenticationModes[] = {"key", "pass", "fail", "silent"};
constexpr Key authenticationKeys[] = {
    {"mode", text, nullptr, authenticationModes}, {"key", file}, {"delayMs", integer}};
constexpr Section authentication{authenticationKeys};

constexpr Key eventKeys[] = {{"status", integer}, {"afterMs", integer}};
constexpr Section event{eventKeys};
constexpr Key proxyKeys[] = {
    {"HTTPEnable", integer | boolean},  {"HTTPProxy", text},  {"HTTPPort", integer},
    {"HTTPSEnable", integer | boolean}, {"HTTPSProxy", text}, {"HTTPSPort", integer},
};
constexpr Section proxy{proxyKeys};
constexpr Key reverseProxyKeys[] = {{"events", array, &event}, {"proxy", object, &proxy}};
constexpr Section reverseProxy{reverseProxyKeys};

constexpr std::string_view updaterSteps[] = {"create", "isDone", "queryInfo", "performNextStage"};
constexpr Key vanterKeys[] = {{"done", integer | boolean}, {"firmware", text}, {"fail", text, nullptr, updaterSteps}};
constexpr Section vanter{vanterKeys};

constexpr Key connectToKeys[] = {{"", text}};
constexpr Section connectTo{connectToKeys};
constexpr Key objectStoreKeys[] = {
    {"region", text}, {"bucket", text}, {"accessKeyFile", file}, {"conditional", boolean}};
constexpr Section objectStore{objectStoreKeys};
constexpr std::string_view backends[] = {"embedded", "remote"};
constexpr Key storeKeys[] = {
    {"backend", text, nullptr, backends},
    {"path", text},
    {"dataVersion", integer},
    {"caFile", file},
    {"connectTo", object, &connectTo},
    {"s3", object, &objectStore},
};
constexpr Section store{storeKeys};

constexpr Key rootKeys[] = {
    {"answers", object, &answers},
    {"tansu", object, &tansu},
    {"registry", array, &service},
    {"componentAuth", object, &authentication},
    {"reverseProxy", object, &reverseProxy},
    {"vanter", object, &vanter},
    {"store", object, &store},
};
constexpr Section root{rootKeys};

unsigned kindOf(const Value& value) {
    return value.text()         ? text
           : value.isBoolean()  ? boolean
           : value.isNumber()   ? integer
           : value.data()       ? data
           : value.array()      ? array
           : value.dictionary() ? object
                                : none;
}

std::string nameOf(unsigned kinds) {
    std::string names;
    for (const auto& [kind, name] : kindNames)
        if ((kinds & kind) != 0)
            (names += names.empty() ? "" : " or ") += name;
    return names.empty() ? "null or a number that is no integer of 64 bits" : names;
}

// How many characters have to be put in, taken out or changed to make one name of the other (Levenshtein distance).
std::size_t distance(std::string_view from, std::string_view to) {
    std::vector<std::size_t> row(to.size() + 1);
    std::iota(row.begin(), row.end(), std::size_t{0});
    for (std::size_t i = 0; i < from.size(); ++i) {
        std::size_t diagonal = std::exchange(row[0], i + 1);
        for (std::size_t j = 0; j < to.size(); ++j) {
            const std::size_t changed = diagonal + (from[i] != to[j] ? 1 : 0);
            diagonal = row[j + 1];
            row[j + 1] = std::min({changed, row[j] + 1, diagonal + 1});
        }
    }
    return row.back();
}

class Check {
public:
    void checkObject(const Value& value, const Section& section, const std::string& place) {
        for (const auto& [name, entry] : *value.dictionary()) {
            const std::string inner = (place.empty() ? place : place + ".") + shown(name);
            const auto key = std::find_if(section.keys.begin(), section.keys.end(), [&name = name](const Key& known) {
                return known.name.empty() || known.name == name;
            });
            if (key != section.keys.end())
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
        const unsigned kind =
            value["$data"].isNothing() && value["$file"].isNothing() ? kindOf(value) : checkDescribed(value, place);
        if (kind == malformed)
            return;
        if ((kind & key.kinds) == 0)
            return add(place + " is " + nameOf(kind) + " and has to be " + nameOf(key.kinds));
        if (key.section && kind == array)
            checkElements(*value.array(), *key.section, place);
        else if (key.section)
            checkObject(value, *key.section, place);
        if (!value.text())
            return;
        if (key.kinds == file)
            checkFile(*value.text(), place);
        if (!key.words.empty() && std::find(key.words.begin(), key.words.end(), *value.text()) == key.words.end())
            add(place + " is " + shown(*value.text()) + " and has to be " + listed(key.words));
    }

    void checkElements(const Value::Array& elements, const Section& section, const std::string& place) {
        for (std::size_t i = 0; i < elements.size(); ++i)
            checkValue(elements[i], {"", object, &section}, place + "[" + std::to_string(i) + "]");
    }

    // The kind of the value that a described value stands for; `malformed`, once that is said, when it is none.
    unsigned checkDescribed(const Value& value, const std::string& place) {
        if (!value["$data"].isNothing()) {
            if (!resolveDescribed(value).isNothing())
                return data;
            add(place + " has a $data that is not pairs of hexadecimal digits alone");
            return malformed;
        }
        const Value &path = value["$file"], &as = value["as"];
        const bool asText = as == Value("text");
        if (!path.text() || !(asText || as.isNothing() || as == Value("data")) ||
            value.dictionary()->size() != 1 + value.dictionary()->count("as")) {
            add(place + R"( has a $file that is no path with nothing beside it but "as": "data" or "as": "text")");
            return malformed;
        }
        checkFile(*path.text(), place);
        return asText ? text : data;
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

    static std::string nearest(std::string_view name, const Section& section) {
        if (name.size() > longestName)
            return {};
        const auto by = [name](const Key& a, const Key& b) { return distance(name, a.name) < distance(name, b.name); };
        const std::string_view best = std::min_element(section.keys.begin(), section.keys.end(), by)->name;
        return distance(name, best) > best.size() / 3 ? "" : "; is " + std::string(best) + " meant?";
    }

    static std::string shown(std::string_view name) {
        std::string text;
        utf8::appendOnOneLine(text, utf8::beginning(name, longestName));
        return name.size() > longestName ? text + "..." : text;
    }

    static std::string listed(std::span<const std::string_view> words) {
        std::string text;
        for (const std::string_view word : words)
            (text += text.empty() ? "" : word == words.back() ? " or " : ", ") += word;
        return text;
    }

    // Beyond the most that are said they are only counted.
    void add(std::string fault) {
        if (++found_ <= mostFaults)
            faults_.push_back(std::move(fault));
    }

    static constexpr unsigned malformed = ~0U;

    std::vector<std::string> faults_;
    std::size_t found_ = 0;
};

} // namespace

std::vector<std::string> descriptionFaults(const Value& description) {
    Check check;
    if (description.dictionary())
        check.checkObject(description, root, "");
    return check.take();
}
