// Child processes and the pipes to them. Programs are device paths, resolved below the device root, which they cannot
// leave. Descriptors are plain numbers, which stay the caller's; -1 is none. Pipe ends are closed on exec, so that no
// other program inherits them. All operations may be called from any thread. An error number is one of
// errno(3), and 0 is none.
#ifndef VELTRA_PLATFORM_PROCESSES_H
#define VELTRA_PLATFORM_PROCESSES_H

#include <csignal>
#include <cstddef>
#include <optional>
#include <string>
#include <vector>

#include <sys/types.h>

#include "platform/FileDescriptor.h"

namespace processes {

struct Pipe {
    FileDescriptor readEnd;
    FileDescriptor writeEnd;
};

// Makes a pipe and returns 0, or an error number. Both ends lie above the standard descriptors, also in a process that
// was started without them, so that spawn can put them in any place.
int createPipe(Pipe& pipe);

// What becomes the child's standard descriptors; one that is -1 is inherited.
struct StandardDescriptors {
    int input = -1;
    int output = -1;
    int error = -1;
};

// Starts the program argv[0] with the arguments `argv`, an empty environment and no signal blocked; a script runs under
// the interpreter that its first line names. There is no search for the program and no shell. Everything else is
// inherited. Where the resolved program lies is what the kernel runs, so that a script finds itself there. Returns 0
// and the child in `child`, or an error number.
int spawn(const std::vector<std::string>& argv, const StandardDescriptors& standard, pid_t& child);

// How a child ended.
struct Ending {
    enum Kind {
        Exited,     // number is the exit status
        Terminated, // number is the signal
        Stopped,    // number is the signal; the child is still there
        Unknown,    // waiting failed, and number is the error number
    };
    Kind kind;
    int number;
};

// Waits for the child, as long as it takes. Only a child that is being traced is reported as stopped.
Ending waitFor(pid_t child);

// Kills a child, stopped or not, and waits until it is gone.
void killAndWait(pid_t child);

// Makes writes to this end answer at once, with what fits. The other end is not affected.
void makeNonBlocking(int descriptor);

// A descriptor that can be read once the child has ended; none when the kernel has none to give.
FileDescriptor openEnding(pid_t child);

// Waits until `writeEnd` takes bytes or shows that nobody reads them, `readEnd` has bytes or its end, or the child has
// ended. Either end may be -1; `ending` is what openEnding gave, and without it the child is looked at now and then.
struct Ready {
    bool toWrite;
    bool toRead;
    bool hasEnded;
};
Ready waitUntilReady(int writeEnd, int readEnd, pid_t child, int ending);

// The number of bytes that can be read without waiting.
std::size_t readableBytes(int readEnd);

// Up to `size` bytes, in one go: the count, 0 at the end, or the negative error number. Interrupted calls are repeated.
ssize_t readSome(int descriptor, void* bytes, std::size_t size);
ssize_t writeSome(int descriptor, const void* bytes, std::size_t size);

// The text of an error number.
const char* errorText(int number);

// Takes SIGPIPE with a handler that does nothing from here on, whatever the process inherited: a write that nobody
// reads fails, and a program that is started has the signal's default.
void catchBrokenPipe();

// Fills up the standard descriptors of a process that was started without some of them, so that no file or connection
// that it opens gets the number of one. Programs that it starts do not inherit what is filled in.
void openStandardDescriptors();

// Ignores SIGPIPE in the whole process for as long as it lives, so that a write to a pipe that nobody reads fails
// instead of ending the process, and then restores what was before.
class BrokenPipeIgnored {
public:
    BrokenPipeIgnored();
    ~BrokenPipeIgnored();
    BrokenPipeIgnored(const BrokenPipeIgnored&) = delete;
    BrokenPipeIgnored& operator=(const BrokenPipeIgnored&) = delete;

private:
    std::optional<struct sigaction> previous_; // none when it could not be read
};

} // namespace processes

#endif
