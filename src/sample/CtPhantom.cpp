#include "sample/CtPhantom.h"

#include <cmath>

namespace Kdd
{

namespace
{

constexpr int kMatrix = 64;
constexpr int kScoutRows = 96;
constexpr double kAir = -1000;      // [HU]
constexpr double kLung = -860;      // [HU]
constexpr double kBreathing = 320;  // length of a chest [mm]; what is longer shows the next one

// Painted one on top of the other: the last one covers those before.
const SampleEllipse kTrunk[] = {
    {0, 0.86, 0.70, 0.05, -300},  // table top
    {0, 0, 0.90, 0.66, -95},      // fat
    {0, 0, 0.84, 0.59, 45},       // muscle
};

const SampleEllipse kBones[] = {
    {0, 0.38, 0.12, 0.11, 420},      {0, 0.50, 0.04, 0.06, 560},      {0, 0.42, 0.05, 0.045, 25},
    {0, -0.54, 0.12, 0.035, 330},    {-0.56, -0.39, 0.09, 0.03, 380}, {0.56, -0.39, 0.09, 0.03, 380},
    {-0.75, -0.05, 0.03, 0.12, 400}, {0.75, -0.05, 0.03, 0.12, 400},  {-0.52, 0.45, 0.11, 0.03, 390},
    {0.52, 0.45, 0.11, 0.03, 390},   {0.10, 0.24, 0.06, 0.06, 190},
};

const SampleEllipse kFront[] = {
    {0, 0.1, 0.82, 1.65, 20},        {0, -1.25, 0.26, 0.35, 20},   {-0.36, -0.25, 0.27, 0.62, -420},
    {0.36, -0.25, 0.27, 0.62, -420}, {0.14, 0.0, 0.27, 0.28, 130}, {0, 0, 0.09, 1.40, 260},
    {0, 0.95, 0.60, 0.32, 90},
};

}  // namespace

double swell(double position)
{
    const double part = position - std::floor(position);
    return 4 * part * (1 - part);
}

SamplePicture chestSection(double depth)
{
    const double breadth = swell(depth / kBreathing + 0.12);
    const double lungX = 0.12 + 0.17 * breadth;
    const double lungY = 0.14 + 0.30 * breadth;
    const double heart = swell(depth / kBreathing - 0.08);

    SamplePicture picture(kMatrix, kMatrix, kAir);
    picture.paintAll(kTrunk)
        .paint({-0.39, -0.02, lungX, lungY, kLung})
        .paint({0.39, -0.02, lungX, lungY, kLung})
        .paint({0.12, -0.14, 0.10 + 0.16 * heart, 0.08 + 0.16 * heart, 65})
        .paintAll(kBones);
    return picture;
}

SamplePicture chestScout()
{
    SamplePicture picture(kMatrix, kScoutRows, kAir);
    picture.paintAll(kFront);
    // Ribs over the lungs, which would be plain dark spots without them.
    for (int rib = 0; rib < 7; ++rib) {
        const double y = -0.75 + 0.16 * rib;
        picture.paint({-0.36, y, 0.26, 0.025, -120}).paint({0.36, y, 0.26, 0.025, -120});
    }
    return picture;
}

}  // namespace Kdd
