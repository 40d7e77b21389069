// Records what the library reports through its hooks.
#ifndef VELTRA_TESTS_SYSCONFIG_RECORDER_H
#define VELTRA_TESTS_SYSCONFIG_RECORDER_H

#include <cstdarg>
#include <cstdio>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "sysconfig/SysConfig3.h"
#include "tests/support/MissingArguments.h"

using Lines = std::vector<std::string>;

// A call that is to fail, and the one line that it is to say.
struct Refusal {
    bool failed;
    std::string line;
};

// A call that is to fail and to say this of itself.
#define REFUSAL(call, said)                                                                                            \
    Refusal {                                                                                                          \
        !(call), std::string(#call).substr(0, std::string_view(#call).find('(')) + ": " + (said)                       \
    }

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

    // The messages, each as its format with the text of an argument behind every conversion, as in "0x%X<30004>". A "%s
    // " that a format begins with becomes the operation's name and a colon. Exceptions have an exclamation mark before
    // them, and a message of another level than 2 has its level.
    static inline Lines lines;
    // The prototype that the last message began with.
    static inline std::string prototype;

    // Takes the lines recorded so far.
    static Lines take() { return std::exchange(lines, {}); }

    // Expects that the calls, all made since this began to record, failed with their messages.
    static void expect(std::span<const Refusal> refusals) {
        ASSERT_EQ(lines.size(), refusals.size());
        for (std::size_t i = 0; i < refusals.size(); ++i) {
            EXPECT_TRUE(refusals[i].failed) << refusals[i].line;
            EXPECT_EQ(lines[i], refusals[i].line);
        }
    }

private:
    // "allocSysConfig3: " of "struct __SysConfig3 *__singleallocSysConfig3(SysConfig3Magic, SysConfig3Version)".
    static std::string nameOf(std::string_view declaration) {
        constexpr std::string_view single = "__single";
        std::string_view name = declaration.substr(0, declaration.find('('));
        name.remove_prefix(name.find_last_of(" *") + 1);
        return std::string(name.substr(name.starts_with(single) ? single.size() : 0)) + ": ";
    }

    static void log(int level, const char* format, ...) SYSCONFIG3_PRINTF(2, 3) {
        std::va_list arguments;
        va_start(arguments, format);
        record(level == 2 ? "" : std::to_string(level) + " ", format, arguments);
        va_end(arguments);
    }

    static void raise(const char* format, ...) SYSCONFIG3_PRINTF(1, 2) {
        std::va_list arguments;
        va_start(arguments, format);
        record("!", format, arguments);
        va_end(arguments);
    }

    static void record(std::string line, std::string_view format, std::va_list arguments) {
        if (format.starts_with("%s ")) {
            prototype = va_arg(arguments, const char*);
            line += nameOf(prototype);
            format.remove_prefix(3);
        }
        for (std::size_t start; (start = format.find('%')) != std::string_view::npos;) {
            const std::size_t end = format.find_first_of("duXsp", start) + 1;
            const std::string conversion(format.substr(start, end - start));
            char text[64] = "";
            if (conversion.back() == 's' || conversion.back() == 'p')
                std::snprintf(text, sizeof text, conversion.c_str(), va_arg(arguments, const char*));
            else if (conversion.find("ll") != std::string::npos)
                std::snprintf(text, sizeof text, conversion.c_str(), va_arg(arguments, unsigned long long));
            else
                std::snprintf(text, sizeof text, conversion.c_str(), va_arg(arguments, unsigned));
            line.append(format.substr(0, start)).append(conversion + '<' + text + '>');
            format.remove_prefix(end);
        }
        lines.push_back(line.append(format));
    }
};

// Expects that the operation, whichever pointer it lacks, fails and says this of itself.
#define EXPECT_NEEDS(said, operation, ...) expectNeeds(#operation ": " said, operation, __VA_ARGS__)

template <typename Result, typename... Parameters>
void expectNeeds(const char* line, Result (*operation)(Parameters...), std::type_identity_t<Parameters>... arguments) {
    expectNeedsAll(Result{}, operation, arguments...);
    EXPECT_EQ(Recorder::take(), Lines((std::size_t{std::is_pointer_v<Parameters>} + ...), line));
}

#endif
