#pragma once

// The built tool run as a process of its own, for what an in-process run
// cannot show: signals, exit statuses, pipes.
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <optional>
#include <string>
#include <vector>

namespace VeltoTool::Testing {

class ToolProcess {
public:
    // Starts VELTO_TOOL_PATH with `arguments`; `environment` entries
    // ("NAME=VALUE") are added to the test's own environment.
    explicit ToolProcess(const std::vector<std::string>& arguments, const std::vector<std::string>& environment = {})
    {
        int out[2], err[2];
        if (::pipe2(out, O_CLOEXEC) != 0 || ::pipe2(err, O_CLOEXEC) != 0) return;
        _pid = ::fork();
        if (_pid == 0) {
            ::dup2(out[1], STDOUT_FILENO);
            ::dup2(err[1], STDERR_FILENO);
            for (const std::string& entry : environment) ::putenv(const_cast<char*>(entry.c_str()));
            std::vector<char*> argv{const_cast<char*>(VELTO_TOOL_PATH)};
            for (const std::string& argument : arguments) argv.push_back(const_cast<char*>(argument.c_str()));
            argv.push_back(nullptr);
            ::execv(VELTO_TOOL_PATH, argv.data());
            ::_exit(127);
        }
        ::close(out[1]);
        ::close(err[1]);
        _out = out[0];
        _err = err[0];
    }
    ~ToolProcess()
    {
        if (_pid > 0 && !_status) {
            ::kill(_pid, SIGKILL);
            ::waitpid(_pid, nullptr, 0);
        }
        if (_out >= 0) ::close(_out);
        if (_err >= 0) ::close(_err);
    }
    ToolProcess(const ToolProcess&) = delete;
    ToolProcess& operator=(const ToolProcess&) = delete;

    bool started() const { return _pid > 0; }
    void signal(int number) const { ::kill(_pid, number); }

    // Reads stdout until `text` has appeared in it (or `timeout` passed).
    bool waitForOutput(const std::string& text, std::chrono::milliseconds timeout = std::chrono::seconds(10))
    {
        const auto end = std::chrono::steady_clock::now() + timeout;
        while (_stdout.find(text) == std::string::npos) {
            const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(end - std::chrono::steady_clock::now());
            if (left.count() <= 0 || !pump(static_cast<int>(left.count()))) return false;
        }
        return true;
    }

    // Waits for the exit, reading both streams; the exit status, 128 + the
    // signal's number when killed, or -1 after `timeout` (the process is
    // then killed).
    int finish(std::chrono::milliseconds timeout = std::chrono::seconds(20))
    {
        const auto end = std::chrono::steady_clock::now() + timeout;
        while (_out >= 0 || _err >= 0) {
            const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(end - std::chrono::steady_clock::now());
            if (left.count() <= 0) {
                ::kill(_pid, SIGKILL);
                ::waitpid(_pid, nullptr, 0);
                _status = -1;
                return -1;
            }
            pump(static_cast<int>(left.count()));
        }
        int status = 0;
        ::waitpid(_pid, &status, 0);
        _status = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
        return *_status;
    }

    const std::string& out() const { return _stdout; }
    const std::string& err() const { return _stderr; }

private:
    // Reads what is there; false once both streams are closed.
    bool pump(int timeoutMs)
    {
        pollfd fds[2] = {{_out, POLLIN, 0}, {_err, POLLIN, 0}};
        if (::poll(fds, 2, timeoutMs) <= 0) return _out >= 0 || _err >= 0;
        drain(fds[0], _out, _stdout);
        drain(fds[1], _err, _stderr);
        return _out >= 0 || _err >= 0;
    }
    static void drain(const pollfd& fd, int& descriptor, std::string& text)
    {
        if (descriptor < 0 || fd.revents == 0) return;
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
    int _out = -1;
    int _err = -1;
    std::string _stdout;
    std::string _stderr;
    std::optional<int> _status;
};

}  // namespace VeltoTool::Testing
