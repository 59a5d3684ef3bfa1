#pragma once

#include "platform/base/Export.h"
#include "platform/base/Geometry.h"

namespace Kdd
{

/// Plans a copy of a volume at reduced resolution: on every axis a whole number of voxels becomes one, so that columns
/// and rows fit into 256 voxels and slices into 256, or 509 where there are more than 512. All arrays hold columns,
/// rows, slices. Whether any axis is reduced. Without voxels on an axis its factor is 1.
KDD_EXPORT bool computeLowResSize(const int* dims, int* lowResDims, int* factors);

/// The limits of the copy, both boxes from voxel centre to voxel centre [mm]: each of its voxels lies in the middle of
/// the block that it stands for.
KDD_EXPORT void computeLowResBox(const int* dims, const int* lowResDims, const int* factors, const Box3f& box,
                                 Box3f& lowResBox);

}  // namespace Kdd
