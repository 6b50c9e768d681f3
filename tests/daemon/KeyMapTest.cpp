#include "daemon/KeyMap.h"

#include <gtest/gtest.h>
#include <linux/input-event-codes.h>

#include <string>
#include <vector>

using VeltoTouch::Gesture;
using VeltoHost::KeyMap;
using Kind = Gesture::Kind;
using Region = Gesture::Region;

namespace {

KeyMap::Action press(unsigned int code) { return {code, true}; }
KeyMap::Action release(unsigned int code) { return {code, false}; }

std::string describe(const KeyMap::Actions& actions)
{
    std::string text;
    for (const KeyMap::Action& action : actions) {
        text += action.pressed ? '+' : '-';
        text += KeyMap::keyName(action.code);
        text += ' ';
    }
    return text.empty() ? "(nothing)" : text;
}

struct Case {
    std::string name;
    std::vector<Gesture> gestures;
    KeyMap::Actions expected;
};

void runCases(const std::vector<Case>& cases, const KeyMap::Bindings& bindings)
{
    for (const Case& each : cases) {
        KeyMap map(bindings);
        KeyMap::Actions actions;
        for (const Gesture& gesture : each.gestures) {
            const KeyMap::Actions step = map.handle(gesture);
            actions.insert(actions.end(), step.begin(), step.end());
        }
        EXPECT_EQ(describe(actions), describe(each.expected)) << each.name;
    }
}

const Gesture mayBeginTop{Kind::MayBegin, Region::Top};
const Gesture mayBeginMiddle{Kind::MayBegin, Region::Middle};

}  // namespace

// Taps in each region are turned into keys end to end in the device session
// test, and a key held when the device goes is released there.
TEST(KeyMapTest, DefaultMapTurnsGestureSequencesIntoKeys)
{
    const std::vector<Case> cases = {
        {"tap in no region", {{Kind::Tap, Region::None}}, {}},
        {"hold at the top clicks once at its start",
         {mayBeginTop, {Kind::HoldStart, Region::Top}, {Kind::HoldEnd, Region::Top}},
         {press(KEY_VOLUMEUP), release(KEY_VOLUMEUP)}},
        {"hold in the middle keeps voice command down until it ends",
         {mayBeginMiddle, {Kind::HoldStart, Region::Middle}, {Kind::HoldEnd, Region::Middle}},
         {press(KEY_VOICECOMMAND), release(KEY_VOICECOMMAND)}},
        {"slow slide from the top to the bottom and back",
         {mayBeginTop,
          {Kind::HoldStart, Region::Top},
          {Kind::HoldChange, Region::Middle},
          {Kind::HoldChange, Region::Bottom},
          {Kind::HoldChange, Region::Middle},
          {Kind::HoldChange, Region::Top},
          {Kind::HoldEnd, Region::Top}},
         {press(KEY_VOLUMEUP), release(KEY_VOLUMEUP), press(KEY_VOLUMEDOWN), release(KEY_VOLUMEDOWN),
          press(KEY_VOLUMEUP), release(KEY_VOLUMEUP)}},
        {"hold that starts in the middle and slides down releases voice command as it leaves",
         {mayBeginTop, {Kind::HoldStart, Region::Middle}, {Kind::HoldChange, Region::Bottom},
          {Kind::HoldChange, Region::Middle}, {Kind::HoldEnd, Region::Middle}},
         {press(KEY_VOICECOMMAND), release(KEY_VOICECOMMAND), press(KEY_VOLUMEDOWN), release(KEY_VOLUMEDOWN)}},
    };
    runCases(cases, KeyMap::defaultBindings());
}

