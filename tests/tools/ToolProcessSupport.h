#pragma once

// Runs the built tool as a process of its own, for what an in-process run
// cannot show: output through a pipe, signals, and limits on memory and file
// size. Deadlines only keep a broken tool from hanging the test run; nothing
// is measured with them.
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <optional>
#include <utility>
#include <string>
#include <vector>

namespace VeltoTool::Testing {

// How the process is started: limits, extra environment entries ("NAME=VALUE"),
// when not the built tool itself another program, and whether its standard
// error is the test's own (for a long-lived helper whose messages nobody reads).
struct ProcessSetup {
    std::optional<rlim_t> addressSpaceBytes;
    std::optional<rlim_t> fileSizeBytes;
    std::vector<std::string> environment;
    bool sharedStandardError = false;
#ifdef VELTO_TOOL_PATH
    std::string program = VELTO_TOOL_PATH;
#else
    std::string program;
#endif

    // One field each, without naming the others (GCC warns of a designated
    // initializer that leaves members out).
    static ProcessSetup addressSpace(rlim_t bytes)
    {
        ProcessSetup setup;
        setup.addressSpaceBytes = bytes;
        return setup;
    }
    static ProcessSetup fileSize(rlim_t bytes)
    {
        ProcessSetup setup;
        setup.fileSizeBytes = bytes;
        return setup;
    }
    static ProcessSetup copy(std::string program, std::vector<std::string> environment = {})
    {
        ProcessSetup setup;
        setup.program = std::move(program);
        setup.environment = std::move(environment);
        return setup;
    }
};

class ToolProcess {
public:
    using Seconds = std::chrono::seconds;

    struct Result {
        bool exited = false;
        int status = -1;  // exit status when `exited`
        int signal = 0;   // the signal that ended it otherwise
        bool timedOut = false;
        std::string out;
        std::string err;
    };

    explicit ToolProcess(const std::vector<std::string>& arguments, ProcessSetup limits = {})
    {
        int outPipe[2], errPipe[2];
        if (::pipe2(outPipe, O_CLOEXEC) != 0 || ::pipe2(errPipe, O_CLOEXEC) != 0) return;
        std::vector<std::string> argv{limits.program};
        argv.insert(argv.end(), arguments.begin(), arguments.end());
        std::vector<char*> pointers;
        for (std::string& argument : argv) pointers.push_back(argument.data());
        pointers.push_back(nullptr);

        _pid = ::fork();
        if (_pid == 0) {
            ::dup2(outPipe[1], STDOUT_FILENO);
            if (!limits.sharedStandardError) ::dup2(errPipe[1], STDERR_FILENO);
            // A shell without job control starts background jobs with SIGINT
            // ignored, and that would carry over to the tool.
            ::signal(SIGINT, SIG_DFL);
            // Past the size limit writes fail with EFBIG instead of killing the tool.
            ::signal(SIGXFSZ, SIG_IGN);
            if (limits.addressSpaceBytes) {
                rlimit limit{*limits.addressSpaceBytes, *limits.addressSpaceBytes};
                ::setrlimit(RLIMIT_AS, &limit);
            }
            if (limits.fileSizeBytes) {
                rlimit limit{*limits.fileSizeBytes, *limits.fileSizeBytes};
                ::setrlimit(RLIMIT_FSIZE, &limit);
            }
            for (std::string& entry : limits.environment) ::putenv(entry.data());
            ::execv(pointers[0], pointers.data());
            ::_exit(127);
        }
        ::close(outPipe[1]);
        ::close(errPipe[1]);
        _out = outPipe[0];
        _err = errPipe[0];
    }

    ~ToolProcess()
    {
        if (_pid > 0 && !_reaped) {
            ::kill(_pid, SIGKILL);
            ::waitpid(_pid, nullptr, 0);
        }
        if (_out >= 0) ::close(_out);
        if (_err >= 0) ::close(_err);
    }

    ToolProcess(const ToolProcess&) = delete;
    ToolProcess& operator=(const ToolProcess&) = delete;

    bool started() const { return _pid > 0; }
    pid_t pid() const { return _pid; }

    // The next line of standard output, or nothing when the output ends or
    // no line comes before the deadline.
    std::optional<std::string> readLine(Seconds deadline)
    {
        const auto end = std::chrono::steady_clock::now() + deadline;
        for (;;) {
            if (auto newline = _outText.find('\n'); newline != std::string::npos) {
                std::string line = _outText.substr(0, newline);
                _outText.erase(0, newline + 1);
                return line;
            }
            if (!pump(end)) return std::nullopt;
        }
    }

    void signal(int number) const { ::kill(_pid, number); }

    // Waits for the process to end, killing it at the deadline, and returns
    // how it ended with the rest of its output.
    Result finish(Seconds deadline)
    {
        Result result;
        const auto end = std::chrono::steady_clock::now() + deadline;
        while (pump(end)) {
        }
        if (_out >= 0 || _err >= 0) {
            result.timedOut = true;
            ::kill(_pid, SIGKILL);
        }
        int status = 0;
        ::waitpid(_pid, &status, 0);
        _reaped = true;
        result.exited = WIFEXITED(status);
        result.status = result.exited ? WEXITSTATUS(status) : -1;
        result.signal = WIFSIGNALED(status) ? WTERMSIG(status) : 0;
        result.out = std::move(_outText);
        result.err = std::move(_errText);
        return result;
    }

private:
    // Reads what is there from both pipes; false when both have ended or the
    // deadline has passed.
    bool pump(std::chrono::steady_clock::time_point end)
    {
        if (_out < 0 && _err < 0) return false;
        const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(end - std::chrono::steady_clock::now());
        if (left.count() <= 0) return false;
        pollfd fds[2] = {{_out, POLLIN, 0}, {_err, POLLIN, 0}};
        if (::poll(fds, 2, static_cast<int>(left.count())) <= 0) return false;
        drain(fds[0], _out, _outText);
        drain(fds[1], _err, _errText);
        return true;
    }

    static void drain(const pollfd& fd, int& descriptor, std::string& text)
    {
        if (descriptor < 0 || !(fd.revents & (POLLIN | POLLHUP | POLLERR))) return;
        char buffer[4096];
        const ssize_t count = ::read(descriptor, buffer, sizeof buffer);
        if (count > 0) {
            text.append(buffer, static_cast<std::size_t>(count));
        } else {
            ::close(descriptor);
            descriptor = -1;
        }
    }

    pid_t _pid = -1;
    bool _reaped = false;
    int _out = -1;
    int _err = -1;
    std::string _outText;
    std::string _errText;
};

}  // namespace VeltoTool::Testing
