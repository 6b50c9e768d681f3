#include "daemon/DeviceSession.h"

#include "AttachedDevice.h"
#include "PrivateBus.h"
#include "bus/ControlClient.h"

#include <gtest/gtest.h>
#include <linux/input-event-codes.h>

#include <algorithm>
#include <condition_variable>
#include <mutex>
#include <string>
#include <vector>

using namespace VeltoHost;
using namespace std::chrono_literals;
using VeltoTouch::PipelineRecording;

namespace {

const std::string kExamples = VELTO_EXAMPLES_DIR;

// Key actions as text, "+KEY_VOLUMEUP" for a press and "-KEY_VOLUMEUP" for a
// release, in the order the keyboard got them.
class RecordingKeyboard final : public KeyboardSink {
public:
    bool emitKey(unsigned int code, bool pressed) override
    {
        std::lock_guard guard(_lock);
        _actions.push_back((pressed ? "+" : "-") + KeyMap::keyName(code));
        _changed.notify_all();
        return true;
    }
    bool sync() override { return true; }
    std::vector<std::string> actions()
    {
        std::lock_guard guard(_lock);
        return _actions;
    }
    // The deadline only keeps a broken session from hanging the test.
    bool waitFor(const std::string& action)
    {
        std::unique_lock guard(_lock);
        return _changed.wait_for(guard, 20s, [&] { return std::ranges::find(_actions, action) != _actions.end(); });
    }

private:
    std::mutex _lock;
    std::condition_variable _changed;
    std::vector<std::string> _actions;
};

PipelineRecording recordingOf(const std::string& name) { return PipelineRecording{std::string_view(readFile(kExamples + "/" + name))}; }

// The first `reports` input reports of a recording, with the state frames among them.
PipelineRecording cutAfter(const PipelineRecording& recording, std::size_t reports)
{
    PipelineRecording cut;
    std::size_t seen = 0;
    for (const PipelineRecording::Frame& frame : recording.frames()) {
        if (frame.type == PipelineRecording::Frame::Type::InputReport && ++seen > reports) break;
        cut.appendFrame(frame);
    }
    return cut;
}

}  // namespace

// That the session's gestures become signals, in replay's order, is checked
// end to end on the daemon's bus; here the keys they become.
TEST(DeviceSessionTest, GesturesBecomeKeysAndAHeldKeyIsReleasedWhenTheDeviceGoes)
{
    PrivateBus bus;
    ASSERT_FALSE(bus.address().empty()) << bus.error();
    BusService service(BusConnection::Address::at(bus.address()));
    RecordingKeyboard keyboard;
    std::mutex keyboardLock;
    const DeviceSession::Outputs outputs{&service, &keyboard, &keyboardLock, KeyMap::defaultBindings()};

    {
        SimulatedHostDevice::Ref device = SimulatedHostDevice::create();
        DeviceSession session("sim:taps.json", device, VELTO_SERVICE_MODULE_PATH, outputs);
        ASSERT_EQ(session.busId(), std::optional<BusService::DeviceId>(0));
        playInto(session, device, recordingOf("taps.json"));
    }
    // Taps at the top, in the middle and at the bottom.
    EXPECT_EQ(keyboard.actions(), (std::vector<std::string>{"+KEY_VOLUMEUP", "-KEY_VOLUMEUP", "+KEY_PLAYPAUSE",
                                                            "-KEY_PLAYPAUSE", "+KEY_VOLUMEDOWN", "-KEY_VOLUMEDOWN"}));

    // A hold in the middle cut short by the device going away: the voice
    // command key is not left down.
    {
        SimulatedHostDevice::Ref device = SimulatedHostDevice::create();
        DeviceSession session("sim:holds.json", device, VELTO_SERVICE_MODULE_PATH, outputs);
        EXPECT_EQ(session.busId(), std::optional<BusService::DeviceId>(1));
        playInto(session, device, cutAfter(recordingOf("holds.json"), 250));  // hold-start at frame 217
    }
    const std::vector<std::string> actions = keyboard.actions();
    ASSERT_GE(actions.size(), 2u);
    EXPECT_EQ(std::vector<std::string>(actions.end() - 2, actions.end()),
              (std::vector<std::string>{"+KEY_VOICECOMMAND", "-KEY_VOICECOMMAND"}));
}

TEST(DeviceSessionTest, NewKeysTakeOverBetweenEventsAndTheHeldKeyIsReleasedWhereItWasPressed)
{
    RecordingKeyboard before;
    RecordingKeyboard after;
    std::mutex keyboardLock;
    KeyMap::Bindings muted = KeyMap::defaultBindings();
    muted.clicks[{Gesture::Kind::Tap, Gesture::Region::Middle}] = KEY_MUTE;
    {
        SimulatedHostDevice::Ref device = SimulatedHostDevice::create();
        DeviceSession session("sim:holds.json", device, VELTO_SERVICE_MODULE_PATH,
                              {nullptr, &before, &keyboardLock, KeyMap::defaultBindings()});
        playInto(session, device, cutAfter(recordingOf("holds.json"), 250));
        // Mid-hold: the voice command key is down.
        ASSERT_TRUE(before.waitFor("+KEY_VOICECOMMAND"));
        session.changeKeys(muted, &after);
        EXPECT_EQ(before.actions().back(), "-KEY_VOICECOMMAND");
        playInto(session, device, recordingOf("taps.json"));
    }
    // A tap at the top, then the hold in the middle.
    EXPECT_EQ(before.actions(), (std::vector<std::string>{"+KEY_VOLUMEUP", "-KEY_VOLUMEUP", "+KEY_VOICECOMMAND",
                                                          "-KEY_VOICECOMMAND"}));
    EXPECT_EQ(after.actions(), (std::vector<std::string>{"+KEY_VOLUMEUP", "-KEY_VOLUMEUP", "+KEY_MUTE", "-KEY_MUTE",
                                                         "+KEY_VOLUMEDOWN", "-KEY_VOLUMEDOWN"}));
}

TEST(DeviceSessionTest, ADeviceThatCannotStartLeavesNoObjectOnTheBus)
{
    PrivateBus bus;
    ASSERT_FALSE(bus.address().empty()) << bus.error();
    BusService service(BusConnection::Address::at(bus.address()));
    SimulatedHostDevice::Ref device = SimulatedHostDevice::create();
    device->failOpen(true);
    EXPECT_THROW(DeviceSession("sim:x", device, VELTO_SERVICE_MODULE_PATH, {&service, nullptr, nullptr, {}}),
                 std::runtime_error);
    ControlClient client(BusConnection::Address::at(bus.address()));
    ControlClient::Reply listed;
    EXPECT_TRUE(client.listDevices(&listed).empty()) << listed.message;
}
