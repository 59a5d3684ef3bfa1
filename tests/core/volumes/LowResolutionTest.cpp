#include "kddlib/volumes/LowResolution.h"

#include <gtest/gtest.h>

#include <array>

namespace Kdd
{
namespace
{

using Triple = std::array<int, 3>;

struct Reduction
{
    Triple dims;
    Triple lowRes;
    Triple factors;
};

const Reduction kReductions[] = {
    {{512, 512, 512}, {256, 256, 256}, {2, 2, 2}}, {{256, 200, 100}, {256, 200, 100}, {1, 1, 1}},
    {{300, 513, 513}, {150, 256, 256}, {2, 2, 2}}, {{514, 771, 2000}, {171, 192, 500}, {3, 4, 4}},
    {{0, -5, 1019}, {0, -5, 509}, {1, 1, 2}},      {{256, 257, 1020}, {256, 128, 340}, {1, 2, 3}},
};

TEST(LowResolution, DividesEachAxisByTheSmallestFactorThatFits)
{
    for (const Reduction& row : kReductions) {
        Triple lowRes{};
        Triple factors{};
        const bool isReduced = computeLowResSize(row.dims.data(), lowRes.data(), factors.data());
        EXPECT_EQ(lowRes, row.lowRes);
        EXPECT_EQ(factors, row.factors) << row.dims[0];
        EXPECT_EQ(isReduced, (factors != Triple{1, 1, 1})) << row.dims[0];
    }
}

TEST(LowResolutionBox, PutsEachVoxelIntoTheMiddleOfItsBlock)
{
    const Triple dims{5, 4, 1};
    const Triple lowRes{2, 4, 1};
    const Triple factors{2, 1, 3};
    Box3f box{0, 4, -3, 3, 7, 7};
    computeLowResBox(dims.data(), lowRes.data(), factors.data(), box, box);
    EXPECT_FLOAT_EQ(box.xmin, 0.5F);  // between the voxels at 0 and 1
    EXPECT_FLOAT_EQ(box.xmax, 2.5F);
    EXPECT_FLOAT_EQ(box.ymin, -3);
    EXPECT_FLOAT_EQ(box.ymax, 3);
    EXPECT_FLOAT_EQ(box.zmin, 7);  // one slice has no distance
    EXPECT_FLOAT_EQ(box.zmax, 7);
}

}  // namespace
}  // namespace Kdd
