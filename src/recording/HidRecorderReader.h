#pragma once

#include "recording/PipelineRecording.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

namespace VeltoTouch {

// Reads the text that hid-recorder writes, the capture kernel and input-stack
// maintainers ask for in bug reports, into input report frames. One line
// each: `D: N` starts the part of device N (a file without it holds device
// 0 alone), `R: LENGTH BYTES` is its report descriptor, `N: NAME` its name,
// `P: PHYS` its physical path, `I: BUS VENDOR PRODUCT` its ids (hex), and
// `E: SECONDS.MICROSECONDS LENGTH BYTES` one input report of it, timed from
// the start of the capture; bytes are two hex digits each. Lines starting
// with '#' and blank lines are skipped.
//
// Of a file holding several devices one is read: the one named, or else the
// first, in file order, of those whose report descriptor came before the
// first event that declares the surface's input reports at the lengths the
// plug-in parses (ReportDescriptor::declaresSurfaceReports). Only its events
// become frames, each stamped with its time in nanoseconds (the time line of
// container frames, counted from the capture's start); the others' events
// are checked and passed over.
//
// The text comes in pieces of any size, split anywhere, so that a file of any
// length is read in the memory of one line.
class HidRecorderReader {
public:
    using FrameHandler = std::function<void(PipelineRecording::Frame&& frame)>;

    // What is wrong with the text: a std::invalid_argument, as the faults in
    // a container's frames are. line() is the line it was found on, 0 when
    // it concerns the file as a whole (the device asked for is not in it).
    class Fault : public std::invalid_argument {
    public:
        Fault(std::size_t line, const std::string& reason);
        std::size_t line() const noexcept { return _line; }
        const std::string& reason() const noexcept { return _reason; }

    private:
        std::size_t _line;
        std::string _reason;
    };

    // No line of the format comes near this (a report descriptor holds at
    // most 4096 bytes); it bounds what one line may hold in memory.
    static constexpr std::size_t kLongestLine = 1 << 20;

    // Whether a recording whose first character, after a byte order mark and
    // blank space, is `first` is of this format rather than a container:
    // '#' or a letter that starts one of its lines, none of which can start
    // JSON text.
    static bool opensWith(char first) noexcept;
    // The same, looked up in a whole text.
    static bool opens(std::string_view text) noexcept;

    // `device`: the number of the device to read; empty: the surface's.
    explicit HidRecorderReader(FrameHandler onFrame, std::optional<std::uint32_t> device = std::nullopt);

    // The next piece of the text. Frames are handed over as their lines are
    // complete; a Fault is raised at the first wrong line, after the frames
    // before it.
    void feed(std::string_view piece);
    // The end of the text: reads a last line without a line break, and
    // raises a Fault when the device to read is not in the file.
    void finish();

    // A whole text.
    static void read(std::string_view text, const FrameHandler& onFrame,
                     std::optional<std::uint32_t> device = std::nullopt);

private:
    struct Device {
        std::uint32_t number = 0;
        std::string name;
        bool described = false;  // its report descriptor was read
        bool surface = false;
    };

    void readLine(std::string_view line);
    void readEvent(std::string_view fields);
    void readDescriptor(std::string_view fields);
    void readIds(std::string_view fields);
    // The device the lines now belong to (device 0 until a `D:` line).
    Device& current();
    Device* find(std::uint32_t number);
    void choose(bool atFirstEvent);
    std::string devicesListed() const;
    [[noreturn]] void fail(const std::string& reason) const;

    FrameHandler _onFrame;
    std::optional<std::uint32_t> _named;
    std::vector<Device> _devices;  // in file order
    std::uint32_t _current = 0;
    std::optional<std::uint32_t> _chosen;
    std::size_t _line = 0;
    std::string _partial;  // the start of a line whose end has not come
    std::vector<std::uint8_t> _scratch;  // the bytes of events passed over
};

}  // namespace VeltoTouch
