#include "algs/PipelineHarness.h"

namespace VeltoTouch::Test {

PipelineHarness::PipelineHarness(std::uint32_t startTimeMs) : _timeMs(startTimeMs) {}

void PipelineHarness::press(const Contact& contact, int frameCount)
{
    InputReport::Image image;
    for (const auto& [letter, reading] : contact) image.readings.at(static_cast<std::size_t>(letter - 'A')) = reading;
    for (int i = 0; i < frameCount; ++i) {
        image.frameNumber = _frameNumber++;
        image.timeMs = _timeMs;
        _timeMs += 10;
        const std::vector<std::uint8_t> report = image.toReport();
        pipeline.setTime(++_ticks);
        pipeline.handleInputReport(report.data(), report.size());
    }
}

}  // namespace VeltoTouch::Test
