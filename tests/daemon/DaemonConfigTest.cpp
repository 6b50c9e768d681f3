#include "daemon/DaemonConfig.h"

#include "platform/log/Log.h"

#include <gtest/gtest.h>
#include <linux/input-event-codes.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

using VeltoHost::DaemonConfig;
using VeltoTouch::Gesture;
using VeltoHost::KeyMap;
using VeltoHost::LogLevel;
namespace fs = std::filesystem;
using Kind = Gesture::Kind;
using Region = Gesture::Region;

namespace {

class DaemonConfigTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        _dir = fs::temp_directory_path() / ("daemon-config-" + std::to_string(::getpid()));
        fs::create_directories(_dir);
    }
    void TearDown() override { fs::remove_all(_dir); }

    std::string write(const std::string& name, const std::string& text)
    {
        const std::string path = (_dir / name).string();
        std::ofstream(path) << text;
        return path;
    }

    fs::path _dir;
};

KeyMap::Bindings defaultsWith(void (*change)(KeyMap::Bindings&))
{
    KeyMap::Bindings bindings = KeyMap::defaultBindings();
    change(bindings);
    return bindings;
}

}  // namespace

// An empty file, and one binding changed with the others kept, are read
// again by the daemon's reload test, which checks the keyboard they make.
TEST_F(DaemonConfigTest, GoodFiles)
{
    struct Case {
        std::string name;
        std::string text;
        std::vector<DaemonConfig::DeviceMatch> matches;
        KeyMap::Bindings keys;
        std::optional<int> logThreshold;
    };
    const std::vector<Case> cases = {
        {"two models and the quietest log",
         "log_level = \"off\"\n[[match]]\nvendor = 0x1234\nproduct = 0xABCD\n\n[[match]]\nvendor = 0\nproduct = 65535\n",
         {{0x1234, 0xABCD}, {0, 0xFFFF}},
         KeyMap::defaultBindings(),
         VeltoHost::Log::kOff},
        {"sub-table form, removal with an empty name, a hold binding elsewhere",
         "[keys.hold]\nmiddle = \"\"\ntop = \"BTN_LEFT\"\n[keys.hold-change]\nnone = \"KEY_NEXTSONG\"\n", {},
         defaultsWith([](KeyMap::Bindings& b) {
             b.holds.erase(Region::Middle);
             b.holds[Region::Top] = BTN_LEFT;
             b.clicks[{Kind::HoldChange, Region::None}] = KEY_NEXTSONG;
         }),
         std::nullopt},
        {"every click gesture, the most verbose log",
         "log_level = \"debug\"\n[keys]\nmay-begin.top = \"KEY_A\"\nhold-end.bottom = \"KEY_B\"\nhold-start.top = \"\"\n",
         {},
         defaultsWith([](KeyMap::Bindings& b) {
             b.clicks[{Kind::MayBegin, Region::Top}] = KEY_A;
             b.clicks[{Kind::HoldEnd, Region::Bottom}] = KEY_B;
             b.clicks.erase({Kind::HoldStart, Region::Top});
         }),
         static_cast<int>(LogLevel::Debug)},
    };
    for (const Case& each : cases) {
        SCOPED_TRACE(each.name);
        const DaemonConfig config = DaemonConfig::load(write("good.toml", each.text));
        EXPECT_EQ(config.matches, each.matches);
        EXPECT_TRUE(config.keys == each.keys);
        EXPECT_EQ(config.logThreshold, each.logThreshold);
    }
}

