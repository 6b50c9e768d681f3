#include "AttachedDevice.h"
#include "host/ControlClient.h"
#include "PrivateBus.h"

#include "host/BusService.h"
#include "recording/JsonValue.h"
#include "recording/PipelineRecording.h"

#include <gtest/gtest.h>

#include <sys/stat.h>

#include <filesystem>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <thread>
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
// daemon, which adds and removes devices as they come and go.

TEST_F(BusServiceTest, SettingsRoundTripAsJsonWhileReportsFlow)
{
    AttachedDevice& device = attach("sim:taps.json");
    std::thread player([&] {
        for (int round = 0; round < 3; ++round) device.play(example("taps.json"));
    });

    struct Case {
        const char* key;
        const char* written;
        const char* readBack;
    };
    const Case cases[] = {
        {"Pipeline.Algs.ActivationThreshold", "212.5", "212.5"},
        {"Pipeline.Algs.EnableTapSuppression", "false", "false"},
        {"Pipeline.Algs.EnableHoldSuppression", "0", "false"},
        {"Pipeline.Algs.VirtualNormalizationFactors.7", "0.5", "0.5"},
    };
    for (const Case& c : cases) {
        const ControlClient::Reply written = _client->setProperty(device.path(), c.key, c.written);
        EXPECT_EQ(written.error, "") << c.key << ": " << written.message;
        const ControlClient::Reply read = _client->getProperty(device.path(), c.key);
        EXPECT_EQ(read.error, "") << c.key << ": " << read.message;
        EXPECT_EQ(read.value, c.readBack) << c.key;
    }
    player.join();

    // "Recording" is a text property (the container's JSON), so its value
    // arrives as a JSON string holding that text.
    const PropertyValue recording = VeltoTouch::JsonValue::parse(_client->getProperty(device.path(), "Recording").value,
                                                                 VeltoTouch::JsonValue::TopLevel::AnyValue);
    ASSERT_TRUE(recording.isString());
    EXPECT_NO_THROW(VeltoTouch::PipelineRecording{std::string_view(recording.asString())});
    // A reset command is write-only: it reads as nothing, yet it is taken.
    EXPECT_EQ(_client->setProperty(device.path(), "Pipeline.Algs.ResetEventStats", "null").error, "");
    EXPECT_EQ(tapsCounted(*_client, device.path()), 0u);
}

// A value that is not JSON, an unknown key read and an absent device are
// refused through `ctl` against the real daemon as well.
TEST_F(BusServiceTest, MalformedRequestsAreRefusedWhileTheDeviceKeepsRecognising)
{
    AttachedDevice& device = attach("sim:taps.json");
    // A property of the device itself, which the plug-in passes through.
    device.device()->setProperty("Product", PropertyValue::string("VeltoTouch"));
    const std::string path = device.path();
    const std::string absent = std::string(BusService::kDevicePathPrefix) + "41";
    const std::string missingDirectory = "/nonexistent-velto-directory/out.json";

    struct Case {
        const char* what;
        std::string path;
        const char* member;
        std::vector<std::string> arguments;
        const char* error;
    };
    const std::vector<Case> cases = {
        {"value with trailing text", path, "SetProperty", {"Pipeline.Algs.ActivationThreshold", "200 300"},
         BusService::kErrorInvalidJson},
        {"empty value", path, "SetProperty", {"Pipeline.Algs.ActivationThreshold", ""}, BusService::kErrorInvalidJson},
        {"unknown key written", path, "SetProperty", {"Pipeline.Algs.NoSuchSetting", "1"},
         BusService::kErrorInvalidArgument},
        {"key in another case", path, "SetProperty", {"Pipeline.Algs.activationthreshold", "1"},
         BusService::kErrorInvalidArgument},
        {"empty key", path, "GetProperty", {""}, BusService::kErrorInvalidArgument},
        {"string for a number", path, "SetProperty", {"Pipeline.Algs.ActivationThreshold", "\"high\""},
         BusService::kErrorInvalidArgument},
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
        {"empty path", path, "SaveRecording", {""}, BusService::kErrorInvalidArgument},
        {"relative path", path, "SaveRecording", {"out.json"}, BusService::kErrorInvalidArgument},
        {"directory path", path, "SaveRecording", {"/tmp/"}, BusService::kErrorInvalidArgument},
        {"unwritable path", path, "SaveRecording", {missingDirectory}, BusService::kErrorFailed},
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
    }
    EXPECT_EQ(_client->getProperty(path, "Pipeline.Algs.ActivationThreshold").value, before);
    EXPECT_FALSE(std::filesystem::exists(missingDirectory));

    // Still serving, still recognising.
    EXPECT_EQ(_client->listDevices(), (std::vector<std::string>{path}));
    device.play(example("taps.json"));
    EXPECT_GT(tapsCounted(*_client, path), 0u);
}

// That a saved file replays as the device played is checked through the real
// daemon and `ctl save-recording`; here how the file lands.
TEST_F(BusServiceTest, ASavedRecordingIsPrivateAndReplacedWhole)
{
    AttachedDevice& device = attach("sim:taps.json");

    const std::string directory = _bus.directory() + "/saved";  // removed with the bus
    std::filesystem::create_directories(directory);
    const std::string file = directory + "/session.json";
    const ControlClient::Reply saved = _client->saveRecording(device.path(), file);
    ASSERT_EQ(saved.error, "") << saved.message;

    struct stat status {};
    ASSERT_EQ(::stat(file.c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 0777, 0640u);
    // Saving again replaces the file whole and leaves nothing beside it.
    ASSERT_EQ(_client->saveRecording(device.path(), file).error, "");
    std::size_t entries = 0;
    for ([[maybe_unused]] const auto& entry : std::filesystem::directory_iterator(directory)) ++entries;
    EXPECT_EQ(entries, 1u);
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
