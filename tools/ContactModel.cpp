#include "ContactModel.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <string_view>
#include <vector>

namespace VeltoTool {

using VeltoTouch::PixelRegion;

namespace {

// The pad layout as the device's drawing shows it: each run of four letters
// is one electrode of that pad.
constexpr std::string_view kLayoutRows[] = {
    "           HHHH      GGGG           ", "                IIII                ",
    "     BBBB                  AAAA     ", "         JJJJ          JJJJ         ",
    "     FFFF                  EEEE     ", " AAAA                          BBBB ",
    "                KKKK                ", " DDDD                          CCCC ",
    "     EEEE                  FFFF     ", "         LLLL          LLLL         ",
    "     CCCC                  DDDD     ", "                MMMM                ",
    "           NNNN      OOOO           ",
};
// Columns per pad pitch horizontally, rows per pitch vertically.
constexpr double kColumnsPerPitch = 6.0;
constexpr double kRowsPerPitch = 2.0;
constexpr double kCentreColumn = 17.5;
constexpr double kCentreRow = 6.0;

struct Electrode {
    int pad;
    ContactModel::Point position;
};

std::vector<Electrode> electrodes()
{
    std::vector<Electrode> out;
    for (std::size_t row = 0; row < std::size(kLayoutRows); ++row) {
        const std::string_view text = kLayoutRows[row];
        for (std::size_t column = 0; column < text.size(); ++column) {
            if (text[column] == ' ' || (column > 0 && text[column - 1] == text[column])) continue;
            const double centreColumn = static_cast<double>(column) + 1.5;  // runs are four wide
            out.push_back({text[column] - 'A',
                           {(centreColumn - kCentreColumn) / kColumnsPerPitch,
                            (static_cast<double>(row) - kCentreRow) / kRowsPerPitch}});
        }
    }
    return out;
}

const std::vector<Electrode>& layout()
{
    static const std::vector<Electrode> kElectrodes = electrodes();
    return kElectrodes;
}

}  // namespace

ContactModel::Point ContactModel::regionCentre(PixelRegion region)
{
    switch (region) {
    case PixelRegion::Top: return {0.0, -2.6};     // on I, between H, G and J
    case PixelRegion::Bottom: return {0.0, 2.6};   // on M, between N, O and L
    case PixelRegion::Middle:
    case PixelRegion::None: break;
    }
    return {0.0, 0.0};  // on K
}

ContactModel::Contact ContactModel::finger(Point centre, double pressure)
{
    return Contact{centre, 420.0 * pressure, 1.2, 0.0};
}

ContactModel::Contact ContactModel::palm(double pressure)
{
    return Contact{{0.0, 0.0}, 260.0 * pressure, 4.0, 1.0};
}

ContactModel::Readings ContactModel::read(const Contact& contact, double noise)
{
    std::array<double, 15> signal{};
    if (contact.strength > 0) {
        for (const Electrode& electrode : layout()) {
            const double dx = electrode.position.x - contact.centre.x;
            const double dy = electrode.position.y - contact.centre.y;
            const double distance = std::sqrt(dx * dx + dy * dy) / contact.radius;
            // A finger's coupling falls off like a bell; a palm couples evenly
            // until its edge.
            const double peaked = std::exp(-distance * distance);
            const double flat = distance < 1.0 ? 1.0 : std::exp(-4.0 * (distance - 1.0));
            const double coupling = contact.flatness * flat + (1.0 - contact.flatness) * peaked;
            signal[electrode.pad] = std::max(signal[electrode.pad], contact.strength * coupling);
        }
    }
    std::normal_distribution<double> jitter(0.0, noise > 0 ? noise : 1e-9);
    Readings readings{};
    for (std::size_t pad = 0; pad < readings.size(); ++pad) {
        const double value = std::round(signal[pad] + (noise > 0 ? jitter(_random) : 0.0));
        readings[pad] = static_cast<std::int16_t>(std::clamp(value, -32768.0, 32767.0));
    }
    return readings;
}

}  // namespace VeltoTool
