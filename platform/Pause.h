#ifndef VELTRA_PLATFORM_PAUSE_H
#define VELTRA_PLATFORM_PAUSE_H

#include <chrono>

// Lets the calling thread rest for that long: hardware needs a while that nothing announces the end of.
void pauseFor(std::chrono::milliseconds duration);

#endif
