#pragma once

#include "algs/PixelRegion.h"

#include <array>
#include <cstdint>
#include <random>

namespace VeltoTool {

// What the 15 pads read for a contact on the surface. Pads sit where the
// layout drawing places them (pads drawn twice have two electrodes); positions
// are in pad pitches with the centre pad K at the origin and y growing
// downwards, from the top region to the bottom one.
class ContactModel {
public:
    using Readings = std::array<std::int16_t, 15>;

    struct Point {
        double x = 0;
        double y = 0;
    };

    struct Contact {
        Point centre;
        // Peak reading of a pad right under the contact.
        double strength = 0;
        // How far the contact reaches: a finger covers about one pad, a palm most of the surface.
        double radius = 0;
        // 0 for a finger's peaked profile; 1 for a palm's flat one.
        double flatness = 0;
    };

    explicit ContactModel(std::uint32_t seed) : _random(seed) {}

    static Point regionCentre(VeltoTouch::PixelRegion region);
    static Contact finger(Point centre, double pressure = 1.0);
    static Contact palm(double pressure = 1.0);

    // Readings for the contact (strength 0 for none) plus sensor noise with
    // the given standard deviation.
    Readings read(const Contact& contact, double noise);

private:
    std::mt19937 _random;
};

}  // namespace VeltoTool
