#include "Daemon/Common/HSPipeUtil.h"

#include <algorithm>
#include <cerrno>
#include <new>
#include <optional>
#include <string_view>
#include <utility>

#include "Daemon/HSLog.h"
#include "platform/Processes.h"
#include "platform/Utf8.h"

namespace {

constexpr LogSource pipeLog{"HSPipeUtil"};

constexpr int failed = 7;
constexpr int noExitStatus = -1;
constexpr std::size_t chunkSize = 1023;

std::string_view programOf(const std::vector<std::string>& argv) {
    return argv.empty() ? std::string_view() : argv.front();
}

// Waits for a child that nobody else has waited for, so that it is reaped also when memory runs out on the way.
class Child {
public:
    explicit Child(pid_t process) : process_(process), ending_(processes::openEnding(process)) {}
    Child(const Child&) = delete;
    Child& operator=(const Child&) = delete;
    ~Child() {
        if (!waited_)
            processes::killAndWait(process_);
    }

    processes::Ready waitUntilReady(int writeEnd, int readEnd) const {
        return processes::waitUntilReady(writeEnd, readEnd, process_, ending_.get());
    }

    // How the child ended. One that is stopped is killed after the wait.
    processes::Ending wait() {
        const processes::Ending ending = processes::waitFor(process_);
        waited_ = true;
        if (ending.kind == processes::Ending::Stopped)
            processes::killAndWait(process_);
        return ending;
    }

private:
    pid_t process_;
    FileDescriptor ending_;
    bool waited_ = false;
};

// The output of a child as it comes in, chunk by chunk.
class Output {
public:
    explicit Output(FileDescriptor readEnd) : readEnd_(std::move(readEnd)) {}

    // Reads one chunk of at most `longest` bytes and returns how many it had: none at the end of the output and when it
    // cannot be read or kept.
    std::size_t readChunk(std::size_t longest = chunkSize) {
        char chunk[chunkSize];
        const ssize_t count = processes::readSome(readEnd_.get(), chunk, std::min(longest, chunkSize));
        const std::size_t read = count > 0 ? static_cast<std::size_t>(count) : 0;
        if (read > 0 && append({chunk, read}))
            return read;
        readEnd_ = FileDescriptor();
        return 0;
    }

    // Reads to the end of the output or, once the child has ended, what is there by then: those that have the other end
    // from the child and live on are not waited for.
    void readToEnd(const Child& child) {
        while (readEnd_) {
            const processes::Ready ready = child.waitUntilReady(-1, readEnd_.get());
            if (ready.hasEnded) {
                for (std::size_t left = processes::readableBytes(readEnd_.get()); left > 0 && readEnd_;)
                    left -= readChunk(left);
                readEnd_ = FileDescriptor();
            } else {
                readChunk();
            }
        }
    }

    // The read end, -1 once the end was met.
    int descriptor() const { return readEnd_.get(); }

    std::string takeText() try {
        text_ += utf8::repaired(std::exchange(incomplete_, {}));
        return std::move(text_);
    } catch (const std::bad_alloc&) {
        return std::move(text_);
    }

private:
    // A character that the end of a chunk cuts in two waits for its rest, unless a NUL ends the chunk before. False
    // when memory does not suffice; the text then ends before the chunk.
    bool append(std::string_view chunk) try {
        const std::size_t end = std::min(chunk.find('\0'), chunk.size());
        const std::string pending = std::exchange(incomplete_, {}).append(chunk.substr(0, end));
        std::size_t whole = pending.size();
        if (end == chunk.size())
            whole -= incompleteTail(pending);
        text_ += utf8::repaired(std::string_view(pending).substr(0, whole));
        incomplete_ = pending.substr(whole);
        return true;
    } catch (const std::bad_alloc&) {
        return false;
    }

    // The length of the character at the end of `text` that is not all there. No character is longer than four bytes.
    static std::size_t incompleteTail(std::string_view text) {
        for (std::size_t length = std::min<std::size_t>(3, text.size()); length > 0; --length) {
            const utf8::Step step = utf8::next(text.substr(text.size() - length));
            if (step.kind == utf8::Step::Incomplete && step.length == length)
                return length;
        }
        return 0;
    }

