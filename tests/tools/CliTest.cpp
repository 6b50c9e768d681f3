#include "ToolTestSupport.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <regex>
#include <string>
#include <vector>

using namespace VeltoTool::Testing;

namespace {

const std::string kTaps = std::string(VELTO_EXAMPLES_DIR) + "/taps.json";

// Output of a shell command, without its last line break.
std::string commandOutput(const std::string& command)
{
    std::string text;
    if (FILE* pipe = ::popen(command.c_str(), "r")) {
        char buffer[256];
        while (std::fgets(buffer, sizeof buffer, pipe)) text += buffer;
        ::pclose(pipe);
    }
    if (!text.empty() && text.back() == '\n') text.pop_back();
    return text;
}

TEST(Cli, UsageErrorsExitWithTwoAndOneLineThatNamesTheProblem)
{
    struct Case {
        std::vector<std::string> arguments;
        std::string message;  // expected within the line
    };
    const Case cases[] = {
        {{}, "A subcommand is required"},
        {{"frobnicate"}, "no command \"frobnicate\" (replay, synth, eval, dump, host, daemon, ctl, report, help)"},
        {{"replay"}, "FILE is required"},
        {{"synth", "tap top"}, "--output is required"},
        {{"replay", kTaps, "--speed", "nan"}, "--speed: expected a finite number, got nan"},
        {{"replay", kTaps, "--speed", "inf"}, "--speed: expected a finite number, got inf"},
        {{"replay", kTaps, "--speed", "-1"}, "--speed: must be 0 or at least 0.001, got -1"},
        {{"replay", kTaps, "--speed", "1e-9"}, "--speed: must be 0 or at least 0.001, got 1e-9"},
        {{"replay", kTaps, "--speed", "fast"}, "--speed: expected a number, got \"fast\""},
        {{"replay", kTaps, "--max-gap", "-0.5"}, "--max-gap: must be at least 0, got -0.5"},
        {{"replay", kTaps, "--max-gap", "nan"}, "--max-gap: expected a finite number, got nan"},
        {{"replay", kTaps, "--set", "NoEquals"}, "--set: expected KEY=VALUE, got \"NoEquals\""},
        {{"replay", kTaps, "--set", "=5"}, "--set: expected KEY=VALUE, got \"=5\""},
        {{"replay", kTaps, "--set", "Algs.HoldTimeoutMilliseconds=[1,"}, "not valid JSON"},
        {{"synth", "tap top", "-o", "/dev/null", "--frame-period", "0"}, "--frame-period: must be at least 1, got 0"},
        {{"synth", "tap top", "-o", "/dev/null", "--frame-period", "-5"}, "--frame-period: must be at least 1, got -5"},
        {{"dump", kTaps, "--frames", "a:b"}, "--frames: invalid frame range \"a:b\""},
        {{"dump", kTaps, "--frames", "9:3"}, "--frames: invalid frame range \"9:3\" (first frame after last)"},
        {{"host", "--device", "sim:" + kTaps, "--set", "Pipeline.NoEquals"}, "--set: expected KEY=VALUE"},
        {{"host", "--device", "sim:" + kTaps, "--speed", "nan"}, "--speed: expected a finite number, got nan"},
        {{"host", "--device", "sim:" + kTaps, "--speed", "1e-9"}, "--speed: must be 0 or at least 0.001"},
        {{"daemon", "--device", "sim:", "--no-udev"}, "sim: needs a recording after the colon"},
        {{"daemon", "--config", "/no/such.toml"}, "--config: File does not exist: /no/such.toml"},
        {{"ctl", "set", "NoEquals"}, "expected KEY=VALUE, got \"NoEquals\""},
        {{"ctl", "get", "-d", "first", "Pipeline.Algs.EventStats"}, "-d"},
        {{"help", "frobnicate"}, "help: no command \"frobnicate\""},
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
        ASSERT_FALSE(run.err.empty());
        EXPECT_EQ(run.err.find('\n'), run.err.size() - 1) << "one line only: " << run.err;
    }
}

TEST(Cli, UsageErrorsPointToTheHelpOfTheCommandBeingParsed)
{
    EXPECT_NE(runTool({"replay", kTaps, "--speed", "nan"}).err.find("(see 'veltotouch help replay')"),
              std::string::npos);
    EXPECT_NE(runTool({}).err.find("(see 'veltotouch help')"), std::string::npos);
}

TEST(Cli, HelpDescribesTheToolOrOneCommand)
{
    const ToolRun all = runTool({"help"});
    EXPECT_EQ(all.status, 0) << all.err;
    for (const char* command : {"replay", "synth", "dump", "host"}) {
        EXPECT_NE(all.out.find(std::string("\n  ") + command + " "), std::string::npos) << command;
    }
    EXPECT_EQ(all.out, runTool({"--help"}).out);

    struct Case {
        const char* command;
        const char* option;
    };
    for (const Case c : {Case{"replay", "--max-gap"}, Case{"synth", "--frame-period"}, Case{"dump", "--frames"},
                         Case{"host", "--device"}}) {
        const ToolRun one = runTool({"help", c.command});
        EXPECT_EQ(one.status, 0) << one.err;
        EXPECT_NE(one.out.find(std::string("Usage: veltotouch ") + c.command), std::string::npos) << one.out;
        EXPECT_NE(one.out.find(c.option), std::string::npos) << c.command;
        EXPECT_EQ(one.out, runTool({c.command, "--help"}).out);
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
class RevisionScript : public ::testing::Test {
protected:
    void SetUp() override
    {
        if (std::system("git --version > /dev/null 2>&1") != 0) GTEST_SKIP() << "git is not installed";
    }

    std::string git(const std::string& arguments)
    {
        return commandOutput("git -C '" + _repository.string() + "' -c user.name=test -c user.email=test@example.com " +
                             arguments + " 2>/dev/null");
    }

    // The revision the script writes for `source`.
    std::string revisionOf(const fs::path& source)
    {
        const std::string command = std::string("'") + VELTO_CMAKE_COMMAND + "' -DSOURCE_DIR='" + source.string() +
                                    "' -DOUTPUT='" + _header.string() + "' -P '" + VELTO_REVISION_SCRIPT + "'";
        EXPECT_EQ(std::system(command.c_str()), 0) << command;
        std::smatch match;
        const std::string text = readFile(_header);
        if (!std::regex_search(text, match, std::regex("#define VELTO_GIT_REVISION \"([^\"]*)\""))) return "(none)";
        return match[1];
    }

    TempDir _dir;
    fs::path _repository = _dir.path() / "repository";
    fs::path _header = _dir.path() / "ToolRevision.h";
};

TEST_F(RevisionScript, FollowsEachCommitMarksChangesAndSaysUnknownOutsideARepository)
{
    EXPECT_EQ(revisionOf(_dir.path()), "unknown") << "not a repository";

    fs::create_directories(_repository);
    git("init -q");
    std::ofstream(_repository / "file.txt") << "one\n";
    git("add file.txt");
    git("commit -q -m one");
    const std::string first = git("rev-parse --short=12 HEAD");
    ASSERT_EQ(first.size(), 12u);
    EXPECT_EQ(revisionOf(_repository), first);

    std::ofstream(_repository / "file.txt") << "two\n";
    EXPECT_EQ(revisionOf(_repository), first + "-dirty");

    git("commit -q -a -m two");
    const std::string second = git("rev-parse --short=12 HEAD");
    EXPECT_NE(second, first);
    EXPECT_EQ(revisionOf(_repository), second);

    // A directory inside a checkout is not the checkout.
    fs::create_directories(_repository / "inner");
    EXPECT_EQ(revisionOf(_repository / "inner"), "unknown");
}

TEST_F(RevisionScript, LeavesTheHeaderAloneWhenTheRevisionIsUnchanged)
{
    revisionOf(_dir.path());
    // Whatever rewrote the header would give it a new modification time, and
    // the tool would be rebuilt at every build.
    const auto old = fs::file_time_type::clock::now() - std::chrono::hours(24);
    fs::last_write_time(_header, old);
    revisionOf(_dir.path());
    EXPECT_EQ(fs::last_write_time(_header), old);
}

}  // namespace