TEST_F(DaemonConfigTest, BadFilesNameTheFileThePlaceAndTheFault)
{
    struct Case {
        std::string text;
        std::string message;  // after "PATH:"
    };
    const std::vector<Case> cases = {
        {"colour = 1\n", "1:1: unknown setting \"colour\" (expected log_level, [[match]] or [keys])"},
        {"log_level = \"verbose\"\n", "1:13: log_level must be \"debug\", \"default\", \"error\" or \"off\""},
        {"log_level = 2\n", "1:13: log_level must be"},
        {"[[match]]\nvendor = 0x10000\nproduct = 1\n", "2:10: vendor 0x10000 is out of range (0 to 0xFFFF)"},
        {"[[match]]\nvendor = 1\nproduct = -1\n", "3:11: product -1 is out of range (0 to 0xFFFF)"},
        {"[[match]]\nvendor = 65536\nproduct = 1\n", "2:10: vendor 65536 is out of range (0 to 0xFFFF)"},
        {"[[match]]\nvendor = \"0x1234\"\nproduct = 1\n", "2:10: vendor must be an integer such as 0x1234"},
        {"[[match]]\nvendor = 1\nproduct = 2\nvendr = 3\n", "4:1: unknown key \"vendr\" in [[match]]"},
        {"[[match]]\nvendor = 1\nproduct = 5\n[[match]]\nproduct = 2\nvendor = 3\n[[match]]\nvendor = 4\n",
         "7:1: [[match]] needs both vendor and product"},
        {"[match]\nvendor = 1\nproduct = 2\n", "1:2: match must be a list of tables: write each one as [[match]]"},
        {"[keys]\ntap.top = \"KEY_VOLUMEUPP\"\n", "2:11: unknown key name \"KEY_VOLUMEUPP\""},
        {"[keys]\ntap.top = 115\n", "2:11: a key binding must be a key name"},
        {"[keys]\nswipe.top = \"KEY_A\"\n", "2:1: unknown gesture \"swipe\" in [keys]"},
        {"[keys]\ncancel.top = \"KEY_A\"\n", "2:1: unknown gesture \"cancel\" in [keys]"},
        {"[keys]\ntap.left = \"KEY_A\"\n", "2:5: unknown region \"left\" in [keys] (expected top, middle, bottom or none)"},
        {"[keys]\ntap = \"KEY_A\"\n", "2:7: keys.tap must name a region"},
        {"keys = 3\n", "1:1: keys must be a table"},
        {"[[match]]\nvendor = \n", "2:10: "},
        {"[keys]\ntap.top = \"KEY_A\"\ntap.top = \"KEY_B\"\n", "3:"},
    };
    for (const Case& each : cases) {
        const std::string path = write("bad.toml", each.text);
        try {
            DaemonConfig::load(path);
            ADD_FAILURE() << "accepted:\n" << each.text;
        } catch (const DaemonConfig::Error& error) {
            EXPECT_EQ(std::string(error.what()).rfind(path + ":" + each.message, 0), 0u)
                << "expected " << each.message << "\n     got " << error.what();
        }
    }
}

TEST_F(DaemonConfigTest, ARepeatedMatchIsTakenOnceWithAWarningThatPointsAtIt)
{
    const std::string path = write("twice.toml",
                                   "[[match]]\nvendor = 0x1234\nproduct = 0x5678\n"
                                   "[[match]]\nvendor = 0x1234\nproduct = 0x0009\n"
                                   "[[match]]\nproduct = 22136\nvendor = 4660\n"
                                   "[[match]]\nvendor = 0x1234\nproduct = 9\n");
    const DaemonConfig config = DaemonConfig::load(path);
    EXPECT_EQ(config.matches, (std::vector<DaemonConfig::DeviceMatch>{{0x1234, 0x5678}, {0x1234, 0x0009}}));
    EXPECT_EQ(config.warnings,
              (std::vector<std::string>{
                  path + ":7:1: [[match]] vendor 0x1234 product 0x5678 repeats the one at line 1; taken once",
                  path + ":10:1: [[match]] vendor 0x1234 product 0x0009 repeats the one at line 4; taken once"}));
    EXPECT_TRUE(DaemonConfig::load(write("once.toml", "[[match]]\nvendor = 1\nproduct = 2\n")).warnings.empty());
}

TEST_F(DaemonConfigTest, AFileThatCannotBeReadIsNamedNotTakenForAnEmptyOne)
{
    const std::string absent = (_dir / "absent.toml").string();
    const std::string directory = (_dir / "conf.d").string();
    fs::create_directories(directory);
    const std::vector<std::pair<std::string, std::string>> cases = {
        {absent, absent + ": cannot read: No such file or directory"},
        {directory, directory + ": cannot read: Is a directory"},
    };
    for (const auto& [path, message] : cases) {
        try {
            DaemonConfig::load(path);
            ADD_FAILURE() << "loaded " << path;
        } catch (const DaemonConfig::Error& error) {
            EXPECT_EQ(std::string(error.what()), message);
        }
    }
}

TEST_F(DaemonConfigTest, TheShippedExampleLoadsAsTheDefaults)
{
    const DaemonConfig config = DaemonConfig::load(VELTO_PACKAGING_DIR "/veltotouch.toml");
    EXPECT_TRUE(config.keys == KeyMap::defaultBindings());
    EXPECT_TRUE(config.matches.empty());
    EXPECT_EQ(config.logThreshold, std::nullopt);
}
