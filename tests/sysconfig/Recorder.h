// Records what the library reports through its hooks.
#ifndef VELTRA_TESTS_SYSCONFIG_RECORDER_H
#define VELTRA_TESTS_SYSCONFIG_RECORDER_H

#include <cstdarg>
#include <cstdio>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include <gtest/gtest.h>

#include "sysconfig/SysConfig3.h"

using Lines = std::vector<std::string>;

// What a call that fails says: the format of its one message and, where it has arguments, the message.
struct Refusal {
    bool failed;
    std::string format;
    std::string line = format;
};

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

    // The messages' formats, and the messages themselves. A "%s " that a format begins with, or the prototype that it
    // stands for, is cut down to the operation's name and a colon. Exceptions have an exclamation mark before them, and
    // a message of another level than 2 has its level.
    static inline Lines formats, lines;
    // The prototype that the last message began with.
    static inline std::string prototype;

    // Takes the lines recorded so far.
    static Lines take() {
        formats.clear();
        return std::exchange(lines, {});
    }

    // Expects that the calls, all made since this began to record, failed with their messages.
    static void expect(std::span<const Refusal> refusals) {
        ASSERT_EQ(lines.size(), refusals.size());
        for (std::size_t i = 0; i < refusals.size(); ++i) {
            EXPECT_TRUE(refusals[i].failed) << refusals[i].line;
            EXPECT_EQ(formats[i], refusals[i].format);
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

    static void record(const std::string& mark, std::string_view format, std::va_list arguments) {
        char text[1024];
        std::va_list again;
        va_copy(again, arguments);
        const int length = std::vsnprintf(text, sizeof text, format.data(), arguments);
        std::string_view line = length < 0 ? "cannot be formatted" : text;
        std::string name;
        if (format.starts_with("%s ")) {
            prototype = va_arg(again, const char*);
            name = nameOf(prototype);
            line.remove_prefix(prototype.size() + 1);
            format.remove_prefix(3);
        }
        va_end(again);
        formats.push_back(mark + name + std::string(format));
        lines.push_back(mark + name + std::string(line));
    }
};

#endif
