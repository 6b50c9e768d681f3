#pragma once

#include <memory>
#include <string>

namespace VeltoTool::Testing {
class ToolProcess;
}

// A dbus-daemon of a test's own, listening on a socket in a fresh temporary
// directory and stopped with the object, so that bus tests need no system or
// session bus and cannot disturb one.
class PrivateBus {
public:
    // The policy of a session bus: anyone may own names and call anything.
    static std::string openPolicy();
    // The default policy of a Debian system bus: names are owned and methods
    // called only where a service's own policy file allows it.
    static std::string systemPolicy();

    // `policy` is the <policy> part of the configuration; `includes` are
    // policy files read after it, as a system bus reads /usr/share/dbus-1/system.d.
    explicit PrivateBus(const std::string& policy = openPolicy(), const std::string& type = "session",
                        const std::string& include = {});
    ~PrivateBus();
    PrivateBus(const PrivateBus&) = delete;
    PrivateBus& operator=(const PrivateBus&) = delete;

    // Empty when the daemon did not start; error() says why.
    const std::string& address() const { return _address; }
    const std::string& error() const { return _error; }
    const std::string& directory() const { return _directory; }

    // Ends the bus at once (SIGKILL), as a crash of the bus would: every
    // connection to it breaks. The address is left for clients to fail on.
    void kill();

private:
    std::string _directory;
    std::string _address;
    std::string _error;
    std::unique_ptr<VeltoTool::Testing::ToolProcess> _daemon;
};
