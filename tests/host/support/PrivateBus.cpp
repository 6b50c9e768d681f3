#include "PrivateBus.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <vector>

extern char** environ;

namespace {

// Starting the daemon takes milliseconds; this only bounds a broken start.
constexpr int kStartTimeoutMs = 10'000;

// A default policy: `ownAndCall` says who may own names and call methods;
// replies, signals and receiving are open on every bus of these tests.
std::string defaultPolicy(const std::string& ownAndCall)
{
    return "<policy context=\"default\">\n    <allow user=\"*\"/>\n" + ownAndCall + R"(
    <allow send_type="signal"/>
    <allow send_requested_reply="true" send_type="method_return"/>
    <allow send_requested_reply="true" send_type="error"/>
    <allow receive_type="method_call"/>
    <allow receive_type="method_return"/>
    <allow receive_type="error"/>
    <allow receive_type="signal"/>
  </policy>)";
}

}  // namespace

std::string PrivateBus::openPolicy()
{
    return defaultPolicy(R"(    <allow own="*"/>
    <allow send_type="method_call"/>)");
}

std::string PrivateBus::systemPolicy()
{
    return defaultPolicy(R"(    <deny own="*"/>
    <deny send_type="method_call"/>
    <allow send_destination="org.freedesktop.DBus" send_interface="org.freedesktop.DBus"/>
    <allow send_destination="org.freedesktop.DBus" send_interface="org.freedesktop.DBus.Introspectable"/>
    <allow send_destination="org.freedesktop.DBus" send_interface="org.freedesktop.DBus.Properties"/>
    <deny send_destination="org.freedesktop.DBus" send_interface="org.freedesktop.DBus"
          send_member="UpdateActivationEnvironment"/>)");
}

PrivateBus::PrivateBus(const std::string& policy, const std::string& type, const std::string& include)
{
    char pattern[] = "/tmp/velto-bus-XXXXXX";
    if (!::mkdtemp(pattern)) {
        _error = std::string("mkdtemp: ") + std::strerror(errno);
        return;
    }
    _directory = pattern;
    // Clients that drop to an unprivileged user must reach the socket.
    ::chmod(_directory.c_str(), 0755);

    const std::string configPath = _directory + "/bus.conf";
    std::ofstream config(configPath);
    config << "<!DOCTYPE busconfig PUBLIC \"-//freedesktop//DTD D-BUS Bus Configuration 1.0//EN\"\n"
              " \"http://www.freedesktop.org/standards/dbus/1.0/busconfig.dtd\">\n"
           << "<busconfig>\n  <type>" << type << "</type>\n"
           << "  <listen>unix:path=" << _directory << "/bus_socket</listen>\n"
           << "  <auth>EXTERNAL</auth>\n  " << policy << "\n";
    if (!include.empty()) config << "  <include>" << include << "</include>\n";
    // Room for a whole recording in one reply and a burst of signals queued
    // for a client that reads them only after the burst.
    config << "  <limit name=\"max_message_size\">134217728</limit>\n"
              "  <limit name=\"max_outgoing_bytes\">1000000000</limit>\n"
              "  <limit name=\"max_incoming_bytes\">1000000000</limit>\n"
              "</busconfig>\n";
    config.close();
    if (!config) {
        _error = "cannot write " + configPath;
        return;
    }
    start(configPath);
}

void PrivateBus::start(const std::string& configPath)
{
    int output[2];
    if (::pipe2(output, O_CLOEXEC) != 0) {
        _error = std::string("pipe: ") + std::strerror(errno);
        return;
    }
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_adddup2(&actions, output[1], STDOUT_FILENO);
    const std::string configArgument = "--config-file=" + configPath;
    std::vector<char*> argv = {const_cast<char*>("dbus-daemon"), const_cast<char*>(configArgument.c_str()),
                               const_cast<char*>("--print-address"), const_cast<char*>("--nofork"),
                               const_cast<char*>("--nosyslog"), nullptr};
    const int spawned = ::posix_spawnp(&_pid, "dbus-daemon", &actions, nullptr, argv.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    ::close(output[1]);
    if (spawned != 0) {
        _pid = -1;
        ::close(output[0]);
        _error = std::string("cannot start dbus-daemon (package dbus): ") + std::strerror(spawned);
        return;
    }

    std::string line;
    pollfd readable{output[0], POLLIN, 0};
    while (line.find('\n') == std::string::npos && ::poll(&readable, 1, kStartTimeoutMs) > 0) {
        char chunk[256];
        const ssize_t count = ::read(output[0], chunk, sizeof chunk);
        if (count <= 0) break;
        line.append(chunk, static_cast<std::size_t>(count));
    }
    ::close(output[0]);
    const std::size_t end = line.find('\n');
    if (end == std::string::npos) {
        _error = "dbus-daemon printed no address (see its messages above)";
        return;
    }
    _address = line.substr(0, end);
}

PrivateBus::~PrivateBus()
{
    if (_pid > 0) {
        ::kill(_pid, SIGTERM);
        int status = 0;
        while (::waitpid(_pid, &status, 0) < 0 && errno == EINTR) {
        }
    }
    if (!_directory.empty()) {
        std::error_code ignored;
        std::filesystem::remove_all(_directory, ignored);
    }
}
