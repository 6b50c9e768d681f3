// Any bytes into both recording container readers, the whole-text one and
// the one that streams: the outcome must be a recording or one of the
// documented errors, never a crash, leak or hang, and the two must agree:
// the same frames where the whole text reads, a failure where it does not.
#include "FuzzInput.h"
#include "recording/ContainerStream.h"
#include "recording/PipelineRecording.h"

#include <nlohmann/json.hpp>

#include <sys/mman.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <optional>
#include <set>
#include <stdexcept>
#include <string>
#include <string_view>

namespace {

using VeltoTouch::PipelineRecording;

// Whether the container's own object names a key twice: the one shape where
// the streamed reader may differ (it cannot take back frames it handed over).
struct TopLevelKeys : nlohmann::json_sax<nlohmann::json> {
    int depth = 0;
    std::set<std::string> seen;
    bool repeated = false;

    bool null() override { return true; }
    bool boolean(bool) override { return true; }
    bool number_integer(number_integer_t) override { return true; }
    bool number_unsigned(number_unsigned_t) override { return true; }
    bool number_float(number_float_t, const string_t&) override { return true; }
    bool string(string_t&) override { return true; }
    bool binary(binary_t&) override { return true; }
    bool start_object(std::size_t) override { return ++depth, true; }
    bool key(string_t& name) override
    {
        if (depth == 1 && !seen.insert(name).second) repeated = true;
        return true;
    }
    bool end_object() override { return --depth, true; }
    bool start_array(std::size_t) override { return ++depth, true; }
    bool end_array() override { return --depth, true; }
    bool parse_error(std::size_t, const std::string&, const nlohmann::detail::exception&) override { return false; }
};

bool repeatsATopLevelKey(std::string_view text)
{
    TopLevelKeys keys;
    nlohmann::json::sax_parse(text, &keys);
    return keys.repeated;
}

// The bytes streamed from a file in memory; empty when the reader refused them.
std::optional<PipelineRecording> streamed(std::string_view text)
{
    const int fd = ::memfd_create("container", MFD_CLOEXEC);
    VELTO_FUZZ_CHECK(fd >= 0);
    VELTO_FUZZ_CHECK(::write(fd, text.data(), text.size()) == static_cast<ssize_t>(text.size()));
    ::lseek(fd, 0, SEEK_SET);
    PipelineRecording recording;
    try {
        VeltoTouch::ContainerStream::read(fd, [&](PipelineRecording::Frame&& frame) {
            recording.appendFrame(std::move(frame));
        });
    } catch (const std::invalid_argument&) {
        ::close(fd);
        return std::nullopt;
    } catch (const std::runtime_error&) {
        ::close(fd);
        return std::nullopt;
    }
    ::close(fd);
    return recording;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    const std::string_view text(reinterpret_cast<const char*>(data), size);
    std::optional<PipelineRecording> recording;
    try {
        recording.emplace(text);
    } catch (const std::invalid_argument&) {
    } catch (const std::runtime_error&) {
    }
    std::optional<PipelineRecording> asStreamed = streamed(text);
    const bool comparable = !repeatsATopLevelKey(text);
    if (!recording) {
        VELTO_FUZZ_CHECK(!comparable || !asStreamed);
        return 0;
    }
    // What was read must write and read back without any error (outside the
    // handlers above, so that an error here is a finding), and from then on
    // writing and reading change nothing.
    const std::string written = recording->json();
    PipelineRecording again{std::string_view(written)};
    VELTO_FUZZ_CHECK(again.frames().size() == recording->frames().size());
    VELTO_FUZZ_CHECK(again.json() == written);
    if (comparable) {
        VELTO_FUZZ_CHECK(asStreamed);
        VELTO_FUZZ_CHECK(asStreamed->json() == written);
    }
    return 0;
}
