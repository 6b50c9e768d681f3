#include "OutputFile.h"
#include "SynthCommand.h"
#include "ToolError.h"
#include "ToolProcessSupport.h"
#include "ToolTestSupport.h"

#include <gtest/gtest.h>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <set>
#include <string>
#include <thread>
#include <vector>

using namespace VeltoTool;
using namespace VeltoTool::Testing;

namespace {

// Every name under the directory: a temporary file left behind shows here.
std::set<std::string> namesIn(const fs::path& dir)
{
    std::set<std::string> names;
    for (const auto& entry : fs::recursive_directory_iterator(dir)) {
        names.insert(entry.path().lexically_relative(dir).string());
    }
    return names;
}

class Umask {
public:
    explicit Umask(mode_t mask) : _previous(::umask(mask)) {}
    ~Umask() { ::umask(_previous); }

private:
    mode_t _previous;
};

// Each command's output named as its input, each way once: by the same path,
// through a symbolic link and as a second hard link.
TEST(OutputFile, AnOutputThatIsAnInputIsRefusedAndTheInputKept)
{
    const std::string taps = readFile(kExamples + "/taps.json");
    struct Case {
        std::string input;
        std::string output;  // "input", or a link to it made here
        std::vector<std::string> arguments;  // IN and OUT stand for the two paths
        // What the refusal calls the input and the output.
        std::string inputIs, outputIs;
    };
    const Case cases[] = {
        {taps, "input", {"report", "IN", "-o", "OUT"}, "input", "output"},
        {taps, "symlink", {"host", "--device", "sim:IN", "--speed", "0", "--save-recording", "OUT"}, "input", "output"},
        {"tap top", "hardlink", {"synth", "@IN", "-o", "OUT"}, "input", "output"},
        {taps, "symlink", {"synth", "tap top", "-o", "IN", "--truth", "OUT"}, "recording", "truth"},
    };
    for (const Case& c : cases) {
        TempDir dir;
        const fs::path input = dir.file("input", c.input);
        const fs::path output = dir.path() / c.output;
        if (c.output == "symlink") fs::create_symlink("input", output);
        if (c.output == "hardlink") fs::create_hard_link(input, output);
        SCOPED_TRACE(c.arguments[0] + " -> " + c.output);
        std::vector<std::string> arguments = c.arguments;
        for (std::string& argument : arguments) {
            if (const auto at = argument.find("IN"); at != std::string::npos) argument.replace(at, 2, input.string());
            if (argument == "OUT") argument = output.string();
        }
        const std::set<std::string> names = namesIn(dir.path());
        const ToolRun run = runTool(arguments);
        EXPECT_EQ(run.status, 1);
        EXPECT_EQ(run.err, "veltotouch: " + output.string() + ": is the same file as the " + c.inputIs + " " +
                               input.string() + "; write the " + c.outputIs + " elsewhere\n");
        EXPECT_EQ(run.out, "");
        EXPECT_TRUE(readFile(input) == c.input);
        EXPECT_EQ(namesIn(dir.path()), names);
    }
}

// A long synthesis is stopped as soon as its temporary file is there.
TEST(OutputFile, ASignalThatEndsTheToolLeavesThePreviousOutputAndNoTemporaryFile)
{
    TempDir dir;
    const std::string output = dir.file("output", "previous output\n").string();
    const std::set<std::string> names = namesIn(dir.path());
    for (const int signal : {SIGINT, SIGTERM}) {
        ToolProcess tool({"synth", "hold top 3600s", "--frame-period", "1", "-o", output});
        ASSERT_TRUE(tool.started());
        const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(60);
        while (namesIn(dir.path()) == names && std::chrono::steady_clock::now() < deadline) {
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        }
        ASSERT_NE(namesIn(dir.path()), names) << "no temporary file appeared";
        tool.signal(signal);
        const ToolProcess::Result result = tool.finish(ToolProcess::Seconds(60));
        EXPECT_EQ(result.signal, signal) << result.err;
        EXPECT_EQ(readFile(output), "previous output\n");
        EXPECT_EQ(namesIn(dir.path()), names);
    }
}

// A link stays a link and its target is replaced; an existing file keeps its
// mode, a new one gets 0666 less the umask.
TEST(OutputFile, AnOutputThroughALinkReplacesItsTargetWithTheModeItShouldHave)
{
    const Umask umask(027);
    const std::string recording = SynthCommand::containerFor("tap top", 10, 1);
    struct Case {
        const char* output;
        const char* linkTo;  // nullptr: no link
        bool targetExists;
        mode_t mode;
    };
    const Case cases[] = {
        {"new.json", nullptr, false, 0640},
        {"old.json", nullptr, true, 0604},
        {"link.json", "sub/old.json", true, 0604},
        {"dangling.json", "new.json", false, 0640},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.output);
        TempDir dir;
        const fs::path output = dir.path() / c.output;
        const fs::path target = c.linkTo ? dir.path() / c.linkTo : output;
        fs::create_directories(target.parent_path());
        if (c.targetExists) {
            dir.file(target.lexically_relative(dir.path()).string(), "previous output\n");
            fs::permissions(target, fs::perms(0604));
        }
        if (c.linkTo) fs::create_symlink(c.linkTo, output);
        std::set<std::string> names = namesIn(dir.path());
        const ToolRun run = runTool({"synth", "tap top", "-o", output.string()});
        ASSERT_EQ(run.status, 0) << run.err;
        EXPECT_EQ(fs::is_symlink(output), c.linkTo != nullptr);
        EXPECT_TRUE(readFile(target) == recording);
        EXPECT_EQ(fs::status(target).permissions(), fs::perms(c.mode));
        names.insert(target.lexically_relative(dir.path()).string());
        EXPECT_EQ(namesIn(dir.path()), names);
    }
}