TEST(KeyMapTest, OddSequencesNeverLeaveAKeyDownOrPressItTwice)
{
    const std::vector<Case> cases = {
        {"hold-end without hold-start", {{Kind::HoldEnd, Region::Middle}}, {}},
        {"hold-change without hold-start clicks its region",
         {{Kind::HoldChange, Region::Top}},
         {press(KEY_VOLUMEUP), release(KEY_VOLUMEUP)}},
        {"two hold-starts in the middle",
         {{Kind::HoldStart, Region::Middle}, {Kind::HoldStart, Region::Middle}, {Kind::HoldEnd, Region::Middle}},
         {press(KEY_VOICECOMMAND), release(KEY_VOICECOMMAND), press(KEY_VOICECOMMAND), release(KEY_VOICECOMMAND)}},
        {"a second hold-start elsewhere",
         {{Kind::HoldStart, Region::Middle}, {Kind::HoldStart, Region::Top}, {Kind::HoldEnd, Region::Top}},
         {press(KEY_VOICECOMMAND), release(KEY_VOICECOMMAND), press(KEY_VOLUMEUP), release(KEY_VOLUMEUP)}},
        {"cancel mid-hold",
         {{Kind::HoldStart, Region::Middle}, {Kind::Cancel, Region::None}, {Kind::HoldEnd, Region::Middle}},
         {press(KEY_VOICECOMMAND), release(KEY_VOICECOMMAND)}},
        {"device reset mid-hold",
         {{Kind::HoldStart, Region::Middle}, {Kind::DeviceReset, Region::None}, {Kind::Cancel, Region::None}},
         {press(KEY_VOICECOMMAND), release(KEY_VOICECOMMAND)}},
        {"hold-end lost, next touch begins",
         {{Kind::HoldStart, Region::Middle}, mayBeginMiddle},
         {press(KEY_VOICECOMMAND), release(KEY_VOICECOMMAND)}},
        {"hold-end lost, tap arrives",
         {{Kind::HoldStart, Region::Middle}, {Kind::Tap, Region::Top}},
         {press(KEY_VOICECOMMAND), release(KEY_VOICECOMMAND), press(KEY_VOLUMEUP), release(KEY_VOLUMEUP)}},
        {"a hold-change into the held region keeps the key",
         {{Kind::HoldStart, Region::Middle}, {Kind::HoldChange, Region::Middle}, {Kind::HoldEnd, Region::Middle}},
         {press(KEY_VOICECOMMAND), release(KEY_VOICECOMMAND)}},
        {"unknown events, idle reset and idle cancel",
         {{Kind::Unknown, Region::Top}, {Kind::DeviceReset, Region::None}, {Kind::Cancel, Region::None}},
         {}},
        {"unknown event mid-hold keeps the key",
         {{Kind::HoldStart, Region::Middle}, {Kind::Unknown, Region::Top}, {Kind::HoldEnd, Region::Middle}},
         {press(KEY_VOICECOMMAND), release(KEY_VOICECOMMAND)}},
    };
    runCases(cases, KeyMap::defaultBindings());
}

TEST(KeyMapTest, ConfiguredBindingsReplaceTheDefaults)
{
    KeyMap::Bindings bindings;
    bindings.clicks[{Kind::MayBegin, Region::Top}] = KEY_A;
    bindings.clicks[{Kind::HoldStart, Region::Middle}] = KEY_B;
    bindings.clicks[{Kind::HoldEnd, Region::Middle}] = KEY_C;
    bindings.holds[Region::Middle] = KEY_LEFTSHIFT;
    bindings.holds[Region::Top] = KEY_LEFTSHIFT;
    const std::vector<Case> cases = {
        {"may-begin click", {mayBeginTop, {Kind::Tap, Region::Top}}, {press(KEY_A), release(KEY_A)}},
        {"hold-start click, then the held key; release before the hold-end click",
         {{Kind::HoldStart, Region::Middle}, {Kind::HoldEnd, Region::Middle}},
         {press(KEY_B), release(KEY_B), press(KEY_LEFTSHIFT), release(KEY_LEFTSHIFT), press(KEY_C), release(KEY_C)}},
        {"one key held from two regions is released when the hold leaves the first",
         {{Kind::HoldStart, Region::Top}, {Kind::HoldChange, Region::Middle}, {Kind::HoldEnd, Region::Middle}},
         {press(KEY_LEFTSHIFT), release(KEY_LEFTSHIFT), press(KEY_C), release(KEY_C)}},
        {"nothing bound at the bottom", {{Kind::HoldStart, Region::Bottom}, {Kind::HoldEnd, Region::Bottom}}, {}},
    };
    runCases(cases, bindings);
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
