#include "daemon/KeyboardSink.h"

#include <gtest/gtest.h>
#include <linux/input-event-codes.h>

#include <string>

using VeltoHost::KeyboardSink;
using VeltoHost::KeyMap;

namespace {

// Writes what it is given as text; a write of `failingCode` fails.
class TextSink : public KeyboardSink {
public:
    explicit TextSink(unsigned int failingCode = 0) : _failingCode(failingCode) {}

    bool emitKey(unsigned int code, bool pressed) override
    {
        text += (pressed ? "+" : "-") + KeyMap::keyName(code) + " ";
        return code != _failingCode;
    }
    bool sync() override
    {
        text += "| ";
        return true;
    }

    std::string text;

private:
    unsigned int _failingCode;
};

}  // namespace

TEST(KeyboardSinkTest, EveryActionIsAFrameOfItsOwnAndAFailedWriteDoesNotStopTheRest)
{
    const KeyMap::Actions actions = {{KEY_VOICECOMMAND, false}, {KEY_VOLUMEUP, true}, {KEY_VOLUMEUP, false}};
    TextSink sink;
    EXPECT_TRUE(sink.play(actions));
    EXPECT_EQ(sink.text, "-KEY_VOICECOMMAND | +KEY_VOLUMEUP | -KEY_VOLUMEUP | ");

    TextSink failing(KEY_VOICECOMMAND);
    EXPECT_FALSE(failing.play(actions));
    EXPECT_EQ(failing.text, sink.text);

    TextSink idle;
    EXPECT_TRUE(idle.play({}));
    EXPECT_EQ(idle.text, "");
}
