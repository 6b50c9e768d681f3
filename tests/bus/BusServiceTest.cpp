#include "AttachedDevice.h"
#include "PrivateBus.h"
#include "bus/ControlClient.h"

#include "bus/BusService.h"
#include "recording/JsonValue.h"
#include "recording/PipelineRecording.h"

#include <gtest/gtest.h>

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <condition_variable>
#include <filesystem>
#include <fstream>
#include <mutex>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <vector>

using namespace VeltoHost;

namespace {

constexpr const char* kUnknownObject = "org.freedesktop.DBus.Error.UnknownObject";
constexpr const char* kInvalidArgs = "org.freedesktop.DBus.Error.InvalidArgs";
constexpr const char* kCounters = "Pipeline.Algs.EventStats";

std::string example(const std::string& name) { return std::string(VELTO_EXAMPLES_DIR) + "/" + name; }

std::uint64_t tapsCounted(ControlClient& client, const std::string& path)
{
    const PropertyValue counters = VeltoTouch::JsonValue::parse(client.getProperty(path, kCounters).value);
    return counters.asDictionary().get("Dispatched").asDictionary().get("numTaps").toUInt64();
}

class BusServiceTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        ASSERT_FALSE(_bus.address().empty()) << _bus.error();
        _service.emplace(BusConnection::Address::at(_bus.address()));
        _client = std::make_unique<ControlClient>(BusConnection::Address::at(_bus.address()));
        ASSERT_TRUE(_client->connected()) << _client->connectError();
        ASSERT_TRUE(_client->watchSignals());
    }
    AttachedDevice& attach(const std::string& name)
    {
        _devices.push_back(std::make_unique<AttachedDevice>(*_service, name));
        return *_devices.back();
    }

    // Taken apart in reverse: devices, client, service, bus.
    PrivateBus _bus;
    std::optional<BusService> _service;
    std::unique_ptr<ControlClient> _client;
    std::vector<std::unique_ptr<AttachedDevice>> _devices;
};

}  // namespace

// Listing, numbering and the manager's announcements are checked on the
// daemon, which adds and removes devices as they come and go; settings
// written and read back as JSON through ctl (DaemonCommandTest, README's
// examples), with what the pipeline makes of each kind of value
// (fuzz_pipeline) and how JSON is written (JsonValueTest).

// Refused through `ctl` against the real daemon, and not again here: a value
// that is not JSON, a read-only Version, a number beyond a double and a value
// over the size limit (DaemonCommandTest), a string for a number (README's
// example, ReadmeExamplesTest).
TEST_F(BusServiceTest, MalformedRequestsAreRefusedWhileTheDeviceKeepsRecognising)
{
    AttachedDevice& device = attach("sim:taps.json");
    // A property of the device itself, which the plug-in passes through.
    device.device()->setProperty("Product", PropertyValue::string("VeltoTouch"));
    const std::string path = device.path();
    const std::string absent = std::string(BusService::kDevicePathPrefix) + "41";

    struct Case {
        const char* what;
        std::string path;
        const char* member;
        std::vector<std::string> arguments;
        const char* error;
    };
    const std::vector<Case> cases = {
        {"empty value", path, "SetProperty", {"Pipeline.Algs.ActivationThreshold", ""}, BusService::kErrorInvalidJson},
        {"unknown key written", path, "SetProperty", {"Pipeline.Algs.NoSuchSetting", "1"},
         BusService::kErrorInvalidArgument},
        {"key in another case", path, "SetProperty", {"Pipeline.Algs.activationthreshold", "1"},
         BusService::kErrorInvalidArgument},
        {"empty key", path, "GetProperty", {""}, BusService::kErrorInvalidArgument},
        {"object for a flag", path, "SetProperty", {"Pipeline.Algs.EnableTapSuppression", "{}"},
         BusService::kErrorInvalidArgument},
        {"negative timeout", path, "SetProperty", {"Pipeline.Algs.HoldTimeoutMilliseconds", "-1"},
         BusService::kErrorInvalidArgument},
        {"timeout beyond 32 bits", path, "SetProperty", {"Pipeline.Algs.HoldTimeoutMilliseconds", "4294967796"},
         BusService::kErrorInvalidArgument},
        {"fractional timeout", path, "SetProperty", {"Pipeline.Algs.HoldTimeoutMilliseconds", "0.5"},
         BusService::kErrorInvalidArgument},
        {"counters are read-only", path, "SetProperty", {kCounters, "{}"}, BusService::kErrorFailed},
        {"device refuses the write", path, "SetProperty", {"Product", "\"renamed\""}, BusService::kErrorFailed},
        {"recording is read-only", path, "SetProperty", {"Recording", "\"x\""}, BusService::kErrorFailed},
        {"debug dictionary is read-only", path, "SetProperty", {"ServicePluginDebug", "{}"}, BusService::kErrorFailed},
        {"nested too deep", path, "SetProperty",
         {"Pipeline.Algs.ActivationThreshold", std::string(1000, '[') + std::string(1000, ']')},
         BusService::kErrorInvalidArgument},
        {"a path where a file is passed", path, "SaveRecording", {"/tmp/out.json"}, kInvalidArgs},
        {"absent device written", absent, "SetProperty", {"Pipeline.Algs.ActivationThreshold", "1"}, kUnknownObject},
        {"wrong argument count", path, "SetProperty", {"Pipeline.Algs.ActivationThreshold"}, kInvalidArgs},
        {"no such method", path, "Explode", {}, "org.freedesktop.DBus.Error.UnknownMethod"},
    };

    device.device()->refusePropertyWrites(true);
    const std::string before = _client->getProperty(path, "Pipeline.Algs.ActivationThreshold").value;
    for (const Case& c : cases) {
        const ControlClient::Reply reply = _client->call(c.path, BusService::kDeviceInterface, c.member, c.arguments);
        EXPECT_EQ(reply.error, c.error) << c.what << " (" << reply.message << ")";
        EXPECT_FALSE(reply.message.empty()) << c.what;
        // What was sent is quoted back only in part.
        EXPECT_LT(reply.message.size(), 300u) << c.what;
    }
    EXPECT_EQ(_client->getProperty(path, "Pipeline.Algs.ActivationThreshold").value, before);
    const std::string longKey(1 << 20, 'k');
    EXPECT_LT(_client->getProperty(path, longKey).message.size(), 300u);

    // Still serving, still recognising.
    EXPECT_EQ(_client->listDevices(), (std::vector<std::string>{path}));
    device.play(example("taps.json"));
    EXPECT_GT(tapsCounted(*_client, path), 0u);
}

