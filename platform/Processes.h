// Child processes and the pipes to them. Programs are device paths, resolved below the device root, which they cannot
// leave. Descriptors are plain numbers that the caller owns and closes; -1 is none. Pipe ends are closed on exec, so
// that no other program inherits them. All operations may be called from any thread. An error number is one of
// errno(3), and 0 is none.
#ifndef VELTRA_PLATFORM_PROCESSES_H
#define VELTRA_PLATFORM_PROCESSES_H

#include <csignal>
#include <cstddef>
#include <optional>
#include <string>
#include <vector>

#include <sys/types.h>

namespace processes {

struct Pipe {
    int readEnd = -1;
    int writeEnd = -1;
};

// Makes a pipe and returns 0, or an error number. Both ends lie above the standard descriptors, also in a process that
// was started without them, so that spawn can put them in any place.
int createPipe(Pipe& pipe);

void closeDescriptor(int descriptor);

// What becomes the child's standard descriptors; one that is -1 is inherited.
struct StandardDescriptors {
    int input = -1;
    int output = -1;
    int error = -1;
};

// Starts the program argv[0] with the arguments `argv`, an empty environment and no signal blocked; a script runs under
// the interpreter that its first line names. There is no search for the program and no shell. Everything else is
// inherited, and beside it a descriptor of the program itself. Returns 0 and the child in `child`, or an error number.
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

// Waits until `writeEnd` takes bytes or shows that nobody reads them, or `readEnd` has bytes or its end. Either may be
// -1.
struct Ready {
    bool toWrite;
    bool toRead;
};
Ready waitUntilReady(int writeEnd, int readEnd);

// Up to `size` bytes, in one go: the count, 0 at the end, or the negative error number. Interrupted calls are repeated.
ssize_t readSome(int descriptor, void* bytes, std::size_t size);
ssize_t writeSome(int descriptor, const void* bytes, std::size_t size);

// The text of an error number.
std::string errorText(int number);

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
