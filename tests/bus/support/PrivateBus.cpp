#include "PrivateBus.h"

#include "tools/ToolProcessSupport.h"

#include <sys/stat.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <fstream>

using VeltoTool::Testing::ProcessSetup;
using VeltoTool::Testing::ToolProcess;

namespace {

constexpr const char* kDaemon = "/usr/bin/dbus-daemon";

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
    if (::access(kDaemon, X_OK) != 0) {
        _error = std::string("cannot start ") + kDaemon + " (package dbus): " + std::strerror(errno);
        return;
    }
    ProcessSetup setup = ProcessSetup::copy(kDaemon);
    setup.sharedStandardError = true;
    _daemon = std::make_unique<ToolProcess>(
        std::vector<std::string>{"--config-file=" + configPath, "--print-address", "--nofork", "--nosyslog"}, setup);
    // Starting takes milliseconds; the limit only bounds a broken start.
    if (auto address = _daemon->readLine(ToolProcess::Seconds(10))) {
        _address = *address;
    } else {
        _error = "dbus-daemon printed no address (see its messages above)";
    }
}

void PrivateBus::kill()
{
    if (!_daemon) return;
    _daemon->signal(SIGKILL);
    _daemon->finish(ToolProcess::Seconds(10));
    // Reaped: its process id may be reused, so nothing signals it again.
    _daemon.reset();
}

PrivateBus::~PrivateBus()
{
    if (_daemon) {
        _daemon->signal(SIGTERM);
        _daemon->finish(ToolProcess::Seconds(10));
    }
    if (!_directory.empty()) {
        std::error_code ignored;
        std::filesystem::remove_all(_directory, ignored);
    }
}
