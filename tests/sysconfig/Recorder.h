// Records what the library reports through its hooks.
#ifndef VELTRA_TESTS_SYSCONFIG_RECORDER_H
#define VELTRA_TESTS_SYSCONFIG_RECORDER_H

#include <cstdarg>
#include <cstdio>
#include <string>
#include <string_view>
#include <type_traits>
#include <utility>

#include <gtest/gtest.h>

#include "sysconfig/SysConfig3.h"
#include "tests/support/MissingArguments.h"

// What an object of a version with HMACs says without a key.
inline const std::string noKeyRegistered = "Invalid HMAC key. sysconfig->hmacKey.data = (nil), "
                                           "sysconfig->hmacKey.length = 0. Did you register HMAC key?";

// While one lives it is registered with both hooks. One at a time.
class Recorder {
public:
    Recorder() {
        take();
        setSysConfig3LogHandler(log);
        setSysConfig3ExceptionHandler(raise);
    }
    ~Recorder() {
        setSysConfig3LogHandler(nullptr);
        setSysConfig3ExceptionHandler(nullptr);
    }
    Recorder(const Recorder&) = delete;
    Recorder& operator=(const Recorder&) = delete;

    // The messages, a line each, with the operation's name and a colon for its prototype. Exceptions have an
    // exclamation mark before them, and a message of another level than 2 has its level.
    static inline std::string said;
    // The prototype that the last message began with.
    static inline std::string prototype;

    // Takes what was said so far.
    static std::string take() { return std::exchange(said, {}); }

private:
    // "allocSysConfig3" of "struct __SysConfig3 *__singleallocSysConfig3(SysConfig3Magic, SysConfig3Version)".
    static std::string nameOf(std::string_view declaration) {
        constexpr std::string_view single = "__single";
        std::string_view name = declaration.substr(0, declaration.find('('));
        name.remove_prefix(name.find_last_of(" *") + 1);
        return std::string(name.substr(name.starts_with(single) ? single.size() : 0));
    }

    SYSCONFIG3_PRINTF(2, 3) static void log(int level, const char* format, ...) {
        std::va_list arguments;
        va_start(arguments, format);
        record(level == 2 ? "" : std::to_string(level) + " ", format, arguments);
        va_end(arguments);
    }

    SYSCONFIG3_PRINTF(1, 2) static void raise(const char* format, ...) {
        std::va_list arguments;
        va_start(arguments, format);
        record("!", format, arguments);
        va_end(arguments);
    }

    SYSCONFIG3_PRINTF(2, 0) static void record(const std::string& mark, const char* format, std::va_list arguments) {
        char text[1024];
        std::vsnprintf(text, sizeof text, format, arguments);
        std::string message = text;
        if (std::string_view(format).starts_with("%s ")) {
            prototype = message.substr(0, message.find(") ") + 1);
            message.replace(0, prototype.size(), nameOf(prototype) + ":");
        }
        said += (said.empty() ? "" : "\n") + mark + message;
    }
};

// Expects that a call fails and says this of itself, and that only.
#define EXPECT_REFUSED(call, reason)                                                                                   \
    EXPECT_FALSE(call);                                                                                                \
    EXPECT_EQ(Recorder::take(), std::string(#call, std::string_view(#call).find('(')) + ": " + (reason))

// Expects that the operation, whichever pointer it lacks, fails and says this of itself.
#define EXPECT_NEEDS(reason, operation, ...) expectNeeds(#operation ": " reason, operation, __VA_ARGS__)

template <typename Result, typename... Parameters>
void expectNeeds(const char* line, Result (*operation)(Parameters...), std::type_identity_t<Parameters>... arguments) {
    std::string lines = line;
    for (int more = (std::is_pointer_v<Parameters> + ...); --more > 0;)
        lines += std::string("\n") + line;
    expectNeedsAll(Result{}, operation, arguments...);
    EXPECT_EQ(Recorder::take(), lines);
}

#endif
