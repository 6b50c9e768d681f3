// The recorder and playback tests once more, with a clock whose tick is
// 125/3 ns instead of the nanosecond: a tick count used as nanoseconds (or
// the other way round) anywhere in recording or playback then shows.

#include "platform/runtime/MonotonicClock.h"

#include <gtest/gtest.h>

#include <cstdio>

int main(int argc, char** argv)
{
    // Before anything can read the timebase: the conversions keep the first
    // one they see for the life of the process.
    if (!VeltoHost::MonotonicClock::setTimebase({125, 3})) {
        std::fprintf(stderr, "the clock refused the timebase 125/3\n");
        return 1;
    }
    testing::InitGoogleTest(&argc, argv);
    return RUN_ALL_TESTS();
}
