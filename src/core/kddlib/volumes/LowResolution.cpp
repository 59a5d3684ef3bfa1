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

struct Limits
{
    float minimum;
    float maximum;
};

/// From centre to centre: the first reduced voxel has its centre in the middle of its block, which lies
/// (factor - 1) / 2 voxels behind the centre of the first one.
Limits reduced(int dims, int lowResDims, int factor, const Limits& limits)
{
    const float voxel = dims >= 2 ? (limits.maximum - limits.minimum) / static_cast<float>(dims - 1) : 0;
    const float minimum = limits.minimum + static_cast<float>(factor - 1) * (voxel * 0.5F);
    return {minimum, minimum + static_cast<float>(lowResDims - 1) * voxel * static_cast<float>(factor)};
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
    const Limits x = reduced(dims[0], lowResDims[0], factors[0], {box.xmin, box.xmax});
    const Limits y = reduced(dims[1], lowResDims[1], factors[1], {box.ymin, box.ymax});
    const Limits z = reduced(dims[2], lowResDims[2], factors[2], {box.zmin, box.zmax});
    lowResBox = {x.minimum, x.maximum, y.minimum, y.maximum, z.minimum, z.maximum};
}

}  // namespace Kdd
