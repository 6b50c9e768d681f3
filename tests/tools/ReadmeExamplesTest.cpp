// README's examples of the daemon and `ctl`, run as printed, in order, by a
// shell in the project's top folder, with the private bus standing in for
// the user's session bus: what a reader types must work.
#include "PrivateBus.h"
#include "ToolProcessSupport.h"
#include "ToolTestSupport.h"

#include "bus/BusService.h"
#include "bus/ControlClient.h"

#include <gtest/gtest.h>

#include <csignal>
#include <filesystem>
#include <sstream>
#include <string>
#include <vector>

using namespace VeltoTool::Testing;

namespace {

constexpr auto kDeadline = ToolProcess::Seconds(30);
// A command that runs until interrupted is interrupted once it has printed
// this many lines, or after this long.
constexpr std::size_t kStreamedLines = 2;
constexpr auto kStreamLimit = ToolProcess::Seconds(8);

const std::string kTop = fs::path(kExamples).parent_path().string();

struct Example {
    std::string command;
    std::vector<std::string> output;  // as printed; "..." stands for lines left out
    bool background = false;          // printed without "$ ": started and left running
};

// The indented examples between `from` and the next heading of the same
// level, that start with `veltotouch` or `busctl`.
std::vector<Example> examplesOf(const std::string& readme, const std::string& from)
{
    std::vector<Example> examples;
    std::istringstream text(readme.substr(readme.find(from)));
    std::string line;
    std::getline(text, line);  // the heading itself
    bool inExample = false;
    while (std::getline(text, line) && !line.starts_with("## ")) {
        if (!line.starts_with("    ")) {
            inExample = false;
            continue;
        }
        const std::string body = line.substr(4);
        if (body.starts_with("$ veltotouch ") || body.starts_with("$ busctl ")) {
            examples.push_back({body.substr(2), {}, false});
            inExample = true;
        } else if (body.starts_with("veltotouch daemon ") && body.find('[') == std::string::npos) {  // not the synopsis
            examples.push_back({body, {}, true});
            inExample = false;
        } else if (inExample) {
            examples.back().output.push_back(body);
        }
    }
    return examples;
}

std::vector<std::string> linesOf(const std::string& text)
{
    std::vector<std::string> lines;
    std::istringstream in(text);
    for (std::string line; std::getline(in, line);) lines.push_back(line);
    return lines;
}

bool runsUntilInterrupted(const Example& example)
{
    return example.command.find(" events") != std::string::npos || example.command.find(" monitor ") != std::string::npos;
}

// A printed line and the README's line say the same thing but for the
// numbers and names that differ from run to run: an event line of the same
// device form, or JSON with the same keys.
bool sameShape(const std::string& printed, const std::string& shown)
{
    if (shown.starts_with("{")) {
        const json a = json::parse(printed, nullptr, false);
        const json b = json::parse(shown, nullptr, false);
        if (a.is_discarded() || b.is_discarded()) return false;
        std::vector<std::string> keysA, keysB;
        for (const auto& [key, value] : a.items()) keysA.push_back(key);
        for (const auto& [key, value] : b.items()) keysB.push_back(key);
        return keysA == keysB;
    }
    return printed.substr(0, printed.find_first_of("0123456789")) == shown.substr(0, shown.find_first_of("0123456789"));
}

}  // namespace

TEST(ReadmeExamplesTest, TheDaemonAndCtlExamplesWorkAsPrinted)
{
    PrivateBus bus;
    ASSERT_FALSE(bus.address().empty()) << bus.error();
    const std::vector<std::string> environment{
        "DBUS_SESSION_BUS_ADDRESS=" + bus.address(),
        "PATH=" + fs::path(VELTO_TOOL_PATH).parent_path().string() + ":/usr/bin:/bin",
    };
    const auto shell = [&](const std::string& command) {
        return std::make_unique<ToolProcess>(std::vector<std::string>{"-c", "cd '" + kTop + "' && exec " + command},
                                             ProcessSetup::copy("/bin/sh", environment));
    };

    const std::vector<Example> examples = examplesOf(readFile(kTop + "/README.md"), "## The system service");
    ASSERT_GE(examples.size(), 8u) << "README's daemon examples were not found";
    std::unique_ptr<ToolProcess> daemon;
    VeltoHost::ControlClient watcher(VeltoHost::BusConnection::Address::at(bus.address()));
    ASSERT_TRUE(watcher.watchSignals());
    for (const Example& example : examples) {
        SCOPED_TRACE(example.command);
        if (example.background) {
            ASSERT_FALSE(daemon) << "README starts a second daemon";
            daemon = shell(example.command);
            ASSERT_TRUE(watcher.waitUntil([&] { return watcher.signalsNamed("DeviceAdded").size() == 2; }));
            continue;
        }
        ASSERT_TRUE(daemon) << "an example asks the daemon before README starts it";
        auto run = shell(example.command);
        if (!runsUntilInterrupted(example)) {
            const ToolProcess::Result result = run->finish(kDeadline);
            EXPECT_EQ(linesOf(result.out + result.err), example.output);
            continue;
        }
        std::vector<std::string> printed;
        const auto until = std::chrono::steady_clock::now() + kStreamLimit;
        while (printed.size() < kStreamedLines && std::chrono::steady_clock::now() < until) {
            if (auto line = run->readLine(ToolProcess::Seconds(1))) printed.push_back(*line);
        }
        run->signal(SIGINT);
        const ToolProcess::Result result = run->finish(kDeadline);
        if (example.command.find(" monitor ") != std::string::npos) {
            // busctl ends by the signal; what it shows is bus traffic, not ours to pin.
            EXPECT_TRUE(result.status == 0 || result.signal == SIGINT) << result.err;
            continue;
        }
        EXPECT_EQ(result.status, 0) << result.err;
        EXPECT_FALSE(printed.empty()) << "no gesture printed";
        for (const std::string& line : printed) {
            EXPECT_TRUE(std::any_of(example.output.begin(), example.output.end(),
                                    [&](const std::string& shown) { return sameShape(line, shown); }))
                << line;
        }
    }
    ASSERT_TRUE(daemon);
    daemon->signal(SIGTERM);
    EXPECT_EQ(daemon->finish(kDeadline).status, 0);
}
