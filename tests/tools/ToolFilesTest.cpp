#include "ToolFiles.h"
#include "ToolTestSupport.h"
#include "recording/ContainerWriter.h"

#include <gtest/gtest.h>

#include <sstream>
#include <string>

using namespace VeltoTool;
using namespace VeltoTool::Testing;

namespace {

// The examples were written from whole recordings before containers were
// streamed; both ways of writing must still give their bytes.
TEST(ToolFiles, ExamplesReadBackAndWriteToTheirOwnBytesBothWays)
{
    int examples = 0;
    for (const auto& entry : fs::directory_iterator(VELTO_EXAMPLES_DIR)) {
        if (entry.path().extension() != ".json") continue;
        SCOPED_TRACE(entry.path().string());
        const std::string text = readFile(entry.path());
        VeltoTouch::PipelineRecording recording = ToolFiles::readRecording(entry.path().string());

        std::ostringstream streamed;
        VeltoTouch::ContainerWriter writer(streamed);
        for (const auto& frame : recording.frames()) writer.write(frame);
        writer.finish();
        EXPECT_TRUE(streamed.str() == text) << "streamed";
        EXPECT_TRUE(recording.json() == text) << "written whole";
        ++examples;
    }
    EXPECT_GE(examples, 5);
}

}  // namespace