// The descriptor is how a daemon writes the file; commit() puts it in place.
TEST(OutputFile, WhatTheDescriptorWritesIsInPlaceOnlyAfterCommit)
{
    for (const bool commit : {false, true}) {
        TempDir dir;
        const fs::path path = dir.file("recording.json", "previous output\n");
        {
            OutputFile out(path.string());
            ASSERT_EQ(::write(out.descriptor(), "written", 7), 7);
            EXPECT_EQ(readFile(path), "previous output\n");
            if (commit) out.commit();
        }
        EXPECT_EQ(readFile(path), commit ? "written" : "previous output\n");
        EXPECT_EQ(namesIn(dir.path()), std::set<std::string>{"recording.json"});
    }
}

// There is nothing to replace in a pipe or a device: it is written to.
TEST(OutputFile, AnOutputThatIsNoRegularFileIsWrittenDirectly)
{
    TempDir dir;
    const fs::path fifo = dir.path() / "fifo";
    ASSERT_EQ(::mkfifo(fifo.c_str(), 0600), 0);
    const int reader = ::open(fifo.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
    ASSERT_GE(reader, 0);
    {
        OutputFile out(fifo.string());
        out.stream() << "through the pipe";
        out.commit();
    }
    char text[64] = {};
    EXPECT_EQ(::read(reader, text, sizeof text), 16);
    EXPECT_STREQ(text, "through the pipe");
    ::close(reader);
    EXPECT_TRUE(fs::is_fifo(fifo));
    EXPECT_EQ(namesIn(dir.path()), std::set<std::string>{"fifo"});
}

// A directory and a missing directory: SynthCommandTest.
TEST(OutputFile, AnOutputInAFileIsRefusedNamingBoth)
{
    TempDir dir;
    const std::string file = dir.file("file", "text").string();
    try {
        OutputFile out(file + "/out.json");
        ADD_FAILURE() << "taken";
    } catch (const ToolError& error) {
        EXPECT_EQ(error.what(), file + "/out.json: cannot create a file in " + file + ": Not a directory");
    }
    EXPECT_EQ(namesIn(dir.path()), std::set<std::string>{"file"});
}

}  // namespace
