#include "platform/plugin/InputReportThread.h"
#include "platform/runtime/Thread.h"

#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <optional>
#include <thread>

namespace VeltoHost {
namespace {

TEST(InputReportThread, StartsAfterItsBeginAndStopsOnlyOnceItsRunStepLetGo)
{
    InputReportThread thread;
    std::atomic<bool> begun{false};
    std::atomic<bool> ran{false};
    auto held = std::make_shared<int>(1);
    std::weak_ptr<int> watched = held;
    ASSERT_TRUE(thread.start("test.reports", {[&] { begun = true; },
                                              [&, held = std::move(held)] {
                                                  // No source: the loop returns at once until stopped.
                                                  while (RunLoop::run("test", std::nullopt, true) !=
                                                         RunLoop::RunResult::Stopped) {
                                                      std::this_thread::yield();
                                                  }
                                                  ran = true;
                                              },
                                              nullptr}));
    EXPECT_TRUE(begun) << "start returns after the begin step";
    EXPECT_TRUE(thread.running());
    EXPECT_FALSE(watched.expired()) << "the run step holds what it captured";

    thread.requestStop("test");
    EXPECT_FALSE(thread.running());
    thread.waitUntilStopped();
    EXPECT_TRUE(ran);
    EXPECT_TRUE(watched.expired()) << "the run step's captures are gone once the thread said it is done";
    thread.waitUntilStopped();  // a second wait returns at once
}

TEST(InputReportThread, AFailedStartLeavesNothingToStopOrWaitFor)
{
    InputReportThread thread;
    bool stepped = false;
    Thread::failNextStarts(1);
    EXPECT_FALSE(thread.start("test.reports", {[&] { stepped = true; }, [&] { stepped = true; }, nullptr}));
    EXPECT_FALSE(thread.running());
    thread.requestStop("test");
    thread.waitUntilStopped();
    EXPECT_FALSE(stepped);
}

}  // namespace
}  // namespace VeltoHost
