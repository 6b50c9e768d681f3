#pragma once

// Runs the Debian chromium headless against a page, for the tests that check
// report pages in a real browser. Every run has its own profile and goes
// through a "proxy" that is only a listening socket: a page that reaches for
// the network connects to it, and the run lists what was asked for. The
// browser's own calls home (component updates, sign-in, network time) come
// through it too, whatever the flags say; they go to the browser maker's
// service hosts and are told apart by that.
#include "tools/ToolProcessSupport.h"

#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>

#include <filesystem>
#include <optional>
#include <string>
#include <vector>

namespace VeltoTool::Testing {

class HeadlessChromium {
public:
    struct Run {
        bool exited = false;
        std::string out;
        std::string err;
        // First line of each request that is not the browser's own:
        // "CONNECT host:443 HTTP/1.1", "GET http://host/... HTTP/1.1".
        std::vector<std::string> pageRequests;
    };

    // The browser, when installed.
    static std::optional<std::string> path()
    {
        for (const char* candidate : {"/usr/bin/chromium", "/usr/bin/chromium-browser"}) {
            if (::access(candidate, X_OK) == 0) return std::string(candidate);
        }
        return std::nullopt;
    }

    HeadlessChromium(std::string program, std::filesystem::path workDir)
        : _program(std::move(program)), _workDir(std::move(workDir))
    {
    }

    // The page's DOM after its scripts ran (standard output).
    Run dumpDom(const std::string& url) { return run({"--dump-dom", url}); }
    Run screenshot(const std::string& url, const std::filesystem::path& png)
    {
        return run({"--screenshot=" + png.string(), url});
    }

private:
    Run run(const std::vector<std::string>& task)
    {
        const int listener = ::socket(AF_INET, SOCK_STREAM | SOCK_NONBLOCK, 0);
        sockaddr_in address{};
        address.sin_family = AF_INET;
        address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t length = sizeof address;
        ::bind(listener, reinterpret_cast<sockaddr*>(&address), sizeof address);
        ::listen(listener, 16);
        ::getsockname(listener, reinterpret_cast<sockaddr*>(&address), &length);
        const std::string proxy = "127.0.0.1:" + std::to_string(ntohs(address.sin_port));

        const std::filesystem::path profile = _workDir / ("profile-" + std::to_string(++_runs));
        std::vector<std::string> arguments = {
            "--headless", "--no-sandbox", "--disable-gpu", "--user-data-dir=" + profile.string(),
            "--no-first-run", "--disable-background-networking", "--disable-component-update", "--disable-sync",
            "--disable-extensions", "--disable-default-apps", "--proxy-server=" + proxy,
            "--proxy-bypass-list=<-loopback>", "--virtual-time-budget=10000", "--window-size=1400,900",
            "--hide-scrollbars"};
        arguments.insert(arguments.end(), task.begin(), task.end());
        ToolProcess process(arguments, ProcessSetup::copy(_program));
        const ToolProcess::Result result = process.finish(std::chrono::seconds(180));

        Run out;
        out.exited = result.exited && result.status == 0;
        out.out = result.out;
        out.err = result.err;
        while (true) {
            const int connection = ::accept(listener, nullptr, nullptr);
            if (connection < 0) break;
            const std::string line = firstLine(connection);
            if (!isBrowserService(line)) out.pageRequests.push_back(line);
            ::close(connection);
        }
        ::close(listener);
        return out;
    }

    static std::string firstLine(int connection)
    {
        pollfd ready{connection, POLLIN, 0};
        char buffer[512];
        if (::poll(&ready, 1, 1000) != 1) return "(connected, sent nothing)";
        const ssize_t count = ::recv(connection, buffer, sizeof buffer, 0);
        const std::string text(buffer, count > 0 ? static_cast<std::size_t>(count) : 0);
        return text.substr(0, text.find('\r'));
    }

    static bool isBrowserService(const std::string& requestLine)
    {
        const std::size_t start = requestLine.find(' ');
        if (start == std::string::npos) return false;
        std::string host = requestLine.substr(start + 1, requestLine.find(' ', start + 1) - start - 1);
        if (const std::size_t scheme = host.find("://"); scheme != std::string::npos) host.erase(0, scheme + 3);
        host = host.substr(0, host.find_first_of(":/"));
        for (const std::string suffix : {".google.com", ".googleapis.com", ".gstatic.com"}) {
            if (host.size() > suffix.size() && host.compare(host.size() - suffix.size(), suffix.size(), suffix) == 0) {
                return true;
            }
        }
        return false;
    }

    std::string _program;
    std::filesystem::path _workDir;
    int _runs = 0;
};

}  // namespace VeltoTool::Testing
