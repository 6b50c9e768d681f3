#include "daemon/KeyMap.h"

#include <gtest/gtest.h>
#include <linux/input-event-codes.h>

#include <sstream>
#include <string>
#include <vector>

using VeltoTouch::Gesture;
using VeltoHost::KeyMap;
using Kind = Gesture::Kind;
using Region = Gesture::Region;

namespace {

// Gestures written "hold-start middle, hold-end middle": a kind and a region
// each, by their names; "unknown" is an event the host cannot tell.
std::vector<Gesture> gesturesOf(const std::string& text)
{
    std::vector<Gesture> gestures;
    std::istringstream in(text);
    for (std::string kind, region; in >> kind >> region;) {
        if (region.ends_with(',')) region.pop_back();
        gestures.push_back({kind == "unknown" ? Kind::Unknown : Gesture::kindFromName(kind).value(),
                            Gesture::regionFromName(region).value()});
    }
    return gestures;
}

struct Case {
    std::string name;
    std::string gestures;
    std::string keys;  // "+KEY_A -KEY_A ": each press and release, in order
};

void runCases(const std::vector<Case>& cases, const KeyMap::Bindings& bindings)
{
    for (const Case& each : cases) {
        KeyMap map(bindings);
        std::string keys;
        for (const Gesture& gesture : gesturesOf(each.gestures)) {
            for (const KeyMap::Action& action : map.handle(gesture)) {
                keys += (action.pressed ? "+" : "-") + KeyMap::keyName(action.code) + " ";
            }
        }
        EXPECT_EQ(keys, each.keys) << each.name;
    }
}

const std::string kVolumeUp = "+KEY_VOLUMEUP -KEY_VOLUMEUP ";
const std::string kVolumeDown = "+KEY_VOLUMEDOWN -KEY_VOLUMEDOWN ";
const std::string kVoiceCommand = "+KEY_VOICECOMMAND -KEY_VOICECOMMAND ";

}  // namespace

// Taps in each region are turned into keys end to end in the device session
// test, and a key held when the device goes is released there.
TEST(KeyMapTest, DefaultMapTurnsGestureSequencesIntoKeys)
{
    runCases({{"tap in no region", "tap none", ""},
              {"hold at the top clicks once at its start", "may-begin top, hold-start top, hold-end top", kVolumeUp},
              {"hold in the middle keeps voice command down until it ends",
               "may-begin middle, hold-start middle, hold-end middle", kVoiceCommand},
              {"slow slide from the top to the bottom and back",
               "may-begin top, hold-start top, hold-change middle, hold-change bottom, hold-change middle, "
               "hold-change top, hold-end top",
               kVolumeUp + kVolumeDown + kVolumeUp},
              {"hold that starts in the middle and slides down releases voice command as it leaves",
               "may-begin top, hold-start middle, hold-change bottom, hold-change middle, hold-end middle",
               kVoiceCommand + kVolumeDown}},
             KeyMap::defaultBindings());
}

TEST(KeyMapTest, OddSequencesNeverLeaveAKeyDownOrPressItTwice)
{
    runCases({{"hold-end without hold-start", "hold-end middle", ""},
              {"hold-change without hold-start clicks its region", "hold-change top", kVolumeUp},
              {"two hold-starts in the middle", "hold-start middle, hold-start middle, hold-end middle",
               kVoiceCommand + kVoiceCommand},
              {"a second hold-start elsewhere", "hold-start middle, hold-start top, hold-end top", kVoiceCommand + kVolumeUp},
              {"cancel mid-hold", "hold-start middle, cancel none, hold-end middle", kVoiceCommand},
              {"device reset mid-hold", "hold-start middle, device-reset none, cancel none", kVoiceCommand},
              {"hold-end lost, next touch begins", "hold-start middle, may-begin middle", kVoiceCommand},
              {"hold-end lost, tap arrives", "hold-start middle, tap top", kVoiceCommand + kVolumeUp},
              {"a hold-change into the held region keeps the key", "hold-start middle, hold-change middle, hold-end middle",
               kVoiceCommand},
              {"unknown events, idle reset and idle cancel", "unknown top, device-reset none, cancel none", ""},
              {"unknown event mid-hold keeps the key", "hold-start middle, unknown top, hold-end middle", kVoiceCommand}},
             KeyMap::defaultBindings());
}

TEST(KeyMapTest, ConfiguredBindingsReplaceTheDefaults)
{
    KeyMap::Bindings bindings;
    bindings.clicks[{Kind::MayBegin, Region::Top}] = KEY_A;
    bindings.clicks[{Kind::HoldStart, Region::Middle}] = KEY_B;
    bindings.clicks[{Kind::HoldEnd, Region::Middle}] = KEY_C;
    bindings.holds[Region::Middle] = KEY_LEFTSHIFT;
    bindings.holds[Region::Top] = KEY_LEFTSHIFT;
    runCases({{"may-begin click", "may-begin top, tap top", "+KEY_A -KEY_A "},
              {"hold-start click, then the held key; release before the hold-end click", "hold-start middle, hold-end middle",
               "+KEY_B -KEY_B +KEY_LEFTSHIFT -KEY_LEFTSHIFT +KEY_C -KEY_C "},
              {"one key held from two regions is released when the hold leaves the first",
               "hold-start top, hold-change middle, hold-end middle", "+KEY_LEFTSHIFT -KEY_LEFTSHIFT +KEY_C -KEY_C "},
              {"nothing bound at the bottom", "hold-start bottom, hold-end bottom", ""}},
             bindings);
    EXPECT_EQ(KeyMap(bindings).keyCodes(), (std::set<unsigned int>{KEY_A, KEY_B, KEY_C, KEY_LEFTSHIFT}));
}

TEST(KeyMapTest, KeyNamesAreLinuxKeyNamesOnly)
{
    const std::vector<std::string> notKeys = {"",          "VOLUMEUP",  "key_volumeup", "KEY_VOLUMEUPP",
                                              "ABS_X",     "REL_WHEEL", "SYN_REPORT",   std::string("KEY_MUTE\0X", 10)};
    for (const std::string& name : notKeys) {
        EXPECT_EQ(KeyMap::keyCodeFromName(name), std::nullopt) << name;
    }
}
