// What `cmake --install` lays down for a system service, installed into a
// scratch root (DESTDIR) and started from there.
#include "ToolProcessSupport.h"
#include "ToolTestSupport.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <optional>
#include <regex>
#include <sstream>
#include <utility>

using namespace VeltoTool::Testing;

namespace {

constexpr auto kDeadline = ToolProcess::Seconds(120);

ToolProcess::Result install(const fs::path& root)
{
    ToolProcess process({"--install", VELTO_BUILD_DIR},
                        ProcessSetup::copy(VELTO_CMAKE_COMMAND, {"DESTDIR=" + root.string()}));
    return process.finish(kDeadline);
}

// The unit file as installed under `root`, and the prefix it lies under.
std::pair<fs::path, std::string> installedUnit(const fs::path& root)
{
    const fs::path prefix = root / fs::path(VELTO_INSTALL_PREFIX).relative_path();
    return {prefix, readFile(prefix / "lib/systemd/system/veltotouch.service")};
}

std::optional<fs::path> systemdAnalyze()
{
    const char* path = std::getenv("PATH");
    std::istringstream directories(path ? path : "/usr/bin:/bin");
    for (std::string directory; std::getline(directories, directory, ':');) {
        const fs::path candidate = fs::path(directory) / "systemd-analyze";
        if (!directory.empty() && ::access(candidate.c_str(), X_OK) == 0) return candidate;
    }
    return std::nullopt;
}

ToolProcess::Result analyze(const fs::path& program, const std::vector<std::string>& arguments)
{
    ToolProcess process(arguments, ProcessSetup::copy(program.string()));
    return process.finish(kDeadline);
}

}  // namespace

TEST(InstallTest, TheServiceFilesLandWhereTheUnitLooksAndTheConfigurationIsKept)
{
    TempDir root;
    const ToolProcess::Result first = install(root.path());
    ASSERT_TRUE(first.exited && first.status == 0) << first.out << first.err;

    const auto [prefix, unit] = installedUnit(root.path());
    std::smatch exec;
    ASSERT_TRUE(std::regex_search(unit, exec, std::regex("\nExecStart=(/\\S+) daemon --config (/\\S+)\n"))) << unit;
    const fs::path program = root.path() / fs::path(exec[1].str()).relative_path();
    const fs::path config = root.path() / fs::path(exec[2].str()).relative_path();
    EXPECT_TRUE(fs::exists(config)) << config;
    const std::string privateLibraries = std::string(VELTO_INSTALL_LIBDIR) + "/veltotouch/";
    for (const std::string& file :
         {privateLibraries + "libVeltoTouchHIDService.so", privateLibraries + "libveltotouch_platform.so",
          std::string("lib/udev/rules.d/70-veltotouch.rules"), std::string("lib/sysusers.d/veltotouch.conf"),
          std::string("share/dbus-1/system.d/org.veltotouch.VeltoTouch1.conf")}) {
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

// The unit as installed, judged by systemd itself: it loads without a
// complaint, and its sandbox leaves an exposure of 2.0 or less.
TEST(InstallTest, TheInstalledUnitLoadsCleanlyAndStaysConfined)
{
    const std::optional<fs::path> systemdAnalyzer = systemdAnalyze();
    if (!systemdAnalyzer) GTEST_SKIP() << "systemd-analyze is not installed (scripts/install-deps installs systemd)";
    TempDir root;
    const ToolProcess::Result installed = install(root.path());
    ASSERT_TRUE(installed.exited && installed.status == 0) << installed.out << installed.err;

    // verify wants the program where ExecStart names it, so that path moves
    // into the scratch root; nothing else changes.
    const std::string unit = installedUnit(root.path()).second;
    std::smatch exec;
    ASSERT_TRUE(std::regex_search(unit, exec, std::regex("\nExecStart=(/\\S+) "))) << unit;
    const std::string relocated = exec.prefix().str() + "\nExecStart=" +
                                  (root.path() / fs::path(exec[1].str()).relative_path()).string() + " " +
                                  exec.suffix().str();
    const fs::path file = root.file("veltotouch.service", relocated);

    const ToolProcess::Result verified = analyze(*systemdAnalyzer, {"verify", file.string()});
    EXPECT_TRUE(verified.exited && verified.status == 0) << verified.out << verified.err;
    EXPECT_EQ(verified.err.find("veltotouch.service"), std::string::npos) << verified.err;

    const ToolProcess::Result assessed = analyze(*systemdAnalyzer, {"security", "--offline=true", file.string()});
    ASSERT_TRUE(assessed.exited && assessed.status == 0) << assessed.err;
    std::smatch exposure;
    ASSERT_TRUE(std::regex_search(assessed.out, exposure,
                                  std::regex("Overall exposure level for veltotouch\\.service: ([0-9]+\\.[0-9]+)")))
        << assessed.out;
    EXPECT_LE(std::stod(exposure[1].str()), 2.0) << assessed.out;
}
