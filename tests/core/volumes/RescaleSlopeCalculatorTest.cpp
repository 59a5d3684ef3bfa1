#include "kddlib/volumes/RescaleSlopeCalculator.h"

#include <gtest/gtest.h>

#include <tuple>
#include <vector>

namespace
{

struct Stack
{
    int mode;
    std::vector<std::tuple<float, float, int, bool>> images;  // slope, intercept, bits, signed
    float slope, intercept, loss;
};

const Stack kStacks[] = {
    {2, {}, 1, 0, 0},
    {2, {{1, 0, 12, true}, {1, 0, 12, true}}, 1, -32768, 0},
    {1, {{2, 10, 8, true}}, 2, 10 - 256, 0},
    {2, {{0.5F, -7, 16, false}, {0.5F, -7, 12, false}}, 0.5F, -7, 0},
    {2, {{1, 0, 12, false}, {2, 0, 12, false}}, 8190.0F / 65535, 0, 0},
    {2, {{1.5F, 2, 16, false}, {3, 2, 16, false}}, 3, 2, 1},
    {2, {{2, 0, 16, false}, {0, 0, 16, false}, {4, 0, 16, false}}, 4, 0, 1},
    {2, {{1e-6F, 0, 8, false}, {1000, 0, 10, false}}, 1023e3F / 65535, 0, 10},
};

TEST(RescaleSlopeCalculator, MapsAllImagesOntoTheBuffer)
{
    for (const Stack& stack : kStacks) {
        Kdd::RescaleSlopeCalculator calculator(stack.mode);
        for (const auto& [slope, intercept, bits, isSigned] : stack.images)
            calculator.add(slope, intercept, bits, isSigned);
        EXPECT_FLOAT_EQ(calculator.rescaleSlope(), stack.slope);
        EXPECT_FLOAT_EQ(calculator.rescaleIntercept(), stack.intercept) << stack.slope;
        EXPECT_FLOAT_EQ(calculator.precisionBitLoss(), stack.loss) << stack.slope;
    }
}

}  // namespace
