#include "ConvertCommand.h"

#include "CommandLine.h"
#include "EmulateCommand.h"
#include "OutputFile.h"
#include "ToolError.h"
#include "ToolFiles.h"
#include "VirtualSurface.h"
#include "recording/ContainerWriter.h"
#include "recording/HidRecorderReader.h"
#include "recording/HidRecorderWriter.h"

#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <memory>
#include <stdexcept>
#include <vector>

namespace VeltoTool {

using VeltoTouch::HidRecorderWriter;
using VeltoTouch::PipelineRecording;

namespace {

constexpr std::size_t kLookAheadBytes = 1 << 16;

// The input's format, from its first character as the readers tell it
// (after a byte order mark and blank space), read without moving the file's
// position; a file with nothing else in it reads as a container, whose
// reader says what is wrong with it.
ConvertCommand::Format formatOf(std::FILE* file, const std::string& path)
{
    const int fd = ::fileno(file);
    std::vector<char> start(kLookAheadBytes);
    for (off_t offset = 0;;) {
        const ssize_t count = ::pread(fd, start.data(), start.size(), offset);
        if (count < 0 && errno == EINTR) continue;
        if (count < 0) {
            if (errno == ESPIPE) {
                throw ToolError(path + ": a pipe cannot be looked at before it is read; convert takes a file");
            }
            throw ToolError(path + ": " + std::strerror(errno));
        }
        if (count == 0) return ConvertCommand::Format::Container;
        std::string_view piece(start.data(), static_cast<std::size_t>(count));
        if (offset == 0 && piece.starts_with("\xEF\xBB\xBF")) piece.remove_prefix(3);
        const std::size_t first = piece.find_first_not_of(" \t\r\n");
        if (first != std::string_view::npos) {
            return VeltoTouch::HidRecorderReader::opensWith(piece[first]) ? ConvertCommand::Format::HidRecorder
                                                                          : ConvertCommand::Format::Container;
        }
        offset += count;
    }
}

std::string plural(std::uint64_t count, const char* one, const char* many)
{
    return std::to_string(count) + " " + (count == 1 ? one : many);
}

}  // namespace

ConvertCommand::Format ConvertCommand::parseFormat(const std::string& text)
{
    if (text == "container") return Format::Container;
    if (text == "hid") return Format::HidRecorder;
    throw ToolError("unknown format \"" + text + "\" (container or hid)");
}

void ConvertCommand::run(const Options& options, std::ostream& err)
{
    const ToolFiles::File input = ToolFiles::openRecording(options.input);
    const Format from = formatOf(input.get(), options.input);
    const Format to = options.format.value_or(from == Format::Container ? Format::HidRecorder : Format::Container);
    OutputFile out(options.output, {options.input});

    if (to == Format::Container) {
        VeltoTouch::ContainerWriter writer(out.stream());
        ToolFiles::streamRecording(
            input.get(), options.input,
            [&](PipelineRecording::Frame&& frame) {
                writer.write(frame);
                out.checkWritten();
            },
            {}, options.hidDevice);
        writer.finish();
        out.commit();
        return;
    }

    const HidRecorderWriter::Device device =
        VirtualSurface::hidRecorderDevice(EmulateCommand::kDefaultVendor, EmulateCommand::kDefaultProduct);
    // Made at the first frame: a container's time line starts there (as
    // playback counts it), a hid-recorder text's at 0 already.
    std::optional<HidRecorderWriter> writer;
    const auto start = [&](std::uint64_t originNs) { writer.emplace(out.stream(), device, originNs); };
    std::uint64_t leftOut = 0;
    ToolFiles::streamRecording(
        input.get(), options.input,
        [&](PipelineRecording::Frame&& frame) {
            if (!writer) start(from == Format::HidRecorder ? 0 : frame.timestampNs);
            try {
                if (!writer->write(frame)) ++leftOut;
            } catch (const std::invalid_argument& error) {
                throw ToolError(options.input + ": " + error.what());
            }
            out.checkWritten();
        },
        {}, options.hidDevice);
    if (!writer) start(0);
    out.commit();
    if (leftOut > 0) {
        err << "veltotouch: note: " << options.input << ": " << plural(leftOut, "state frame", "state frames")
            << " left out (a hid-recorder file holds input reports only)\n";
    }
}

CLI::Option* ConvertCommand::addFormat(CLI::App& command, std::optional<Format>& format, const std::string& description)
{
    return CommandLine::addParsed(
        command, "--format", "FORMAT:container|hid",
        [&format](const std::string& text) { format = parseFormat(text); }, description);
}

void ConvertCommand::addTo(CLI::App& app, int&, std::ostream&, std::ostream& err)
{
    auto options = std::make_shared<Options>();
    CLI::App* command = app.add_subcommand(
        "convert", "Write a recording container as a hid-recorder text, or such a text as a container");
    command->add_option("IN", options->input, "Recording (container, or hid-recorder text)")->required();
    command->add_option("-o,--output", options->output, "File to write")->required();
    addFormat(*command, options->format, "container or hid (default: the other format than IN's)");
    CommandLine::addHidDevice(*command, options->hidDevice);
    command->callback([options, &err] { run(*options, err); });
}

}  // namespace VeltoTool
