// What `veltotouch record` refuses, before it captures anything. The capture
// itself needs a hidraw node: the system tests run it on a real kernel
// (tests/system/daemon.sh, case 9). What each kind of path that is no
// hidraw node is called: HidrawNodeTest.
#include "ToolTestSupport.h"

#include <gtest/gtest.h>

using namespace VeltoTool::Testing;

namespace {

TEST(RecordCommand, RefusesWhatCannotBeRecordedBeforeWritingAnything)
{
    TempDir dir;
    const std::string out = dir.file("out.json").string();
    const std::string noMatch = dir.file("none.toml", "log_level = \"error\"\n").string();
    // Ids no device here has: this machine has no surface.
    const std::string match = dir.file("match.toml", "[[match]]\nvendor = 0xfeed\nproduct = 0xbeef\n").string();
    const std::string bad = dir.file("bad.toml", "[[match]]\nvendor = \"x\"\n").string();
    struct Case {
        std::vector<std::string> arguments;
        int status;
        std::string message;
    };
    const Case cases[] = {
        {{"/dev/null", "-o", out}, 1,
         "veltotouch: /dev/null is a character device of the \"mem\" subsystem (1:3); expected a hidraw device node "
         "(/dev/hidrawN)\n"},
        {{"-o", out, "--config", noMatch}, 1,
         "veltotouch: no DEVICE given, and " + noMatch +
             " has no [[match]] ids to find a surface by; name a hidraw node (/dev/hidrawN)\n"},
        {{"-o", out, "--config", match}, 1,
         "veltotouch: no surface found: no hidraw device has the ids " + match + " names (feed:beef)\n"},
        {{"-o", out, "--config", bad}, 1, ""},
        {{"/dev/null", "-o", out, "--duration", "0"}, 2, ""},
        {{"/dev/null", "-o", out, "--format", "wav"}, 2, ""},
        {{"/dev/null"}, 2, ""},
    };
    for (const Case& c : cases) {
        std::vector<std::string> arguments = {"record"};
        arguments.insert(arguments.end(), c.arguments.begin(), c.arguments.end());
        SCOPED_TRACE(::testing::PrintToString(arguments));
        const ToolRun run = runTool(arguments);
        EXPECT_EQ(run.status, c.status);
        if (!c.message.empty()) {
            EXPECT_EQ(run.err, c.message);
        }
        EXPECT_EQ(run.err.find('\n'), run.err.size() - 1) << "one line: " << run.err;
        EXPECT_FALSE(fs::exists(out));
    }
}

}  // namespace
