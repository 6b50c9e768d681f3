#include "ToolProcessSupport.h"
#include "ToolTestSupport.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <regex>
#include <string>
#include <vector>

using namespace VeltoTool::Testing;

namespace {

const std::string kTaps = std::string(VELTO_EXAMPLES_DIR) + "/taps.json";

TEST(Cli, UsageErrorsExitWithTwoAndOneLineThatNamesTheProblem)
{
    struct Case {
        std::vector<std::string> arguments;
        std::string message;  // expected within the line
    };
    const Case cases[] = {
        {{}, "A subcommand is required (see 'veltotouch help')"},
        {{"frobnicate"}, "no command \"frobnicate\" (replay, synth, eval, dump, host, daemon, properties, ctl, report, emulate, convert, record, help)"},
        {{"replay"}, "FILE is required"},
        {{"synth", "tap top"}, "--output is required"},
        {{"replay", kTaps, "--speed", "nan"}, "--speed: expected a finite number, got nan (see 'veltotouch help replay')"},
        {{"replay", kTaps, "--speed", "-1"}, "--speed: must be 0 or at least 0.001, got -1"},
        {{"replay", kTaps, "--speed", "fast"}, "--speed: expected a number, got \"fast\""},
        {{"replay", kTaps, "--max-gap", "-0.5"}, "--max-gap: must be at least 0, got -0.5"},
        {{"replay", kTaps, "--set", "NoEquals"}, "--set: expected KEY=VALUE, got \"NoEquals\""},
        {{"replay", kTaps, "--set", "Algs.HoldTimeoutMilliseconds=[1,"}, "not valid JSON"},
        {{"synth", "tap top", "-o", "/dev/null", "--frame-period", "0"}, "--frame-period: must be at least 1, got 0"},
        {{"dump", kTaps, "--frames", "x"}, "--frames: invalid frame range \"x\" (expected A:B with frame numbers)"},
        {{"dump", kTaps, "--frames", "9:3"},
         "--frames: invalid frame range \"9:3\" (first frame after last) (see 'veltotouch help dump')"},
        {{"host", "--device", "sim:"}, "--device: sim: needs a recording after the colon (sim:FILE)"},
        {{"daemon", "--config", "/no/such.toml"}, "--config: File does not exist: /no/such.toml"},
        {{"ctl", "set", "NoEquals"}, "expected KEY=VALUE, got \"NoEquals\""},
        {{"ctl", "--bus", "foo", "devices"}, "\"foo\" is not a bus: give system, session or a D-Bus address"},
        {{"ctl", "get", "-d", "first", "Pipeline.Algs.EventStats"}, "-d"},
        {{"help", "frobnicate"}, "help: no command \"frobnicate\""},
        {{"replay", kTaps, "--check", kTaps, "--get", "DebugInfo"}, "--check compares instead of printing"},
    };
    for (const Case& c : cases) {
        std::string shown;
        for (const std::string& argument : c.arguments) shown += argument + " ";
        SCOPED_TRACE(shown);
        const ToolRun run = runTool(c.arguments);
        EXPECT_EQ(run.status, 2);
        EXPECT_EQ(run.out, "");
        EXPECT_EQ(run.err.rfind("veltotouch: ", 0), 0u) << run.err;
        EXPECT_NE(run.err.find(c.message), std::string::npos) << run.err;
        EXPECT_EQ(run.err.find('\n'), run.err.size() - 1) << "one line only: " << run.err;
    }
}

TEST(Cli, HelpDescribesTheToolOrOneCommand)
{
    const ToolRun all = runTool({"help"});
    EXPECT_EQ(all.status, 0) << all.err;
    EXPECT_EQ(all.out, runTool({"--help"}).out);
    for (const std::string command : {"replay", "synth", "eval", "dump", "host", "daemon", "ctl", "report"}) {
        EXPECT_NE(all.out.find("\n  " + command + " "), std::string::npos) << command;
        const ToolRun one = runTool({"help", command});
        EXPECT_EQ(one.status, 0) << one.err;
        EXPECT_NE(one.out.find("Usage: veltotouch " + command), std::string::npos) << one.out;
        EXPECT_EQ(one.out, runTool({command, "--help"}).out);
    }
}

TEST(Cli, VersionNamesTheReleaseAndTheCommitBuilt)
{
    const ToolRun run = runTool({"--version"});
    ASSERT_EQ(run.status, 0) << run.err;
    std::smatch match;
    ASSERT_TRUE(std::regex_match(run.out, match, std::regex(R"(veltotouch (\d+\.\d+\.\d+) \(([0-9a-f]{7,}(-dirty)?|unknown)\)\n)")))
        << run.out;
}

// The script that stamps the revision at build time, run on a repository of
// its own: it has to follow new commits without CMake configuring again.
TEST(Cli, RevisionScriptFollowsEachCommitMarksChangesAndSaysUnknownOutsideARepository)
{
    if (::access("/usr/bin/git", X_OK) != 0) GTEST_SKIP() << "git is not installed";
    TempDir dir;
    const fs::path repository = dir.path() / "repository", header = dir.path() / "ToolRevision.h";
    // What git prints, without its last line break.
    const auto git = [&](std::vector<std::string> arguments) {
        arguments.insert(arguments.begin(), {"-C", repository.string(), "-c", "user.name=test", "-c", "user.email=t@x"});
        ToolProcess process(arguments, ProcessSetup::copy("/usr/bin/git"));
        const std::string out = process.finish(ToolProcess::Seconds(60)).out;
        return out.substr(0, out.find('\n'));
    };
    // The revision the script writes for `source`.
    const auto revisionOf = [&](const fs::path& source) -> std::string {
        const std::string command = std::string("'") + VELTO_CMAKE_COMMAND + "' -DSOURCE_DIR='" + source.string() +
                                    "' -DOUTPUT='" + header.string() + "' -P '" + VELTO_REVISION_SCRIPT + "'";
        EXPECT_EQ(std::system(command.c_str()), 0) << command;
        std::smatch match;
        const std::string text = readFile(header);
        if (!std::regex_search(text, match, std::regex("#define VELTO_GIT_REVISION \"([^\"]*)\""))) return "(none)";
        return match[1];
    };
    EXPECT_EQ(revisionOf(dir.path()), "unknown") << "not a repository";
    // Whatever rewrote an unchanged header would give it a new modification
    // time, and the tool would be rebuilt at every build.
    const auto old = fs::file_time_type::clock::now() - std::chrono::hours(24);
    fs::last_write_time(header, old);
    revisionOf(dir.path());
    EXPECT_EQ(fs::last_write_time(header), old);

    fs::create_directories(repository);
    git({"init", "-q"});
    std::ofstream(repository / "file.txt") << "one\n";
    git({"add", "file.txt"});
    git({"commit", "-q", "-m", "one"});
    const std::string first = git({"rev-parse", "--short=12", "HEAD"});
    ASSERT_EQ(first.size(), 12u);
    EXPECT_EQ(revisionOf(repository), first);

    std::ofstream(repository / "file.txt") << "two\n";
    EXPECT_EQ(revisionOf(repository), first + "-dirty");

    git({"commit", "-q", "-a", "-m", "two"});
    const std::string second = git({"rev-parse", "--short=12", "HEAD"});
    EXPECT_NE(second, first);
    EXPECT_EQ(revisionOf(repository), second);

    // A directory inside a checkout is not the checkout.
    fs::create_directories(repository / "inner");
    EXPECT_EQ(revisionOf(repository / "inner"), "unknown");
}

}  // namespace
