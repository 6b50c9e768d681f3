#include "pipeline/Util.h"

#include "pipeline/TimebaseOnce.h"
#include "platform/LogFormat.h"

#include <array>
#include <cassert>
#include <cstdint>
#include <sstream>
#include <stdexcept>

namespace VeltoTouch::Util {

namespace {

TimebaseOnce& processTimebase()
{
    static TimebaseOnce timebase(&VeltoHost::MonotonicClock::timebase);
    return timebase;
}

}  // namespace

bool stripDomainFromKey(std::string& key, std::string_view domain)
{
    if (key.size() <= domain.size() || key.compare(0, domain.size(), domain) != 0 || key[domain.size()] != '.') {
        return false;
    }
    key.erase(0, domain.size() + 1);
    return true;
}

std::uint64_t machTimeFromNanoseconds(std::uint64_t nanoseconds, VeltoHost::Timebase timebase) noexcept
{
    if (timebase.numer == 0) return 0;
    return nanoseconds * timebase.denom / timebase.numer;
}

std::uint64_t nanosecondsFromMachTime(std::uint64_t ticks, VeltoHost::Timebase timebase) noexcept
{
    if (timebase.denom == 0) return 0;
    return ticks * timebase.numer / timebase.denom;
}

std::uint64_t machTimeFromNanoseconds(std::uint64_t nanoseconds)
{
    return machTimeFromNanoseconds(nanoseconds, processTimebase().get());
}

std::uint64_t nanosecondsFromMachTime(std::uint64_t ticks)
{
    return nanosecondsFromMachTime(ticks, processTimebase().get());
}

std::string hexStringFromBytes(const std::uint8_t* bytes, std::size_t length)
{
    static const char kDigits[] = "0123456789abcdef";
    std::string text;
    text.reserve(length * 3);
    for (std::size_t i = 0; i < length; ++i) {
        text += kDigits[bytes[i] >> 4];
        text += kDigits[bytes[i] & 0xF];
        text += ' ';
    }
    return text;
}

std::string hexStringFromBytes(const std::vector<std::uint8_t>& bytes)
{
    return hexStringFromBytes(bytes.data(), bytes.size());
}

std::vector<std::uint8_t> bytesFromHexString(const std::string& text)
{
    std::istringstream stream(text);
    stream >> std::hex;
    std::vector<std::uint8_t> bytes;
    std::uint16_t value = 0;
    // The stream's own integer extraction decides what a number is: blanks
    // skipped, optional 0x, either case; the first thing that is not a number
    // ends the text quietly.
    while (stream >> value) {
        if (value >= 256) throw std::invalid_argument("invalid hex string");
        bytes.push_back(static_cast<std::uint8_t>(value));
    }
    return bytes;
}

}  // namespace VeltoTouch::Util

namespace VeltoTouch::Util {

namespace {

// The pads as they sit on the surface, one run of four letters per pad
// occurrence; the image drawing replaces each run with the pad's number.
constexpr std::array<std::string_view, 13> kSensorLayoutRows = {
    "           HHHH      GGGG           ",
    "                IIII                ",
    "     BBBB                  AAAA     ",
    "         JJJJ          JJJJ         ",
    "     FFFF                  EEEE     ",
    " AAAA                          BBBB ",
    "                KKKK                ",
    " DDDD                          CCCC ",
    "     EEEE                  FFFF     ",
    "         LLLL          LLLL         ",
    "     CCCC                  DDDD     ",
    "                MMMM                ",
    "           NNNN      OOOO           ",
};

// The run and the blank after it become the number padded to the run's
// length, so four-letter runs keep their columns for numbers of up to four
// characters and longer numbers push the rest of the row right.
void appendPadNumber(std::string& drawing, const InputReport::Image& image, bool useLevels, char c, int runLength)
{
    assert(c>='A' && c<='O');
    const auto pad = static_cast<std::size_t>(c - 'A');
    const std::intmax_t number = useLevels ? std::intmax_t{image.levels[pad]} : std::intmax_t{image.readings[pad]};
    const std::string text = VeltoHost::formatLog("%*jd", runLength / 2, number);
    drawing += VeltoHost::formatLog("%@%*s", text, runLength - static_cast<int>(text.size()), "");
}

}  // namespace

std::string stringFromImage(const InputReport::Image& image, bool useLevels)
{
    std::string drawing;
    for (std::string_view row : kSensorLayoutRows) {
        int runLength = 0;
        char runLetter = 0;
        for (char c : row) {
            if (c != ' ') {
                ++runLength;
                runLetter = c;
            } else if (runLength == 0) {
                drawing += ' ';
            } else {
                appendPadNumber(drawing, image, useLevels, runLetter, runLength);
                runLength = 0;
                runLetter = 0;
            }
        }
        drawing += '\n';
    }
    return VeltoHost::formatLog("# Image frame %@    time %@ ms\n\n%@", image.frameNumber, image.timeMs, drawing);
}

}  // namespace VeltoTouch::Util
