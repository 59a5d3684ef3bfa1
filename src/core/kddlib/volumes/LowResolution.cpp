#include "kddlib/volumes/LowResolution.h"

#include <algorithm>

namespace Kdd
{

namespace
{

constexpr int kLimit = 256;

// Clients hold up to this many slices of long stacks, which is more than half of 512 on purpose.
constexpr int kLongStack = 512;
constexpr int kLongStackLimit = 509;

/// The smallest whole factor that brings the size to the limit; the quotient truncates, so this is a division too.
int factorFor(int size, int limit)
{
    return std::max(size, 0) / (limit + 1) + 1;
}

void reduceAxis(int dims, int lowResDims, int factor, float minimum, float maximum, float& lowMinimum,
                float& lowMaximum)
{
    const float voxel = dims >= 2 ? (maximum - minimum) / static_cast<float>(dims - 1) : 0;
    lowMinimum = minimum + static_cast<float>(factor - 1) * (voxel * 0.5F);
    lowMaximum = lowMinimum + static_cast<float>(lowResDims - 1) * voxel * static_cast<float>(factor);
}

}  // namespace

bool computeLowResSize(const int* dims, int* lowResDims, int* factors)
{
    const int limits[] = {kLimit, kLimit, dims[2] <= kLongStack ? kLimit : kLongStackLimit};
    for (int axis = 0; axis < 3; ++axis) {
        factors[axis] = factorFor(dims[axis], limits[axis]);
        lowResDims[axis] = dims[axis] / factors[axis];
    }
    return std::any_of(factors, factors + 3, [](int factor) { return factor >= 2; });
}

void computeLowResBox(const int* dims, const int* lowResDims, const int* factors, const Box3f& box,
                      Box3f& lowResBox)
{
    const Box3f from = box;  // the caller may reduce a box in place
    reduceAxis(dims[0], lowResDims[0], factors[0], from.xmin, from.xmax, lowResBox.xmin, lowResBox.xmax);
    reduceAxis(dims[1], lowResDims[1], factors[1], from.ymin, from.ymax, lowResBox.ymin, lowResBox.ymax);
    reduceAxis(dims[2], lowResDims[2], factors[2], from.zmin, from.zmax, lowResBox.zmin, lowResBox.zmax);
}

}  // namespace Kdd
