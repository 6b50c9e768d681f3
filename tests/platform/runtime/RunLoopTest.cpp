#include "platform/runtime/RunLoop.h"
#include "platform/runtime/Semaphore.h"

#include <gtest/gtest.h>

#include <fcntl.h>
#include <unistd.h>

#include <chrono>
#include <string>
#include <thread>
#include <vector>

using namespace VeltoHost;
using namespace std::chrono_literals;

namespace {

// Every test drives a loop of its own thread, so that no stop request or
// job leaks from one test into the next through the main thread's loop.
template <typename Body>
void onFreshThread(Body body)
{
    std::thread thread(body);
    thread.join();
}

struct Pipe {
    int readEnd = -1;
    int writeEnd = -1;
    Pipe()
    {
        int fds[2];
        EXPECT_EQ(pipe2(fds, O_NONBLOCK | O_CLOEXEC), 0);
        readEnd = fds[0];
        writeEnd = fds[1];
    }
    ~Pipe()
    {
        close(readEnd);
        close(writeEnd);
    }
    void put(char byte) const { EXPECT_EQ(write(writeEnd, &byte, 1), 1); }
    int take() const
    {
        char byte = 0;
        return read(readEnd, &byte, 1) == 1 ? byte : -1;
    }
};

}  // namespace

TEST(RunLoopTest, JobsRunInQueueOrderInTheirModeOnlyAndOnePerHandledSourceRun)
{
    onFreshThread([] {
        RunLoop::Ref loop = RunLoop::current();
        EXPECT_EQ(loop, RunLoop::current());
        std::vector<std::string> ran;
        loop->performJob("A", [&] { ran.push_back("a1"); });
        loop->performJob("B", [&] { ran.push_back("b1"); });
        loop->performJob("B", [&] { ran.push_back("b2"); });
        loop->performJob("A", [&] {
            ran.push_back("a2");
            // Queued while the mode runs: still served by the same run.
            RunLoop::current()->performJob("A", [&] { ran.push_back("a3"); });
        });

        EXPECT_EQ(RunLoop::run("A", std::nullopt, false), RunLoop::RunResult::Finished);
        EXPECT_EQ(ran, (std::vector<std::string>{"a1", "a2", "a3"}));
        // Returning after a handled source serves one job per run.
        EXPECT_EQ(RunLoop::run("B", std::nullopt, true), RunLoop::RunResult::HandledSource);
        EXPECT_EQ(ran.back(), "b1");
        EXPECT_EQ(RunLoop::run("B", std::nullopt, true), RunLoop::RunResult::HandledSource);
        EXPECT_EQ(ran.back(), "b2");
        // A mode never used, and a mode emptied, have nothing to run.
        EXPECT_EQ(RunLoop::run("never", std::nullopt, true), RunLoop::RunResult::Finished);
        EXPECT_EQ(RunLoop::run("B", std::nullopt, true), RunLoop::RunResult::Finished);
    });
}

TEST(RunLoopTest, StopFromJobOrAnotherThreadEndsTheRun)
{
    Pipe idle;  // a source that never fires keeps the mode alive
    onFreshThread([&] {
        RunLoop::Ref loop = RunLoop::current();
        RunLoop::SourceId source = loop->addFileDescriptorSource(idle.readEnd, "M", [] {});
        ASSERT_NE(source, 0u);

        // A stop job ends the run before the job queued after it.
        bool lateJobRan = false;
        loop->performJob("M", [] { RunLoop::stopCurrent(); });
        loop->performJob("M", [&] { lateJobRan = true; });
        EXPECT_EQ(RunLoop::run("M", std::nullopt, false), RunLoop::RunResult::Stopped);
        EXPECT_FALSE(lateJobRan);
        // The stop job itself counts as handled work, but the stop wins.
        loop->performJob("M", [] { RunLoop::stopCurrent(); });
        EXPECT_EQ(RunLoop::run("M", std::nullopt, true), RunLoop::RunResult::HandledSource);
        EXPECT_TRUE(lateJobRan);
        EXPECT_EQ(RunLoop::run("M", std::nullopt, true), RunLoop::RunResult::Stopped);

        // A stop from another thread wakes a sleeping run (or ends the next).
        Semaphore started;
        std::thread stopper([&] {
            started.wait();
            loop->stop();
        });
        started.signal();
        EXPECT_EQ(RunLoop::run("M", std::nullopt, false), RunLoop::RunResult::Stopped);
        stopper.join();

        loop->removeSource(source);
        EXPECT_EQ(RunLoop::run("M", std::nullopt, false), RunLoop::RunResult::Finished);
    });
}

TEST(RunLoopTest, DescriptorSourcesFireInTheirModeOnly)
{
    Pipe pipeM;
    Pipe pipeOther;
    onFreshThread([&] {
        RunLoop::Ref loop = RunLoop::current();
        std::vector<int> received;
        bool otherFired = false;
        loop->addFileDescriptorSource(pipeM.readEnd, "M", [&] { received.push_back(pipeM.take()); });
        loop->addFileDescriptorSource(pipeOther.readEnd, "Other", [&] { otherFired = true; });
        pipeOther.put('x');
        pipeM.put(1);
        pipeM.put(2);
        // Each run handles one readable event.
        while (received.size() < 2) {
            ASSERT_EQ(RunLoop::run("M", std::nullopt, true), RunLoop::RunResult::HandledSource);
        }
        EXPECT_EQ(received, (std::vector<int>{1, 2}));
        EXPECT_FALSE(otherFired);

        // Nothing readable in M any more: a zero time limit only polls.
        EXPECT_EQ(RunLoop::run("M", 0ns, true), RunLoop::RunResult::TimedOut);
        EXPECT_EQ(RunLoop::run("M", 1ms, false), RunLoop::RunResult::TimedOut);
        EXPECT_EQ(RunLoop::run("Other", 0ns, true), RunLoop::RunResult::HandledSource);
        EXPECT_TRUE(otherFired);
    });
}

TEST(RunLoopTest, RemovingASourceFromAnotherThreadWaitsForItsCallback)
{
    Pipe pipe;
    Semaphore callbackEntered;
    Semaphore releaseCallback;
    std::vector<int> events;  // written by the loop thread, read after join
    RunLoop::Ref loop;
    Semaphore loopReady;
    RunLoop::SourceId source = 0;

    std::thread loopThread([&] {
        loop = RunLoop::current();
        source = loop->addFileDescriptorSource(pipe.readEnd, "M", [&] {
            pipe.take();
            callbackEntered.signal();
            releaseCallback.wait();
            events.push_back(1);
        });
        loopReady.signal();
        EXPECT_EQ(RunLoop::run("M", std::nullopt, true), RunLoop::RunResult::HandledSource);
        // The source is gone: the mode is empty.
        EXPECT_EQ(RunLoop::run("M", std::nullopt, true), RunLoop::RunResult::Finished);
    });
    loopReady.wait();
    pipe.put('r');
    callbackEntered.wait();
    std::size_t eventsWhenRemoved = 0;
    Semaphore removing;
    std::thread remover([&] {
        removing.signal();
        loop->removeSource(source);
        // The callback must have finished before removeSource returned.
        eventsWhenRemoved = events.size();
    });
    // The remover is (all but certainly) blocked until the callback ends;
    // let the callback end. Should it come late, the removal wakes the loop.
    removing.wait();
    releaseCallback.signal();
    remover.join();
    loopThread.join();
    EXPECT_EQ(eventsWhenRemoved, 1u);
    EXPECT_EQ(events, std::vector<int>{1});
}
