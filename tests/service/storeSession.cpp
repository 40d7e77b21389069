// A session of the data-store library for tests that choose its options: each line of standard input is a command, a
// JSON array, and is answered by one line, the error's code (0 for none) and its text. The device root is the
// environment's.
//   ["open", OPTIONS]  ["trust", URL]
// with the permission for it
//   ["put", CLASS, INSTANCE, PATH]  ["get", CLASS, INSTANCE, PATH]  ["export", [CLASS...], [INSTANCE...]]
#include <algorithm>
#include <iostream>
#include <optional>
#include <string>

#include "platform/Files.h"
#include "platform/Json.h"
#include "platform/OrloDataStore.h"
#include "platform/linux/services/device/DeviceDescription.h"

namespace {

class Session {
public:
    ~Session() { QDSupportSafeRelease(session_); }
    Session() = default;
    Session(const Session&) = delete;
    Session& operator=(const Session&) = delete;

    // Carries out a command whose words are words[0], words[1], ...; what it failed with, if it did.
    std::optional<Error> run(const Value::Array& words) {
        const auto word = [&](std::size_t index) { return index < words.size() ? words[index] : Value(); };
        const std::string verb = word(0).description();
        std::optional<Error> error;
        bool done = false;
        grant(listOf(word(1)), listOf(word(2)));
        if (verb == "open")
            done = open(word(1));
        else if (verb == "trust")
            done = trust(word(1).description(), &error);
        else if (verb == "put")
            done = QDOrloDataPut(session_, word(1), word(2), files::readWhole(word(3).description()).value(), &error);
        else if (verb == "get")
            done = get(word(1), word(2), word(3).description(), &error);
        else if (verb == "export")
            done = QDOrloDataMultiExport(session_, listOf(word(1)), listOf(word(2)), &error);
        else
            return Error{"", -1, "no such command"};
        return done || error ? error : Error{"", -1, "failed without an error"};
    }

private:
    static Value::Array listOf(const Value& names) { return names.array() ? *names.array() : Value::Array{names}; }

    bool open(const Value& options) {
        QDSupportSafeRelease(session_);
        session_ = QDOrloCreateWithOptions(resolveDescribed(options));
        return session_;
    }

    bool trust(const std::string& url, std::optional<Error>* error) {
        Value::Data object;
        Value::Data digest(32);
        if (!QDOrloDataCopyTrustObject(session_, url, &object, error) ||
            QDSupportDigestSha256(object.data(), static_cast<std::uint32_t>(object.size()), digest.data()) != 0)
            return false;
        QDOrloSetOption(session_, "TrustObjectDigest", digest);
        return true;
    }

    void grant(const Value::Array& classes, const Value::Array& instances) {
        std::string permissions;
        for (std::size_t i = 0; i < std::min(classes.size(), instances.size()); ++i)
            for (const OrloAction action : {OrloActionGet, OrloActionPut, OrloActionExport})
                QDOrloAppendPermissionsString(action, classes[i], instances[i], permissions);
        QDOrloSetOption(session_, "Permissions", permissions);
    }

    bool get(const Value& dataClass, const Value& instance, const std::string& path, std::optional<Error>* error) {
        const std::optional<Value::Data> record = QDOrloDataCopy(session_, dataClass, instance, error);
        return record && files::replace(path, *record);
    }

    __QDOrlo* session_ = nullptr;
};

} // namespace

int main() {
    QDOrloLogSetHandler([](void*, const char* message) { std::cerr << message << std::endl; });
    Session session;
    for (std::string line; std::getline(std::cin, line);) {
        const std::optional<Value> words = jsonToValue(line);
        if (!words || !words->array())
            return 2;
        const std::optional<Error> error = session.run(*words->array());
        std::cout << (error ? error->code : 0) << ' ' << (error ? error->text : "") << std::endl;
    }
    return 0;
}