// That a saved file replays as the device played is checked through the real
// daemon and `ctl save-recording`; here what the service writes into.
TEST_F(BusServiceTest, ARecordingIsWrittenOnlyIntoARegularFileOpenForWriting)
{
    AttachedDevice& device = attach("sim:taps.json");
    device.play(example("taps.json"));
    const std::string file = _bus.directory() + "/session.json";  // removed with the bus
    {
        std::ofstream longer(file);
        longer << std::string(4 << 20, 'x');  // more than a recording: none of it may stay
    }
    int pipeEnds[2];
    ASSERT_EQ(::pipe2(pipeEnds, O_CLOEXEC), 0);
    struct Case {
        const char* what;
        int fd;
        const char* error;
    };
    const Case cases[] = {
        {"a character device", ::open("/dev/null", O_WRONLY | O_CLOEXEC), BusService::kErrorInvalidArgument},
        {"a directory", ::open(_bus.directory().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC),
         BusService::kErrorInvalidArgument},
        {"a pipe", pipeEnds[1], BusService::kErrorInvalidArgument},
        {"a file open for reading", ::open(file.c_str(), O_RDONLY | O_CLOEXEC), BusService::kErrorInvalidArgument},
        {"a file open for appending", ::open(file.c_str(), O_WRONLY | O_APPEND | O_CLOEXEC),
         BusService::kErrorInvalidArgument},
        {"a file open for writing", ::open(file.c_str(), O_WRONLY | O_CLOEXEC), ""},
    };
    for (const Case& c : cases) {
        ASSERT_GE(c.fd, 0) << c.what;
        const ControlClient::Reply saved = _client->saveRecording(device.path(), c.fd);
        EXPECT_EQ(saved.error, c.error) << c.what << ": " << saved.message;
        ::close(c.fd);
    }
    ::close(pipeEnds[0]);
    const VeltoTouch::PipelineRecording saved{std::string_view(readFile(file))};
    EXPECT_FALSE(saved.frames().empty());
}

TEST_F(BusServiceTest, ASecondServiceIsRefusedTheNameAndAnAbsentBusIsNamed)
{
    struct Case {
        BusConnection::Address address;
        const char* message;
    };
    const Case cases[] = {
        {BusConnection::Address::at(_bus.address()), "already owned"},
        {BusConnection::Address::at("unix:path=" + _bus.directory() + "/no_socket"), "cannot connect to the bus at"},
    };
    for (const Case& c : cases) {
        try {
            BusService second(c.address);
            ADD_FAILURE() << "a second service started on " << c.address.description();
        } catch (const std::runtime_error& error) {
            EXPECT_NE(std::string(error.what()).find(c.message), std::string::npos) << error.what();
        }
    }
    // The first service is unharmed.
    AttachedDevice& device = attach("sim:still.json");
    EXPECT_EQ(_client->listDevices(), (std::vector<std::string>{device.path()}));
}

TEST_F(BusServiceTest, EventsOfARemovedDeviceAreNotSent)
{
    AttachedDevice& device = attach("sim:taps.json");
    const BusService::DeviceId id = device.id();
    device.detach();
    _service->publishEvent(id, HidEvent::createVendorDefinedEvent(1, 0xFF60, 2, 0, nullptr, 0, 0));
    // The manager's signals go through the same queue: once this one has
    // arrived, the dropped event would have arrived before it.
    AttachedDevice& other = attach("sim:other.json");
    ASSERT_TRUE(_client->waitUntil([&] { return !_client->signalsNamed("DeviceAdded").empty() &&
                                                _client->signalsNamed("DeviceAdded").back().object == other.path(); }));
    EXPECT_TRUE(_client->signalsNamed("DeviceReset").empty());
}

