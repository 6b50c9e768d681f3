// What `cmake --install` lays down for a system service, installed into a
// scratch root (DESTDIR) and started from there.
#include "ToolProcessSupport.h"
#include "ToolTestSupport.h"

#include <gtest/gtest.h>

#include <regex>

using namespace VeltoTool::Testing;

namespace {

constexpr auto kDeadline = ToolProcess::Seconds(120);

ToolProcess::Result install(const fs::path& root)
{
    ToolProcess process({"--install", VELTO_BUILD_DIR},
                        ProcessSetup::copy(VELTO_CMAKE_COMMAND, {"DESTDIR=" + root.string()}));
    return process.finish(kDeadline);
}

}  // namespace

TEST(InstallTest, TheServiceFilesLandWhereTheUnitLooksAndTheConfigurationIsKept)
{
    TempDir root;
    const ToolProcess::Result first = install(root.path());
    ASSERT_TRUE(first.exited && first.status == 0) << first.out << first.err;

    const fs::path prefix = root.path() / fs::path(VELTO_INSTALL_PREFIX).relative_path();
    const std::string unit = readFile(prefix / "lib/systemd/system/veltotouch.service");
    std::smatch exec;
    ASSERT_TRUE(std::regex_search(unit, exec, std::regex("\nExecStart=(/\\S+) daemon --config (/\\S+)\n"))) << unit;
    const fs::path program = root.path() / fs::path(exec[1].str()).relative_path();
    const fs::path config = root.path() / fs::path(exec[2].str()).relative_path();
    EXPECT_TRUE(fs::exists(config)) << config;
    for (const char* file : {"lib/veltotouch/libVeltoTouchHIDService.so", "lib/udev/rules.d/70-veltotouch.rules", "lib/sysusers.d/veltotouch.conf",
                             "share/dbus-1/system.d/org.veltotouch.VeltoTouch1.conf"}) {
        EXPECT_TRUE(fs::exists(prefix / file)) << file;
    }

    // The installed tool runs from the scratch root with its own plug-in (the
    // one beside it comes before the build tree's).
    ToolProcess host({"host", "--device", std::string("sim:") + VELTO_EXAMPLES_DIR + "/taps.json", "--speed", "0",
                      "--jsonl"},
                     ProcessSetup::copy(program.string(), {"VELTOTOUCH_PLUGIN="}));
    const ToolProcess::Result hosted = host.finish(kDeadline);
    EXPECT_EQ(hosted.status, 0) << hosted.err;
    EXPECT_EQ(eventsOf(hosted.out), eventsOf(runTool({"replay", std::string(VELTO_EXAMPLES_DIR) + "/taps.json",
                                                      "--jsonl"}).out));

    // An administrator's configuration survives the next install.
    std::ofstream(config) << "log_level = \"debug\"\n";
    const ToolProcess::Result again = install(root.path());
    ASSERT_TRUE(again.exited && again.status == 0) << again.err;
    EXPECT_EQ(readFile(config), "log_level = \"debug\"\n");
}
