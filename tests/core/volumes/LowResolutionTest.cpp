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

class LowResolution : public testing::TestWithParam<Reduction>
{
};

TEST_P(LowResolution, DividesEachAxisByTheSmallestFactorThatFits)
{
    Triple lowRes{};
    Triple factors{};
    const bool isReduced = computeLowResSize(GetParam().dims.data(), lowRes.data(), factors.data());
    EXPECT_EQ(lowRes, GetParam().lowRes);
    EXPECT_EQ(factors, GetParam().factors);
    EXPECT_EQ(isReduced, (factors != Triple{1, 1, 1}));
}

INSTANTIATE_TEST_SUITE_P(Volumes, LowResolution,
                         testing::Values(Reduction{{512, 512, 512}, {256, 256, 256}, {2, 2, 2}},
                                         Reduction{{256, 200, 100}, {256, 200, 100}, {1, 1, 1}},
                                         Reduction{{300, 513, 513}, {150, 256, 256}, {2, 2, 2}},
                                         Reduction{{514, 771, 2000}, {171, 192, 500}, {3, 4, 4}},
                                         Reduction{{0, -5, 1019}, {0, -5, 509}, {1, 1, 2}},
                                         Reduction{{256, 257, 1020}, {256, 128, 340}, {1, 2, 3}}));

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
