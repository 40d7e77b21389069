// Runs an external program, feeds it and collects what it writes.
//
// A call starts the program as a child process without a shell, with an empty environment, waits for it to end, however
// long that takes, and describes the outcome in a response dictionary of three keys. Processes that the child leaves
// behind are not waited for: what they write after its end is not read.
//   "Status"  0 when the child exited with status 0, otherwise 7
//   "Output"  all that it wrote, as text: U+FFFD stands for each sequence that is no UTF-8, and from a NUL on the rest
//             of the at most 1023 bytes that were read with it is left out; output that memory does not suffice for is
//             no longer read from there on, and the child that goes on writing gets SIGPIPE
//   "Error"   empty on success; after a failure the description of the Error, when the caller asked for one
// The Error of a failure has domain "HSErrorDomain" and code 7. Both out-values may be null; without a response nothing
// is run and the call fails. *error is filled after a failure only.
//
// When a call returns, every descriptor that it opened is closed and the child is gone; one that is found stopped under
// a tracer is killed, since nobody else would ever continue it. Calls may run on several threads at once, but those
// with input ignore SIGPIPE in the whole process while they run and may restore each other's disposition.
#ifndef VELTRA_DAEMON_COMMON_HS_PIPE_UTIL_H
#define VELTRA_DAEMON_COMMON_HS_PIPE_UTIL_H

#include <cstddef>
#include <optional>
#include <string>
#include <vector>

#include <sys/types.h>

#include "platform/Error.h"
#include "platform/Value.h"

class HSPipeUtil {
public:
    HSPipeUtil() = delete;

    // Runs the program at the device path `command` with the arguments `options` and inherited standard input; its
    // standard error is collected with its standard output. Returns 0 when it exited with status 0, otherwise 7.
    static int HSPipeUtilExecCommand(const std::string& command, const std::vector<std::string>& options,
                                     Value* response, std::optional<Error>* error);

    // The same with `data` as the program's standard input; its standard error is inherited.
    static int HSPipeUtilExecCommandWithData(const std::string& command, const std::vector<std::string>& options,
                                             const Value::Data& data, Value* response, std::optional<Error>* error);
};

// What stands under the two operations. `argv` is the program's path and its arguments. The result is the child's exit
// status, or -1 when it could not be started, was killed or stopped by a signal, or could not be waited for.
int hs_execute_command(const std::vector<std::string>& argv, Value* response, std::optional<Error>* error);

// With `length` bytes at `input` as standard input; without any when the length is below 1. Input is fed while output
// is read, so that neither process waits for the other. When the child stops reading, the rest is dropped.
int hs_execute_command_with_input_data(const std::vector<std::string>& argv, const void* input, ssize_t length,
                                       Value* response, std::optional<Error>* error);

// Starts the child, with its process id in `child`, and returns the read end of its output pipe, which the caller
// closes; -1 when it could not be started. With `input`, its standard input is a pipe whose write end goes there for
// the caller to close; *input stays as it is on failure.
int hs_spawn_command(const std::vector<std::string>& argv, pid_t& child, bool collectStandardError, int* input);

#endif
