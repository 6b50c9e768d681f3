#include "ImageDrawing.h"

#include "platform/log/LogFormat.h"

#include <array>
#include <cassert>
#include <cstdint>
#include <string_view>

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
    assert(c >= 'A' && c <= 'O');
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
