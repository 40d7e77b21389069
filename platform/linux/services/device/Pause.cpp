#include "platform/Pause.h"

#include <thread>

void pauseFor(std::chrono::milliseconds duration) {
    std::this_thread::sleep_for(duration);
}
