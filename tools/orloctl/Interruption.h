// Ctrl-C while orloctl waits, so that it can still say what becomes of the request.
#ifndef VELTRA_TOOLS_ORLOCTL_INTERRUPTION_H
#define VELTRA_TOOLS_ORLOCTL_INTERRUPTION_H

#include <array>
#include <csignal>

// While it lives, the first SIGINT or SIGTERM interrupts a system call that waits and is remembered; the second ends
// the program as ever. A signal that was ignored stays ignored.
class Interruption {
public:
    Interruption();
    Interruption(const Interruption&) = delete;
    Interruption& operator=(const Interruption&) = delete;
    ~Interruption();

    static bool isRaised();

private:
    std::array<struct sigaction, 2> earlier_ = {};
};

#endif
