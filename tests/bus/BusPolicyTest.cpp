#include "AttachedDevice.h"
#include "PrivateBus.h"
#include "bus/ControlClient.h"

#include "bus/BusService.h"

#include <gtest/gtest.h>
#include <systemd/sd-bus.h>

#include <fcntl.h>
#include <grp.h>
#include <pwd.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <iterator>
#include <string>
#include <vector>

using namespace VeltoHost;

namespace {

constexpr const char* kAccessDenied = "org.freedesktop.DBus.Error.AccessDenied";

// What an unprivileged client is expected to find, one bit each in the
// child's exit code, in this order. That it may list the devices, read their
// names and settings, and is refused writes and saved recordings is checked
// with the installed package, for a user outside the group and a member
// (tests/packaging/install-test.sh).
const char* const kExpectations[] = {
    "is refused the raw touch data (Recording, ServicePluginDebug), with the daemon's reason",
    "may not own the service's name",
    "receives the device's signals",
};

// What the bus answers a client that asks for the service's well-known name.
int ownServiceName(const std::string& address)
{
    sd_bus* bus = nullptr;
    try {
        bus = BusConnection::connect(BusConnection::Address::at(address));
    } catch (const std::exception&) {
        return -ENOTCONN;
    }
    const int result = sd_bus_request_name(bus, BusService::kBusName, 0);
    sd_bus_flush_close_unref(bus);
    return result;
}

// Tells the parent that the signal match is in place, then waits for the
// device-reset signal it publishes.
bool receivesSignals(ControlClient& client, int readyFd, int goFd)
{
    if (!client.watchSignals()) return false;
    client.listDevices();  // a round trip: the match is in place at the bus from here on
    const char ready = 'r';
    char go = 0;
    return ::write(readyFd, &ready, 1) == 1 && ::read(goFd, &go, 1) == 1 &&
           client.waitUntil([&] { return !client.signalsNamed("DeviceReset").empty(); });
}

// Runs in the forked child, as `uid`/`gid`: no test macros, only the exit code.
int probeAsUnprivileged(const std::string& address, const std::string& device, uid_t uid, gid_t gid, int readyFd,
                        int goFd)
{
    if (::setgroups(0, nullptr) != 0 || ::setgid(gid) != 0 || ::setuid(uid) != 0 || ::getuid() != uid) return 0x80;
    ControlClient client(BusConnection::Address::at(address));
    if (!client.connected()) {
        std::fprintf(stderr, "unprivileged client: %s\n", client.connectError().c_str());
        return 0x80;
    }
    const bool found[] = {
        [&] {
            const ControlClient::Reply got = client.getProperty(device, "Recording");
            return got.error == kAccessDenied && got.message.find("raw touch data") != std::string::npos &&
                   client.getProperty(device, "ServicePluginDebug").error == kAccessDenied;
        }(),
        ownServiceName(address) == -EACCES,
        receivesSignals(client, readyFd, goFd),
    };
    int bits = 0;
    for (std::size_t i = 0; i < std::size(found); ++i) bits |= found[i] ? 1 << i : 0;
    return bits;
}

}  // namespace

TEST(BusPolicyTest, RootMayDoAllAndOthersWatchButNeitherOwnTheNameNorReadTheRawData)
{
    if (::geteuid() != 0) {
        GTEST_SKIP() << "the policy check drops a child to an unprivileged user, which needs root; running as uid "
                     << ::geteuid();
    }
    const passwd* nobody = ::getpwnam("nobody");
    const uid_t uid = nobody ? nobody->pw_uid : 65534;
    const gid_t gid = nobody ? nobody->pw_gid : 65534;

    PrivateBus bus(PrivateBus::systemPolicy(), "system", VELTO_BUS_POLICY_FILE);
    ASSERT_FALSE(bus.address().empty()) << bus.error();
    BusService service(BusConnection::Address::at(bus.address()));
    AttachedDevice device(service, "sim:policy.json");
    const std::string file = bus.directory() + "/saved.json";
    const int saved = ::open(file.c_str(), O_RDWR | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
    ASSERT_GE(saved, 0) << std::strerror(errno);

    // Root may do everything the service offers.
    {
        ControlClient root(BusConnection::Address::at(bus.address()));
        ASSERT_TRUE(root.connected()) << root.connectError();
        EXPECT_EQ(root.setProperty(device.path(), "Pipeline.Algs.HoldTimeoutMilliseconds", "600").error, "");
        EXPECT_EQ(root.getProperty(device.path(), "Pipeline.Algs.HoldTimeoutMilliseconds").value, "600");
        EXPECT_EQ(root.getProperty(device.path(), "Recording").error, "");
        EXPECT_EQ(root.saveRecording(device.path(), saved).error, "");
        EXPECT_GT(std::filesystem::file_size(file), 0u);
    }

    int ready[2];
    int go[2];
    ASSERT_EQ(::pipe(ready), 0);
    ASSERT_EQ(::pipe(go), 0);
    const pid_t child = ::fork();
    ASSERT_GE(child, 0) << std::strerror(errno);
    if (child == 0) ::_exit(probeAsUnprivileged(bus.address(), device.path(), uid, gid, ready[1], go[0]));
    ::close(ready[1]);
    ::close(go[0]);
    char signalled = 0;
    if (::read(ready[0], &signalled, 1) == 1) {
        service.publishEvent(device.id(), HidEvent::createVendorDefinedEvent(7, 0xFF60, 2, 0, nullptr, 0, 0));
        const char start = 'g';
        EXPECT_EQ(::write(go[1], &start, 1), 1);
    }
    int status = 0;
    while (::waitpid(child, &status, 0) < 0 && errno == EINTR) {
    }
    ::close(ready[0]);
    ::close(go[1]);
    ASSERT_TRUE(WIFEXITED(status));
    const int found = WEXITSTATUS(status);
    ASSERT_NE(found, 0x80) << "the child could not become uid " << uid << " or reach the bus";
    for (std::size_t i = 0; i < std::size(kExpectations); ++i) {
        EXPECT_TRUE(found & (1 << i)) << "an unprivileged user " << kExpectations[i];
    }
    ::close(saved);
}
