#ifndef VELTRA_TESTS_OWN_PROCESS_H
#define VELTRA_TESTS_OWN_PROCESS_H

#include <cstddef>
#include <cstdlib>
#include <fstream>

#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <gtest/gtest.h>
#include <malloc.h>

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

// Runs `body` in six such processes at once, with the number of each.
template <class Body>
void inProcessesAtOnce(Body body) {
    for (int number = 0; number < 6; ++number)
        if (::fork() == 0) {
            body(number);
            std::_Exit(testing::Test::HasFailure() ? 1 : 0);
        }
    for (int status = 0; ::wait(&status) > 0;)
        EXPECT_EQ(status, 0);
}

#ifdef VELTRA_MEMORY_CAN_BE_LIMITED
// Lets the process, one of inOwnProcess, have `bytes` of memory more than it has now.
inline void limitMemory(std::size_t bytes) {
    std::size_t pages = 0;
    std::ifstream("/proc/self/statm") >> pages;
    ASSERT_GT(pages, 0U);
    const rlim_t limit = pages * static_cast<std::size_t>(::getpagesize()) + bytes;
    const rlimit limits{limit, limit};
    ::mallopt(M_ARENA_MAX, 1); // a new thread would take address space for a heap of its own
    ASSERT_EQ(::setrlimit(RLIMIT_AS, &limits), 0);
}
#endif

#endif