    FileDescriptor readEnd_;
    std::string text_;
    std::string incomplete_;
};

struct Input {
    const void* bytes;
    ssize_t length; // below 1 for nothing
};

// Writes the input and reads what comes meanwhile; the child then sees the end of its input. Once the child has ended,
// nobody else is waited for to take the rest.
void feed(std::string_view program, const Child& child, FileDescriptor writeEnd, const Input& input, Output& output) {
    const char* next = static_cast<const char*>(input.bytes);
    std::size_t length = input.length > 0 ? static_cast<std::size_t>(input.length) : 0;
    processes::makeNonBlocking(writeEnd.get());
    while (length > 0) {
        const processes::Ready ready = child.waitUntilReady(writeEnd.get(), output.descriptor());
        if (ready.toRead && output.descriptor() >= 0)
            output.readChunk();
        if (!ready.toWrite && ready.hasEnded)
            break;
        if (!ready.toWrite)
            continue;
        const ssize_t count = processes::writeSome(writeEnd.get(), next, length);
        if (count >= 0) {
            next += count;
            length -= static_cast<std::size_t>(count);
        } else if (count != -EAGAIN) {
            pipeLog.info("write failed for %s: %s\n", program, processes::errorText(static_cast<int>(-count)));
            break;
        }
    }
}

// The result that an ending stands for. An exit is a word in the log of a call with input only.
int resultOf(const processes::Ending& ending, std::string_view program, bool withInput) {
    using processes::Ending;
    if (withInput && ending.kind != Ending::Unknown)
        pipeLog.info("child exited\n");
    switch (ending.kind) {
    case Ending::Exited:
        if (withInput)
            pipeLog.info("exit status: %d\n", ending.number);
        return ending.number;
    case Ending::Stopped:
        pipeLog.info("%s was stopped by signal %d\n", program, ending.number);
        break;
    case Ending::Terminated:
        pipeLog.info("%s was terminated by signal %d\n", program, ending.number);
        break;
    case Ending::Unknown:
        pipeLog.info("waitpid failed for %s: %s\n", program, processes::errorText(ending.number));
        break;
    }
    return noExitStatus;
}

struct Outcome {
    int result = noExitStatus;
    std::string output = {};
};

Outcome run(const std::vector<std::string>& argv, const Input* input) {
    std::optional<processes::BrokenPipeIgnored> brokenPipeIgnored;
    if (input) {
        brokenPipeIgnored.emplace();
        pipeLog.info("entering hs_execute_command_with_input_data: %s (%p - %zu)\n", programOf(argv), input->bytes,
                     input->length);
    }
    pid_t process = 0;
    int writeEnd = -1;
    const int readEnd = hs_spawn_command(argv, process, !input, input ? &writeEnd : nullptr);
    if (readEnd < 0)
        return {};
    Child child(process);
    Output output{FileDescriptor(readEnd)};
    if (input)
        feed(programOf(argv), child, FileDescriptor(writeEnd), *input, output);
    pipeLog.info("Start Reading output from shell command\n");
    output.readToEnd(child);
    if (input)
        pipeLog.info("waiting for child to exit\n");
    const int result = resultOf(child.wait(), programOf(argv), input != nullptr);
    return {result, output.takeText()};
}

// Runs the program, unless there is no response to describe the outcome in.
int execute(const std::vector<std::string>& argv, const Input* input, const char* failureFormat, Value* response,
            std::optional<Error>* error) {
    Outcome outcome;
    if (response)
        outcome = run(argv, input);
    else
        pipeLog.error("Input response dictionary pointer is NULL.");
    Value::Dictionary dictionary{{"Status", outcome.result == 0 ? 0 : failed}, {"Error", ""}};
    dictionary["Output"] = std::move(outcome.output); // in the list it would be copied
    if (outcome.result != 0) {
        const std::string description = format(failureFormat, outcome.result);
        pipeLog.info("%@", description);
        if (error) {
            *error = Error{"HSErrorDomain", failed, description};
            dictionary["Error"] = description;
            pipeLog.info("%@", *error);
        }
    }
    if (response)
        *response = std::move(dictionary);
    return outcome.result;
}

std::vector<std::string> argumentVector(const std::string& command, const std::vector<std::string>& options) {
    std::vector<std::string> argv{command};
    argv.insert(argv.end(), options.begin(), options.end());
    return argv;
}

} // namespace

int hs_spawn_command(const std::vector<std::string>& argv, pid_t& child, bool collectStandardError, int* input) {
    const std::string_view program = programOf(argv);
    pipeLog.info("executing %s\n", program);
    processes::Pipe outputPipe, inputPipe;
    int problem = processes::createPipe(outputPipe);
    if (problem == 0 && input)
        problem = processes::createPipe(inputPipe);
    if (problem != 0) {
        pipeLog.info("pipe failed while preparing to execute %s: %s\n", program, processes::errorText(problem));
        return -1;
    }
    const int childOutput = outputPipe.writeEnd.get();
    const int childError = collectStandardError ? childOutput : -1;
    problem = processes::spawn(argv, {inputPipe.readEnd.get(), childOutput, childError}, child);
    if (problem != 0) {
        pipeLog.info("posix_spawn %s failed: %s\n", program, processes::errorText(problem));
        return -1;
    }
    if (input)
        *input = inputPipe.writeEnd.release();
    return outputPipe.readEnd.release();
}

int hs_execute_command(const std::vector<std::string>& argv, Value* response, std::optional<Error>* error) {
    return execute(argv, nullptr, "Error executing command, result = %d\n", response, error);
}

int hs_execute_command_with_input_data(const std::vector<std::string>& argv, const void* input, ssize_t length,
                                       Value* response, std::optional<Error>* error) {
    const Input given{input, length};
    return execute(argv, &given, "Error executing command with data, result = %d\n", response, error);
}

int HSPipeUtil::HSPipeUtilExecCommand(const std::string& command, const std::vector<std::string>& options,
                                      Value* response, std::optional<Error>* error) {
    constexpr const char* name = "+[HSPipeUtil HSPipeUtilExecCommand:options:response:error:]";
    pipeLog.info("Enter %s at line %d\n", name, __LINE__);
    const int code = hs_execute_command(argumentVector(command, options), response, error) == 0 ? 0 : failed;
    pipeLog.info("Exit %s at line %d, success = %d\n", name, __LINE__, code);
    return code;
}

int HSPipeUtil::HSPipeUtilExecCommandWithData(const std::string& command, const std::vector<std::string>& options,
                                              const Value::Data& data, Value* response, std::optional<Error>* error) {
    constexpr const char* name = "+[HSPipeUtil HSPipeUtilExecCommandWithData:options:data:response:error:]";
    pipeLog.info("Enter %s at line %d\n", name, __LINE__);
    const std::vector<std::string> argv = argumentVector(command, options);
    for (std::size_t index = 0; index < argv.size(); ++index)
        pipeLog.info("argv[%d] = %s\n", index, argv[index]);
    const int result =
        hs_execute_command_with_input_data(argv, data.data(), static_cast<ssize_t>(data.size()), response, error);
    const int code = result == 0 ? 0 : failed;
    pipeLog.info("Exit %s at line %d, success = %d\n", name, __LINE__, code);
    return code;
}
