#include "platform/log/Trace.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <stdexcept>
#include <string>

using VeltoHost::Trace;
using VeltoHost::TracePoint;

// Trace points sit on the input-report thread, which must never see an
// exception: a failing observer is the observer's problem.
TEST(Trace, ThrowingObserverDoesNotEscape)
{
    Trace::setObserver([](const TracePoint&) { throw std::runtime_error("observer failed"); });
    EXPECT_NO_THROW(Trace::emit(1));
    Trace::setObserver({});
}

// Tracers attach to the file that holds the probe: the platform library, not
// the programs that load it. README's bpftrace line names that file.
TEST(Trace, TheProbeIsDeclaredInThePlatformLibrary)
{
    const std::string command = std::string("readelf -n ") + VELTO_PLATFORM_LIBRARY_PATH + " 2>&1";
    FILE* pipe = ::popen(command.c_str(), "r");
    ASSERT_NE(pipe, nullptr);
    std::string notes;
    char buffer[512];
    while (std::fgets(buffer, sizeof buffer, pipe)) notes += buffer;
    if (::pclose(pipe) != 0 && notes.find("not found") != std::string::npos) GTEST_SKIP() << "no readelf: " << notes;
    const auto provider = notes.find("Provider: veltotouch");
    ASSERT_NE(provider, std::string::npos) << notes;
    EXPECT_EQ(notes.find("Name: trace", provider), notes.find("Name:", provider)) << notes;
    // Five arguments: the code and four integers.
    const auto arguments = notes.find("Arguments:", provider);
    ASSERT_NE(arguments, std::string::npos);
    const std::string line = notes.substr(arguments, notes.find('\n', arguments) - arguments);
    EXPECT_EQ(std::count(line.begin(), line.end(), '@'), 5) << line;
}
