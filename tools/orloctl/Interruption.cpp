#include "tools/orloctl/Interruption.h"

namespace {

constexpr std::array signals = {SIGINT, SIGTERM};

volatile std::sig_atomic_t raised = 0;

void raise(int) {
    raised = 1;
}

} // namespace

Interruption::Interruption() {
    struct sigaction action = {};
    action.sa_handler = raise;
    action.sa_flags = static_cast<int>(SA_RESETHAND);
    for (std::size_t i = 0; i < signals.size(); ++i) {
        ::sigaction(signals[i], nullptr, &earlier_[i]);
        if (earlier_[i].sa_handler != SIG_IGN)
            ::sigaction(signals[i], &action, nullptr);
    }
}

Interruption::~Interruption() {
    for (std::size_t i = 0; i < signals.size(); ++i)
        ::sigaction(signals[i], &earlier_[i], nullptr);
}

bool Interruption::isRaised() {
    return raised != 0;
}
