// Any bytes into the hid-recorder reader: the outcome must be frames or its
// documented fault (HidRecorderReader::Fault), never a crash, leak or hang,
// and every way of reading the text must agree: read whole, fed in pieces,
// and streamed from a file by ContainerStream, which tells the format by its
// first character. What was read must write and read back unchanged.
//
// The first byte chooses the device (0: the surface's, N: device N-1), the
// second the size of the pieces (0: one piece); the text is the rest.
#include "FuzzInput.h"
#include "recording/ContainerStream.h"
#include "recording/HidRecorderReader.h"
#include "recording/HidRecorderWriter.h"

#include <sys/mman.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <optional>
#include <sstream>
#include <string>
#include <string_view>
#include <variant>

namespace {

using VeltoTouch::HidRecorderReader;
using VeltoTouch::PipelineRecording;
using Frames = PipelineRecording::FrameList;

// The frames read, or the fault's line and reason.
using Outcome = std::variant<Frames, std::pair<std::size_t, std::string>>;

template <typename Read>
Outcome outcomeOf(Read read)
{
    Frames frames;
    try {
        read([&](PipelineRecording::Frame&& frame) { frames.push_back(std::move(frame)); });
    } catch (const HidRecorderReader::Fault& fault) {
        return std::pair{fault.line(), fault.reason()};
    }
    return frames;
}

bool same(const Outcome& a, const Outcome& b)
{
    if (a.index() != b.index()) return false;
    if (const auto* fault = std::get_if<1>(&a)) return *fault == std::get<1>(b);
    const Frames& first = std::get<0>(a);
    const Frames& second = std::get<0>(b);
    if (first.size() != second.size()) return false;
    for (auto x = first.begin(), y = second.begin(); x != first.end(); ++x, ++y) {
        if (x->type != y->type || x->timestampNs != y->timestampNs || x->report != y->report) return false;
    }
    return true;
}

Outcome streamed(std::string_view text, std::optional<std::uint32_t> device)
{
    const int fd = ::memfd_create("capture", MFD_CLOEXEC);
    VELTO_FUZZ_CHECK(fd >= 0);
    VELTO_FUZZ_CHECK(::write(fd, text.data(), text.size()) == static_cast<ssize_t>(text.size()));
    ::lseek(fd, 0, SEEK_SET);
    Outcome outcome = outcomeOf([&](const auto& onFrame) { VeltoTouch::ContainerStream::read(fd, onFrame, {}, device); });
    ::close(fd);
    return outcome;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    VeltoFuzz::FuzzInput input(data, size);
    const std::uint8_t deviceByte = input.byte();
    const std::size_t piece = input.byte();
    const std::string text = input.text(input.remaining());
    const std::optional<std::uint32_t> device =
        deviceByte == 0 ? std::nullopt : std::optional<std::uint32_t>(deviceByte - 1u);

    const Outcome whole = outcomeOf([&](const auto& onFrame) { HidRecorderReader::read(text, onFrame, device); });
    const Outcome pieces = outcomeOf([&](const auto& onFrame) {
        HidRecorderReader reader(onFrame, device);
        const std::size_t step = piece == 0 ? text.size() + 1 : piece;
        for (std::size_t at = 0; at < text.size(); at += step) reader.feed(std::string_view(text).substr(at, step));
        reader.finish();
    });
    VELTO_FUZZ_CHECK(same(whole, pieces));
    // The stream tells the format itself; a byte order mark it sees only in
    // a text of five bytes or more, and a text that is not this format is
    // the other target's.
    const bool told = HidRecorderReader::opens(text) && !(text.starts_with("\xEF\xBB\xBF") && text.size() < 5);
    if (told) VELTO_FUZZ_CHECK(same(streamed(text, device), whole));

    const Frames* frames = std::get_if<0>(&whole);
    if (!frames) return 0;
    // Written as the surface's capture from time 0, it reads back the same,
    // and writing that again gives the same text.
    VeltoTouch::HidRecorderWriter::Device surface;
    surface.reportDescriptor = {0x75, 0x08, 0x85, 0x01, 0x95, 0x48, 0x81, 0x02, 0x85, 0x02, 0x95, 0x09, 0x81, 0x02};
    const auto write = [&](const Frames& each) {
        std::ostringstream out;
        VeltoTouch::HidRecorderWriter writer(out, surface, 0);
        for (const auto& frame : each) VELTO_FUZZ_CHECK(writer.write(frame));
        return std::move(out).str();
    };
    const std::string written = write(*frames);
    const Outcome again = outcomeOf([&](const auto& onFrame) { HidRecorderReader::read(written, onFrame); });
    VELTO_FUZZ_CHECK(same(again, whole));
    VELTO_FUZZ_CHECK(write(std::get<0>(again)) == written);
    return 0;
}
