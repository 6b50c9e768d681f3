// Any bytes into the recording container reader: the outcome must be a
// recording or one of the documented errors, never a crash, leak or hang.
#include "FuzzInput.h"
#include "recording/PipelineRecording.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    const std::string_view text(reinterpret_cast<const char*>(data), size);
    std::optional<VeltoTouch::PipelineRecording> recording;
    try {
        recording.emplace(text);
    } catch (const std::invalid_argument&) {
        return 0;
    } catch (const std::runtime_error&) {
        return 0;
    }
    // What was read must write and read back without any error (outside the
    // handlers above, so that an error here is a finding), and from then on
    // writing and reading change nothing.
    const std::string written = recording->json();
    VeltoTouch::PipelineRecording again{std::string_view(written)};
    VELTO_FUZZ_CHECK(again.frames().size() == recording->frames().size());
    VELTO_FUZZ_CHECK(again.json() == written);
    return 0;
}
