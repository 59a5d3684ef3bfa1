#include "sample/MrPhantom.h"

#include <cmath>

namespace Kdd
{

namespace
{

constexpr int kMatrix = 64;
constexpr double kHeadHeight = 170;  // [mm]

const SampleEllipse kAxial[] = {
    {0, 0, 0.72, 0.90, 640},        {0, 0, 0.68, 0.86, 90},         {0, 0, 0.64, 0.81, 430},
    {-0.27, 0.02, 0.25, 0.55, 540}, {0.27, 0.02, 0.25, 0.55, 540},  {-0.09, -0.16, 0.06, 0.20, 900},
    {0.09, -0.16, 0.06, 0.20, 900}, {-0.10, 0.22, 0.05, 0.14, 900}, {0.10, 0.22, 0.05, 0.14, 900},
    {0, 0, 0.015, 0.80, 780},
};

const SampleEllipse kCoronal[] = {
    {0, 0.85, 0.34, 0.50, 500},      {0, -0.10, 0.72, 0.80, 640},     {0, -0.10, 0.68, 0.76, 90},
    {0, -0.10, 0.64, 0.71, 430},     {-0.28, -0.15, 0.24, 0.45, 540}, {0.28, -0.15, 0.24, 0.45, 540},
    {-0.10, -0.18, 0.06, 0.16, 900}, {0.10, -0.18, 0.06, 0.16, 900},  {0, 0.42, 0.30, 0.17, 470},
    {0, 0.60, 0.10, 0.30, 520},
};

const SampleEllipse kSagittal[] = {
    {0.15, 0.80, 0.32, 0.50, 500}, {-0.62, 0.40, 0.28, 0.30, 480}, {-0.90, 0.22, 0.07, 0.10, 560},
    {0, -0.12, 0.86, 0.74, 640},   {0, -0.12, 0.82, 0.70, 90},     {0, -0.12, 0.77, 0.65, 430},
    {0, -0.20, 0.45, 0.26, 560},   {0.02, -0.12, 0.34, 0.09, 900}, {0.40, 0.36, 0.24, 0.18, 470},
    {0.16, 0.42, 0.08, 0.40, 530},
};

}  // namespace

SamplePicture headThrough(SamplePlane plane)
{
    SamplePicture picture(kMatrix, kMatrix, 15);
    switch (plane) {
    case SamplePlane::Axial:
        return picture.paintAll(kAxial);
    case SamplePlane::Coronal:
        return picture.paintAll(kCoronal);
    case SamplePlane::Sagittal:
        return picture.paintAll(kSagittal);
    }
    return picture;
}

SamplePicture headSection(double height)
{
    // Above the top the next head begins: the stack may be longer than a head.
    const double part = height / kHeadHeight - std::floor(height / kHeadHeight);
    const double fromMiddle = 2 * part - 1;
    // A little more than a ball has, so that the ends of the head still are a spot.
    const double scale = std::sqrt(1.05 - fromMiddle * fromMiddle);
    SamplePicture picture(kMatrix, kMatrix, 15);
    for (const SampleEllipse& whole : kAxial) {
        picture.paint(
            {whole.x * scale, whole.y * scale, whole.radiusX * scale, whole.radiusY * scale, whole.value});
    }
    return picture;
}

}  // namespace Kdd
