#include "kddlib/volumes/RescaleSlopeCalculator.h"

#include <gtest/gtest.h>

#include <limits>
#include <string>
#include <vector>

namespace
{

using Kdd::RescaleSlopeCalculator;

constexpr float kLargest = std::numeric_limits<float>::max();
constexpr float kInfinity = std::numeric_limits<float>::infinity();

struct Image
{
    float slope;
    float intercept;
    int bits;
    bool isSigned;
};

struct Stack
{
    const char* name;
    int mode;
    std::vector<Image> images;
    float slope;
    float intercept;
    float loss;
};

class RescaleOf : public testing::TestWithParam<Stack>
{
};

TEST_P(RescaleOf, MapsAllImagesOntoTheBuffer)
{
    RescaleSlopeCalculator calculator(GetParam().mode);
    for (const Image& image : GetParam().images)
        calculator.add(image.slope, image.intercept, image.bits, image.isSigned);
    EXPECT_FLOAT_EQ(calculator.rescaleSlope(), GetParam().slope);
    EXPECT_FLOAT_EQ(calculator.rescaleIntercept(), GetParam().intercept);
    EXPECT_FLOAT_EQ(calculator.precisionBitLoss(), GetParam().loss);
}

const Stack kStacks[] = {
    {"NoImage", 2, {}, 1, 0, 0},
    {"UnsignedIdentity", 2, {{1, 0, 12, false}, {1, 0, 8, false}}, 1, 0, 0},
    {"SignedIdentityIsMovedUp", 2, {{1, 0, 12, true}, {1, 0, 12, true}}, 1, -32768, 0},
    {"SignedInEightBits", 1, {{2, 10, 8, true}}, 2, 10 - 256, 0},
    {"EqualSlopesCostNothing", 2, {{0.5F, -7, 16, false}, {0.5F, -7, 12, false}}, 0.5F, -7, 0},
    {"FineEnough", 2, {{1, 0, 12, false}, {2, 0, 12, false}}, 8190.0F / 65535, 0, 0},
    {"OneBitLost", 2, {{1.5F, 2, 16, false}, {3, 2, 16, false}}, 3, 2, 1},
    {"IdentityDoesNotWidenTheRange", 2, {{0.5F, 0, 16, false}, {1, 0, 16, false}}, 0.5F, 0, 0},
    {"EightBitBuffer", 1, {{2, 0, 8, false}, {4, 0, 8, false}}, 4, 0, 1},
    {"ZeroSlopeIsNoStep", 2, {{2, 0, 16, false}, {0, 0, 16, false}, {4, 0, 16, false}}, 4, 0, 1},
    {"NoMoreBitsLostThanThereAre", 2, {{1e-6F, 0, 8, false}, {1000, 0, 10, false}}, 1023e3F / 65535, 0, 10},
    {"NegativeSlopesAreNotSwapped", 2, {{-1, 10, 4, false}, {2, 0, 4, false}}, 30.0F / 65535, 0, 0},
    {"SignedAndUnsignedIdentity", 2, {{1, 0, 12, false}, {1, 0, 12, true}}, -kInfinity, kLargest, 12},
    {"AllBitsWrapToNothing", 2, {{2, 1, 32, false}, {3, 1, 32, false}}, 0, 1, 0},
};
INSTANTIATE_TEST_SUITE_P(RescaleSlopeCalculator, RescaleOf, testing::ValuesIn(kStacks),
                         [](const auto& row) { return std::string(row.param.name); });

TEST(RescaleSlopeCalculator, SignedValuesLieInTheMiddleOfTheBuffer)
{
    RescaleSlopeCalculator calculator;
    calculator.add(2, 5, 12, true);
    EXPECT_EQ(calculator.physMin(), 30720 * 2.0F + 5 - 65536);
    EXPECT_EQ(calculator.physMax(), 34815 * 2.0F + 5 - 65536);
}

TEST(RescaleSlopeCalculator, ValuesOutsideThePhysicalRangeAreClampedAndCounted)
{
    RescaleSlopeCalculator calculator;
    calculator.setPhysRangeMin(-1024);
    calculator.add(1, 0, 16, true);  // slope 1 and intercept 0 reach no limit
    EXPECT_EQ(calculator.numRangeClamped(), 0);
    calculator.add(1, -1, 16, true);
    EXPECT_EQ(calculator.numRangeClamped(), 1);
    EXPECT_EQ(calculator.physMin(), -1024);
    EXPECT_EQ(calculator.physMax(), 32766);
    calculator.setPhysRangeMax(100);
    calculator.add(1, 1, 16, false);
    EXPECT_EQ(calculator.numRangeClamped(), 2);
}

}  // namespace
