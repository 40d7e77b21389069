// Records what the library reports through its hooks.
#ifndef VELTRA_TESTS_SYSCONFIG_RECORDER_H
#define VELTRA_TESTS_SYSCONFIG_RECORDER_H

#include <cstdarg>
#include <cstdio>
#include <string>
#include <string_view>
#include <vector>

#include "sysconfig/SysConfig3.h"

// While one lives it is registered with both hooks. One at a time.
class Recorder {
public:
    Recorder() {
        formats.clear();
        lines.clear();
        prototypes.clear();
        levels.clear();
        setSysConfig3LogHandler(log);
        setSysConfig3ExceptionHandler(raise);
    }
    ~Recorder() {
        setSysConfig3LogHandler(nullptr);
        setSysConfig3ExceptionHandler(nullptr);
    }
    Recorder(const Recorder&) = delete;
    Recorder& operator=(const Recorder&) = delete;

    // The formats as they were handed over.
    static inline std::vector<std::string> formats;
    // The formatted messages, with the prototype in front of a message cut down to the operation's name and a colon.
    // Exceptions have an exclamation mark before them.
    static inline std::vector<std::string> lines;
    // The prototypes that the messages began with.
    static inline std::vector<std::string> prototypes;
    // The level of each message, 0 for an exception.
    static inline std::vector<int> levels;

    // Takes the lines recorded so far.
    static std::vector<std::string> take() {
        std::vector<std::string> taken;
        taken.swap(lines);
        formats.clear();
        levels.clear();
        return taken;
    }

    // "allocSysConfig3" of "struct __SysConfig3 *__singleallocSysConfig3(SysConfig3Magic, SysConfig3Version)".
    static std::string nameOf(std::string_view prototype) {
        constexpr std::string_view single = "*__single";
        std::string_view name = prototype.substr(0, prototype.find('('));
        name.remove_prefix(name.rfind(' ') + 1);
        if (name.substr(0, single.size()) == single)
            name.remove_prefix(single.size());
        return std::string(name);
    }

private:
    static void log(int level, const char* format, ...) SYSCONFIG3_PRINTF(2, 3) {
        std::va_list arguments;
        va_start(arguments, format);
        record(level, "", format, arguments);
        va_end(arguments);
    }

    static void raise(const char* format, ...) SYSCONFIG3_PRINTF(1, 2) {
        std::va_list arguments;
        va_start(arguments, format);
        record(0, "!", format, arguments);
        va_end(arguments);
    }

    static void record(int level, const char* mark, std::string_view format, std::va_list arguments) {
        char text[1024];
        std::va_list again;
        va_copy(again, arguments);
        const int length = std::vsnprintf(text, sizeof text, format.data(), arguments);
        std::string line = length < 0 ? "cannot be formatted" : text;
        if (format.substr(0, 3) == "%s ") {
            const std::string_view prototype = va_arg(again, const char*);
            prototypes.emplace_back(prototype);
            line = nameOf(prototype) + ":" + line.substr(prototype.size());
        }
        va_end(again);
        levels.push_back(level);
        formats.emplace_back(format);
        lines.push_back(mark + line);
    }
};

#endif
