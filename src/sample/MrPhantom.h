#pragma once

#include "sample/Picture.h"

namespace Kdd
{

enum class SamplePlane { Axial, Coronal, Sagittal };

/// A head cut through its middle.
SamplePicture headThrough(SamplePlane plane);

/// An axial cut `height` [mm] above the base of the head.
SamplePicture headSection(double height);

}  // namespace Kdd
