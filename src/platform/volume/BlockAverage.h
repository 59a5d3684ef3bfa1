#pragma once

#include "platform/base/TypedData2D.h"

namespace Kdd
{

/// How many pixels on each side one pixel may stand for so that the picture stays at or above `width` x `height`;
/// at least 1.
int reductionFactor(const TypedData2D& pixels, int width, int height);

/// What becomes of the means of whole numbers.
enum class Means { Rounded, Exact };

/// The means of blocks of `factor` x `factor` pixels; what is left over at the right and the bottom is dropped. Exact
/// means are Float32, and so are those of UInt32 and Float64. Blocks of nothing but infinite values and values that are
/// no numbers become `blank`, such values in other blocks do not count.
TypedData2D averageBlocks(const TypedData2D& pixels, int factor, double blank, Means means);

/// slope * value + intercept of each number, as Float32; the same pixels when that changes nothing.
TypedData2D scaleValues(const TypedData2D& pixels, double slope, double intercept);

}  // namespace Kdd
