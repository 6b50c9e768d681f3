#include "platform/devices/HidrawNode.h"

#include <gtest/gtest.h>

#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <string>

using VeltoHost::HidrawNode;
namespace fs = std::filesystem;

// A hidraw node itself is taken by `record` on a real kernel in the system
// test (tests/system/daemon.sh, case 9).
TEST(HidrawNodeTest, EverythingButAHidrawNodeIsNamedForWhatItIs)
{
    const fs::path dir = fs::temp_directory_path() / ("hidraw-node-test-" + std::to_string(::getpid()));
    fs::create_directories(dir);
    std::ofstream(dir / "file.json") << "{}";
    ASSERT_EQ(::mkfifo((dir / "fifo").c_str(), 0600), 0);

    struct Case {
        std::string path;
        std::string answer;
    };
    const Case cases[] = {
        {(dir / "file.json").string(), "is a regular file"},
        {dir.string(), "is a directory"},
        {(dir / "fifo").string(), "is a pipe"},
        {(dir / "absent").string(), "does not exist"},
        {"/dev/null", "is a character device of the \"mem\" subsystem (1:3)"},
        {"/dev/zero", "is a character device of the \"mem\" subsystem (1:5)"},
    };
    for (const Case& c : cases) EXPECT_EQ(HidrawNode::whatElse(c.path), c.answer) << c.path;

    // A terminal is a character device too, of another subsystem.
    if (fs::exists("/dev/ptmx")) {
        EXPECT_EQ(HidrawNode::whatElse("/dev/ptmx").rfind("is a character device of the \"tty\" subsystem", 0), 0u);
    }
    fs::remove_all(dir);
}
