#include "ToolFiles.h"

#include "ToolError.h"
#include "recording/ContainerReadAhead.h"
#include "recording/HidRecorderReader.h"
#include "recording/JsonValue.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <sstream>
#include <stdexcept>
#include <string_view>

namespace VeltoTool {

namespace {

constexpr std::string_view kExpectedRecording = "expected a recording (JSON container)";
constexpr std::string_view kInvalidContainer = "invalid container";
constexpr std::size_t kReadChunk = 1 << 20;
// A streamed file that is not a container is read again, whole, to say what
// it is instead, unless it is larger than this.
constexpr std::uintmax_t kLargestDescribed = 64 << 20;

[[noreturn]] void failWithErrno(const std::string& path, const char* fallback)
{
    throw ToolError(path + ": " + (errno != 0 ? std::strerror(errno) : fallback));
}

bool isDirectory(const std::string& path)
{
    std::error_code error;
    return std::filesystem::is_directory(path, error);
}

bool onlyWhiteSpace(std::string_view text)
{
    return text.find_first_not_of(" \t\r\n") == std::string_view::npos;
}

// The line for a container that would not load. The container says
// "invalid container" both for text that is not JSON and for JSON whose top
// level is not an object; the user is told which, and of an empty file.
std::string describeUnreadable(const std::string& path, const std::string& text, const std::string& message)
{
    const std::string expected(kExpectedRecording);
    if (text.empty()) return path + ": empty file, " + expected;
    if (onlyWhiteSpace(text)) return path + ": empty file (only blank space), " + expected;
    if (!std::string_view(message).ends_with(kInvalidContainer)) return path + ": " + message;
    using VeltoTouch::JsonValue;
    if (!JsonValue::parse(text, JsonValue::TopLevel::AnyValue).hasValue()) return path + ": not JSON (" + message + ")";
    return path + ": JSON, but not an object at the top level, " + expected + " (" + message + ")";
}

// A fault of a hid-recorder text, where it is: PATH:LINE: what.
ToolError hidRecorderFault(const std::string& path, const VeltoTouch::HidRecorderReader::Fault& fault)
{
    const std::string place = fault.line() == 0 ? path : path + ":" + std::to_string(fault.line());
    return ToolError(place + ": " + fault.reason());
}

}  // namespace

std::string ToolFiles::read(const std::string& path)
{
    if (isDirectory(path)) throw ToolError(path + ": is a directory");
    return readText(path);
}

VeltoTouch::PipelineRecording ToolFiles::readRecording(const std::string& path, std::optional<std::uint32_t> hidDevice)
{
    if (isDirectory(path)) throw ToolError(path + ": is a directory, " + std::string(kExpectedRecording));
    return recordingFromText(path, read(path), hidDevice);
}

std::string ToolFiles::readText(const std::string& path)
{
    const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0) failWithErrno(path, "cannot open");
    std::string text;
    std::string chunk(kReadChunk, '\0');
    for (;;) {
        const ssize_t count = ::read(fd, chunk.data(), chunk.size());
        if (count == 0) break;
        if (count > 0) {
            text.append(chunk.data(), static_cast<std::size_t>(count));
        } else if (errno != EINTR) {
            const int error = errno;
            ::close(fd);
            errno = error;
            failWithErrno(path, "read failed");
        }
    }
    ::close(fd);
    return text;
}

VeltoTouch::PipelineRecording ToolFiles::recordingFromText(const std::string& path, const std::string& text,
                                                         std::optional<std::uint32_t> hidDevice)
{
    try {
        return VeltoTouch::PipelineRecording{std::string_view(text), hidDevice};
    } catch (const VeltoTouch::HidRecorderReader::Fault& fault) {
        throw hidRecorderFault(path, fault);
    } catch (const std::exception& error) {
        throw ToolError(describeUnreadable(path, text, error.what()));
    }
}

ToolFiles::File ToolFiles::openRecording(const std::string& path)
{
    if (isDirectory(path)) throw ToolError(path + ": is a directory, " + std::string(kExpectedRecording));
    errno = 0;
    File file(std::fopen(path.c_str(), "rbe"), &std::fclose);
    if (!file) failWithErrno(path, "cannot open");
    return file;
}

std::optional<VeltoTouch::ContainerStream::Format> ToolFiles::streamRecording(
    std::FILE* file, const std::string& path, const VeltoTouch::ContainerStream::FrameHandler& onFrame,
    const std::function<bool()>& stopRequested, std::optional<std::uint32_t> hidDevice)
{
    VeltoTouch::ContainerStream::Format format;
    try {
        // Read through the descriptor: stdio's buffer is never used.
        format = VeltoTouch::ContainerReadAhead::read(::fileno(file), onFrame, stopRequested, hidDevice);
    } catch (const ToolError&) {
        throw;
    } catch (const VeltoTouch::HidRecorderReader::Fault& fault) {
        throw hidRecorderFault(path, fault);
    } catch (const std::exception& error) {
        if (stopRequested && stopRequested()) return std::nullopt;
        const std::string message = error.what();
        std::error_code sizeError;
        const std::uintmax_t size = std::filesystem::file_size(path, sizeError);
        if (!std::string_view(message).ends_with(kInvalidContainer) || sizeError || size > kLargestDescribed) {
            throw ToolError(path + ": " + message);
        }
        throw ToolError(describeUnreadable(path, read(path), message));
    }
    if (stopRequested && stopRequested()) return std::nullopt;
    return format;
}

VeltoTouch::ContainerStream::Format ToolFiles::streamRecording(const std::string& path,
                                                               const VeltoTouch::ContainerStream::FrameHandler& onFrame,
                                                               std::optional<std::uint32_t> hidDevice)
{
    const File file = openRecording(path);
    return *streamRecording(file.get(), path, onFrame, {}, hidDevice);
}

}  // namespace VeltoTool