TEST_F(BusServiceTest, SignalsFromAnyoneButTheServiceAreNotTakenForItsOwn)
{
    AttachedDevice& device = attach("sim:taps.json");
    // Another client on the bus sends what the device would.
    sd_bus* impostor = BusConnection::connect(BusConnection::Address::at(_bus.address()));
    ASSERT_GE(sd_bus_emit_signal(impostor, device.path().c_str(), BusService::kDeviceInterface, "DeviceReset", "t",
                                 std::uint64_t{1}),
              0);
    sd_bus_flush_close_unref(impostor);
    _service->publishEvent(device.id(), HidEvent::createVendorDefinedEvent(2, 0xFF60, 2, 0, nullptr, 0, 0));
    ASSERT_TRUE(_client->waitUntil([&] { return !_client->signalsNamed("DeviceReset").empty(); }));
    // The service's own came after the impostor's: had that one been taken, it would be first.
    const auto resets = _client->signalsNamed("DeviceReset");
    ASSERT_EQ(resets.size(), 1u);
    EXPECT_EQ(resets[0].event.timestamp, 2u);
}

namespace {

// A device whose every property read waits until the test lets it go: a
// stand-in for a slow read of a large recording.
class StalledControl final : public DeviceControl {
public:
    std::string name() const override { return "stalled"; }
    Result getProperty(const std::string&, PropertyValue& value) override
    {
        std::unique_lock guard(_lock);
        ++_entered;
        _changed.notify_all();
        _changed.wait(guard, [&] { return _released; });
        value = PropertyValue::uint64(7);
        return Result::ok();
    }
    Result setProperty(const std::string&, const PropertyValue&) override { return Result::ok(); }
    Result saveRecording(int) override { return Result::ok(); }

    void waitUntilEntered()
    {
        std::unique_lock guard(_lock);
        _changed.wait(guard, [&] { return _entered > 0; });
    }
    void release()
    {
        std::lock_guard guard(_lock);
        _released = true;
        _changed.notify_all();
    }

private:
    std::mutex _lock;
    std::condition_variable _changed;
    int _entered = 0;
    bool _released = false;
};

}  // namespace

TEST_F(BusServiceTest, ASlowDeviceReadHoldsUpNeitherSignalsNorListingAndEachClientIsBounded)
{
    auto stalled = std::make_shared<StalledControl>();
    const BusService::DeviceId id = _service->addDevice(stalled);
    const std::string path = BusService::devicePath(id);

    // More reads than one client may have in progress, none waited for.
    sd_bus* reader = BusConnection::connect(BusConnection::Address::at(_bus.address()));
    std::vector<std::string> errors;
    const auto answered = [](sd_bus_message* reply, void* userdata, sd_bus_error*) {
        const sd_bus_error* error = sd_bus_message_get_error(reply);
        static_cast<std::vector<std::string>*>(userdata)->push_back(error ? error->name : "");
        return 0;
    };
    const std::size_t sent = BusService::kMaxRequestsPerClient + 2;
    for (std::size_t i = 0; i < sent; ++i) {
        ASSERT_GE(sd_bus_call_method_async(reader, nullptr, BusService::kBusName, path.c_str(),
                                           BusService::kDeviceInterface, "GetProperty", answered, &errors, "s", "k"),
                  0);
    }
    ASSERT_GE(sd_bus_flush(reader), 0);
    stalled->waitUntilEntered();

    // While the device is stuck, the bus goes on: signals, the device list,
    // and the refusal of the reads beyond the client's share.
    _service->publishEvent(id, HidEvent::createVendorDefinedEvent(3, 0xFF60, 2, 0, nullptr, 0, 0));
    EXPECT_TRUE(_client->waitUntil([&] { return !_client->signalsNamed("DeviceReset").empty(); }));
    EXPECT_EQ(_client->listDevices(), (std::vector<std::string>{path}));
    // Reads the reader's answers until `count` have come.
    const auto answersUntil = [&](std::size_t count) {
        while (errors.size() < count) {
            if (sd_bus_process(reader, nullptr) > 0) continue;
            if (sd_bus_wait(reader, 5'000'000) <= 0) return false;
        }
        return true;
    };
    ASSERT_TRUE(answersUntil(sent - BusService::kMaxRequestsPerClient));
    EXPECT_EQ(errors, std::vector<std::string>(sent - BusService::kMaxRequestsPerClient,
                                               "org.freedesktop.DBus.Error.LimitsExceeded"));

    // Once released, every read within the share is answered.
    stalled->release();
    ASSERT_TRUE(answersUntil(sent));
    EXPECT_EQ(std::count(errors.begin(), errors.end(), ""), static_cast<long>(BusService::kMaxRequestsPerClient));
    _service->removeDevice(id);
    sd_bus_flush_close_unref(reader);
}
