// Any bytes into the recording container reader: the outcome must be a
// recording or one of the documented errors, never a crash, leak or hang.
#include "recording/PipelineRecording.h"

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <stdexcept>
#include <string_view>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    const std::string_view text(reinterpret_cast<const char*>(data), size);
    try {
        VeltoTouch::PipelineRecording recording(text);
        // What was read must write and read back without error.
        const std::string written = recording.json();
        VeltoTouch::PipelineRecording again{std::string_view(written)};
        if (again.frames().size() != recording.frames().size()) std::abort();
    } catch (const std::invalid_argument&) {
    } catch (const std::runtime_error&) {
    }
    return 0;
}
