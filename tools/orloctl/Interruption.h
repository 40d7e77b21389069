// Ctrl-C while orloctl waits, so that it can still say what becomes of the request.
#ifndef VELTRA_TOOLS_ORLOCTL_INTERRUPTION_H
#define VELTRA_TOOLS_ORLOCTL_INTERRUPTION_H

#include <csignal>
#include <map>

// While it lives, the first SIGINT, SIGTERM or SIGHUP interrupts a system call that waits and is remembered; the second
// ends the program as ever. A signal that was ignored stays ignored.
class Interruption {
public:
    Interruption() {
        struct sigaction action = {};
        action.sa_handler = [](int) { raised_ = 1; };
        action.sa_flags = static_cast<int>(SA_RESETHAND);
        for (auto& [signal, earlier] : earlier_) {
            ::sigaction(signal, nullptr, &earlier);
            if (earlier.sa_handler != SIG_IGN)
                ::sigaction(signal, &action, nullptr);
        }
    }
    Interruption(const Interruption&) = delete;
    Interruption& operator=(const Interruption&) = delete;
    ~Interruption() {
        for (const auto& [signal, earlier] : earlier_)
            ::sigaction(signal, &earlier, nullptr);
    }

    static bool isRaised() { return raised_ != 0; }

private:
    static inline volatile std::sig_atomic_t raised_ = 0;
    std::map<int, struct sigaction> earlier_{{SIGINT, {}}, {SIGTERM, {}}, {SIGHUP, {}}};
};

#endif
