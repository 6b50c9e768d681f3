#include "PluginLocator.h"

#include <gtest/gtest.h>

#include <unistd.h>

#include <filesystem>
#include <fstream>

using VeltoTool::PluginLocator;
namespace fs = std::filesystem;

TEST(PluginLocatorTest, LooksInTheEnvironmentThenBesideTheProgramThenTheBuildThenTheInstallLocation)
{
    const fs::path root = fs::temp_directory_path() / ("plugin-locator-" + std::to_string(::getpid()));
    const fs::path installedTree = root / "opt";
    fs::create_directories(installedTree / "bin");
    fs::create_directories(root / "build");
    const std::string program = (installedTree / "bin" / "veltotouch").string();
    const fs::path module = fs::path(VELTO_INSTALL_LIBDIR) / "veltotouch" / "libVeltoTouchHIDService.so";
    const std::string besideProgram = (installedTree / module).string();
    const std::string buildTree = (root / "build" / "module.so").string();
    const std::string installed = (root / "usr" / module).string();
    auto touch = [](const std::string& path) {
        fs::create_directories(fs::path(path).parent_path());
        std::ofstream(path) << "module";
    };

    // Nothing anywhere: every place is named, in order.
    PluginLocator::Result none = PluginLocator::find("", program, buildTree, installed);
    EXPECT_EQ(none.path, "");
    EXPECT_EQ(none.tried, (std::vector<std::string>{besideProgram, buildTree, installed}));
    const std::string message = PluginLocator::notFoundMessage(none);
    EXPECT_NE(message.find(besideProgram + ", " + buildTree + ", " + installed), std::string::npos) << message;
    EXPECT_NE(message.find("VELTOTOUCH_PLUGIN"), std::string::npos);

    touch(installed);
    EXPECT_EQ(PluginLocator::find("", program, buildTree, installed).path, installed);
    touch(buildTree);
    EXPECT_EQ(PluginLocator::find("", program, buildTree, installed).path, buildTree);
    touch(besideProgram);
    EXPECT_EQ(PluginLocator::find("", program, buildTree, installed).path, besideProgram);

    // The environment's choice comes first, and is final when it is missing.
    const std::string chosen = (root / "chosen.so").string();
    const PluginLocator::Result missing = PluginLocator::find(chosen, program, buildTree, installed);
    EXPECT_EQ(missing.path, "");
    EXPECT_EQ(missing.tried, std::vector<std::string>{chosen + " (VELTOTOUCH_PLUGIN)"});
    touch(chosen);
    EXPECT_EQ(PluginLocator::find(chosen, program, buildTree, installed).path, chosen);
    fs::remove_all(root);
}
