#include "platform/Pause.h"

#include <thread>

void pauseFor(std::chrono::seconds duration) {
    std::this_thread::sleep_for(duration);
}
