#ifndef VELTRA_TESTS_OWN_PROCESS_H
#define VELTRA_TESTS_OWN_PROCESS_H

#include <cstdlib>

#include <gtest/gtest.h>

// Runs `body` in a child process, for what a process does once or cannot take back. Its expectations count as those of
// the calling test.
template <class Body>
void inOwnProcess(Body body) {
    const auto run = [&body] {
        body();
        std::_Exit(testing::Test::HasFailure() ? 1 : 0);
    };
    EXPECT_EXIT(run(), testing::ExitedWithCode(0), "");
}

#endif
