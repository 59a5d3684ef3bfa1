#pragma once

#include "sample/Picture.h"

namespace Kdd
{

/// Swells from 0 to 1 and back while `position` goes from one whole number to the next.
double swell(double position);

/// A cross-section of a chest in Hounsfield units, `depth` [mm] below the first one.
SamplePicture chestSection(double depth);

/// The same chest seen from the front, as a scout.
SamplePicture chestScout();

}  // namespace Kdd
